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

bool ArchiveExists(const std::string& path) {
  struct stat info {};
  if (lstat(path.c_str(), &info) != 0) {
    if (errno == ENOENT) {
      return false;
    }
    throw SystemFailure("cannot write archive", path, errno);
  }
  if (!S_ISREG(info.st_mode)) {
    throw NamedFailure("cannot write archive", path, "something else than a file has the name");
  }
  return true;
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
  lock_ = UniqueFd(open(path_.c_str(), kOpenFolder));
  if (!lock_.Valid() && errno != ENOENT) {
    const int error = errno;
    rmdir(path_.c_str());
    throw SystemFailure("cannot open temporary folder", path_, error);
  }
  // A file system without locks costs the sweep, not the archive.
  struct stat info {};
  return lock_.Valid() && (flock(lock_.Get(), LOCK_EX | LOCK_NB) == 0 || errno != EWOULDBLOCK) &&
         fstat(lock_.Get(), &info) == 0 && info.st_nlink > 0;
}

WorkFolder::~WorkFolder() {
  RemoveResults(lock_.Get());
  rmdir(path_.c_str());
}

std::string WorkFolder::Result() const { return path_ + '/' + kResult; }

void WorkFolder::Publish() const {
  if (rename(Result().c_str(), archive_.c_str()) != 0) {
    throw SystemFailure("cannot name the finished archive", archive_, errno);
  }
}

void WorkFolder::Sweep() const {
  const UniqueDir dir(opendir(parent_.c_str()));
  while (const dirent* entry = dir ? readdir(dir.get()) : nullptr) {
    if (!StartsWith(entry->d_name, kPrefix) ||
        std::strlen(entry->d_name) != std::strlen(kPrefix) + std::strlen(kRandom)) {
      continue;
    }
    const UniqueFd stale(openat(dirfd(dir.get()), entry->d_name, kOpenFolder));
    struct stat info {};
    if (stale.Valid() && fstat(stale.Get(), &info) == 0 && info.st_uid == geteuid() &&
        flock(stale.Get(), LOCK_EX | LOCK_NB) == 0) {
      RemoveResults(stale.Get());
      unlinkat(dirfd(dir.get()), entry->d_name, AT_REMOVEDIR);
    }
  }
}

}  // namespace Archiver
