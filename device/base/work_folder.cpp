#include "device/base/work_folder.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "device/base/file_io.h"
#include "device/base/open_below.h"
#include "device/base/random_id.h"

namespace Device {

namespace {

namespace fs = std::filesystem;

constexpr int kIdWords = 4;
constexpr std::size_t kPrefixLength = sizeof ".kavo-7z-" - 1;
constexpr mode_t kFolderMode = 0700;
constexpr mode_t kMarkMode = 0600;
constexpr char kMark[] = "job";
constexpr char kMarkText[] = "kavo-7z work folder\n";
constexpr int kOpenFolder = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;

// Leaves alone what no job has put there; then the folder stays as well.
void Remove(const FileDescriptor& folder) {
  std::error_code ignored;
  for (fs::directory_iterator entry(PathOf(folder.Get()), ignored), end; entry != end;
       entry.increment(ignored)) {
    const std::string name = entry->path().filename();
    if (name.rfind(kWorkResult, 0) == 0) {
      unlinkat(folder.Get(), name.c_str(), 0);
    }
  }
  fs::remove_all(PathOf(folder.Get()) + "/" + kWorkMirror, ignored);
  unlinkat(folder.Get(), kMark, 0);
  // Where it lies by now: others can have renamed it, or what it lies in.
  const std::string name = fs::read_symlink(PathOf(folder.Get()), ignored).filename();
  const FileDescriptor parent(openat(folder.Get(), "..", O_PATH | O_DIRECTORY | O_CLOEXEC));
  const FileDescriptor found(openat(parent.Get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
  if (fs::equivalent(PathOf(found.Get()), PathOf(folder.Get()), ignored)) {
    unlinkat(parent.Get(), name.c_str(), AT_REMOVEDIR);
  }
}

bool IsOwn(const FileDescriptor& folder) {
  struct stat status {};
  return fstat(folder.Get(), &status) == 0 && status.st_uid == geteuid() &&
         (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

bool Lock(const FileDescriptor& mark) {
  // A file system without locks costs the cleaning up, not the archive.
  return flock(mark.Get(), LOCK_EX | LOCK_NB) == 0 || errno != EWOULDBLOCK;
}

}  // namespace

std::string NewWorkFolderName() {
  return std::string(kWorkFolderPattern, kPrefixLength) + RandomId(kIdWords);
}

bool IsWorkFolderName(const std::string& name) {
  return name.size() == sizeof kWorkFolderPattern - 1 &&
         name.compare(0, kPrefixLength, kWorkFolderPattern, kPrefixLength) == 0;
}

WorkFolder::WorkFolder(const FileDescriptor& parent, const std::string& name) {
  if (mkdirat(parent.Get(), name.c_str(), kFolderMode) != 0) {
    ThrowErrno("cannot create a temporary folder");
  }
  folder_ = FileDescriptor(openat(parent.Get(), name.c_str(), kOpenFolder));
  // Who can rename it may have put another in its place already.
  if (!folder_ || !IsOwn(folder_) || !fs::is_empty(PathOf(folder_.Get()))) {
    const int error = folder_ ? EPERM : errno;
    unlinkat(parent.Get(), name.c_str(), AT_REMOVEDIR);  // if it is empty
    errno = error;
    ThrowErrno("cannot open the temporary folder");
  }
  mark_ = FileDescriptor(
      openat(folder_.Get(), kMark, O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, kMarkMode));
  if (!mark_ || !Lock(mark_) || !WriteAll(mark_.Get(), kMarkText)) {
    const int error = errno;
    Remove(folder_);
    errno = error;
    ThrowErrno("cannot mark the temporary folder");
  }
}

WorkFolder::~WorkFolder() { Remove(folder_); }

bool RemoveStaleWorkFolder(const FileDescriptor& parent, const std::string& name) {
  const FileDescriptor folder(openat(parent.Get(), name.c_str(), kOpenFolder));
  if (!folder || !IsOwn(folder)) {
    return true;
  }
  const FileDescriptor mark(openat(folder.Get(), kMark, O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
  if (mark && !Lock(mark)) {
    return false;
  }
  std::string text(sizeof kMarkText - 1, '\0');
  if (mark && ReadAll(mark.Get(), text.data(), text.size()) && text == kMarkText) {
    Remove(folder);
  } else {
    unlinkat(parent.Get(), name.c_str(), AT_REMOVEDIR);  // killed before it marked it
  }
  return faccessat(parent.Get(), name.c_str(), F_OK, AT_SYMLINK_NOFOLLOW) != 0;
}

}  // namespace Device
