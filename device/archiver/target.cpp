#include "device/archiver/output_file.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "device/archiver/failure.h"

namespace Archiver {
namespace {

constexpr char kPrefix[] = ".kavo-7z-";
constexpr char kRandom[] = "XXXXXX";
constexpr char kResult[] = "new";
constexpr char kCannotName[] = "cannot name the finished archive";
constexpr int kOpenFolder = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;

struct CloseDir {
  void operator()(DIR* dir) const { closedir(dir); }
};
using UniqueDir = std::unique_ptr<DIR, CloseDir>;

bool StartsWith(const char* text, const char* prefix) {
  return std::strncmp(text, prefix, std::strlen(prefix)) == 0;
}

// Leaves alone what this program does not write; then the folder stays as well.
void RemoveResults(int folder) {
  const int copy = openat(folder, ".", kOpenFolder);
  const UniqueDir dir(copy < 0 ? nullptr : fdopendir(copy));
  while (const dirent* entry = dir ? readdir(dir.get()) : nullptr) {
    if (StartsWith(entry->d_name, kResult)) {
      unlinkat(folder, entry->d_name, 0);
    }
  }
}

}  // namespace

bool ArchiveState::operator==(const ArchiveState& other) const {
  return exists == other.exists && device == other.device && inode == other.inode &&
         size == other.size && changed.tv_sec == other.changed.tv_sec &&
         changed.tv_nsec == other.changed.tv_nsec;
}

ArchiveState LookAtArchive(const std::string& path) {
  struct stat info {};
  if (lstat(path.c_str(), &info) != 0) {
    if (errno == ENOENT) {
      return {};
    }
    throw SystemFailure("cannot write archive", path, errno);
  }
  if (!S_ISREG(info.st_mode)) {
    throw NamedFailure("cannot write archive", path, "something else than a file has the name");
  }
  return {true, info.st_dev, info.st_ino, info.st_size, info.st_mtim};
}

WorkFolder::WorkFolder(std::string archive)
    : archive_(std::move(archive)), parent_(archive_.substr(0, archive_.rfind('/') + 1)) {
  Sweep();
  while (!CreateLocked()) {
  }
}

// False when another run has swept the folder away between its creation and the lock.
bool WorkFolder::CreateLocked() {
  path_ = parent_ + kPrefix + kRandom;
  if (mkdtemp(path_.data()) == nullptr) {
    throw SystemFailure("cannot create a temporary folder in", parent_, errno);
  }
  lock_ = Device::FileDescriptor(open(path_.c_str(), kOpenFolder));
  if (!lock_ && errno != ENOENT) {
    const int error = errno;
    rmdir(path_.c_str());
    throw SystemFailure("cannot open temporary folder", path_, error);
  }
  // A file system without locks costs the sweep, not the archive.
  struct stat info {};
  return lock_ && (flock(lock_.Get(), LOCK_EX | LOCK_NB) == 0 || errno != EWOULDBLOCK) &&
         fstat(lock_.Get(), &info) == 0 && info.st_nlink > 0;
}

WorkFolder::~WorkFolder() {
  RemoveResults(lock_.Get());
  rmdir(path_.c_str());
}

std::string WorkFolder::Result() const { return path_ + '/' + kResult; }

void WorkFolder::Publish(const ArchiveState& seen) const {
  const std::string result = Result();
  const auto rename_as = [&](unsigned int flags) {
    return renameat2(AT_FDCWD, result.c_str(), AT_FDCWD, archive_.c_str(), flags) == 0;
  };
  // Exchanged, the old archive can be looked at before it goes; it goes with this folder.
  bool is_named = rename_as(seen.exists ? RENAME_EXCHANGE : RENAME_NOREPLACE);
  bool is_as_seen = is_named || (errno != EEXIST && errno != ENOENT);
  if (is_named && seen.exists && !(LookAtArchive(result) == seen)) {
    rename_as(RENAME_EXCHANGE);
    is_as_seen = false;
  } else if (!is_named && (errno == EINVAL || errno == ENOSYS)) {
    // A file system that knows neither kind of rename.
    is_as_seen = LookAtArchive(archive_) == seen;
    is_named = is_as_seen && rename_as(0);
  }
  if (!is_as_seen) {
    throw NamedFailure(kCannotName, archive_, "it has changed meanwhile");
  }
  if (!is_named) {
    throw SystemFailure(kCannotName, archive_, errno);
  }
}

void WorkFolder::Sweep() const {
  const UniqueDir dir(opendir(parent_.c_str()));
  while (const dirent* entry = dir ? readdir(dir.get()) : nullptr) {
    if (!StartsWith(entry->d_name, kPrefix) ||
        std::strlen(entry->d_name) != std::strlen(kPrefix) + std::strlen(kRandom)) {
      continue;
    }
    const Device::FileDescriptor stale(openat(dirfd(dir.get()), entry->d_name, kOpenFolder));
    struct stat info {};
    if (stale && fstat(stale.Get(), &info) == 0 && info.st_uid == geteuid() &&
        flock(stale.Get(), LOCK_EX | LOCK_NB) == 0) {
      RemoveResults(stale.Get());
      unlinkat(dirfd(dir.get()), entry->d_name, AT_REMOVEDIR);
    }
  }
}

}  // namespace Archiver
