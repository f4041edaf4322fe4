// kavo-link-free.so, loaded into the stock 7z of a job. 7z knows what it packs by paths, on which
// others can put a link at any moment. Here the kernel resolves each relative path without a link
// on the way, and one at its end is looked at itself, so that 7z finds nothing but what bears the
// name. Absolute paths are the archiver's own, through /proc/self/fd, or the system's.
//
// In a staging folder (kStagedVariable is set) the first part of a path is one of the folder's own
// links.
#include "device/archiver/link_free.h"

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdarg>
#include <cstdlib>
#include <cstring>

namespace {

constexpr int kAsItself = O_PATH | O_NOFOLLOW | O_CLOEXEC;

void Close(int fd) {
  const int error = errno;
  close(fd);
  errno = error;
}

int OpenLinkFree(int folder, const char* path, int flags, mode_t mode) {
  open_how how = {};
  how.flags = static_cast<unsigned int>(flags | O_LARGEFILE);
  how.mode = (flags & (O_CREAT | __O_TMPFILE)) != 0 ? mode : 0;
  how.resolve = RESOLVE_NO_SYMLINKS;
  return static_cast<int>(syscall(SYS_openat2, folder, path, &how, sizeof how));
}

int OpenStaged(const char* path, int flags, mode_t mode) {
  // One path is mostly of the same share as the path before.
  static thread_local char first[NAME_MAX + 1];
  static thread_local int share = -1;
  const size_t length = strcspn(path, "/");
  if (length > NAME_MAX) {
    errno = ENAMETOOLONG;
    return -1;
  }
  if (share < 0 || strncmp(path, first, length) != 0 || first[length] != '\0') {
    Close(share);
    memcpy(first, path, length);
    first[length] = '\0';
    share = openat(AT_FDCWD, first, O_PATH | O_DIRECTORY | O_CLOEXEC);
  }
  const char* const rest = path + length + strspn(path + length, "/");
  return share < 0 ? -1 : OpenLinkFree(share, *rest == '\0' ? "." : rest, flags, mode);
}

int Open(int folder, const char* path, int flags, mode_t mode) {
  if (*path == '/') {
    return openat64(folder, path, flags, mode);
  }
  return folder == AT_FDCWD && getenv(Archiver::kStagedVariable) != nullptr
             ? OpenStaged(path, flags, mode)
             : OpenLinkFree(folder, path, flags, mode);
}

int Status(int folder, const char* path, struct stat64* status, int flags) {
  const bool is_followed = *path == '/' && (flags & AT_SYMLINK_NOFOLLOW) == 0;
  const int fd = Open(folder, path, is_followed ? O_PATH | O_CLOEXEC : kAsItself, 0);
  if (fd < 0) {
    return -1;
  }
  const int result = fstat64(fd, status);
  Close(fd);
  return result;
}

}  // namespace

extern "C" {

int open64(const char* path, int flags, ...) {
  va_list rest;
  va_start(rest, flags);
  const mode_t mode = (flags & (O_CREAT | __O_TMPFILE)) != 0 ? va_arg(rest, mode_t) : 0;
  va_end(rest);
  return Open(AT_FDCWD, path, flags, mode);
}

DIR* opendir(const char* path) {
  const int fd = Open(AT_FDCWD, path, O_RDONLY | O_DIRECTORY | O_NONBLOCK | O_CLOEXEC, 0);
  return fd < 0 ? nullptr : fdopendir(fd);
}

int lstat64(const char* path, struct stat64* status) noexcept {
  return Status(AT_FDCWD, path, status, AT_SYMLINK_NOFOLLOW);
}

int stat64(const char* path, struct stat64* status) noexcept {
  return Status(AT_FDCWD, path, status, 0);
}

int fstatat64(int folder, const char* path, struct stat64* status, int flags) noexcept {
  if (folder == AT_FDCWD || strchr(path, '/') != nullptr) {
    return Status(folder, path, status, flags);
  }
  using Function = int(int, const char*, struct stat64*, int);
  static auto* const real = reinterpret_cast<Function*>(dlsym(RTLD_NEXT, "fstatat64"));
  return real(folder, path, status, flags | AT_SYMLINK_NOFOLLOW);
}

ssize_t readlink(const char* path, char* text, size_t size) noexcept {
  const int fd = Open(AT_FDCWD, path, kAsItself, 0);
  if (fd < 0) {
    return -1;
  }
  const ssize_t length = readlinkat(fd, "", text, size);
  Close(fd);
  return length;
}

}  // extern "C"
