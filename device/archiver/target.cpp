#include "device/archiver/target.h"

#include <fcntl.h>

#include <cerrno>
#include <cstdio>
#include <utility>

#include "device/archiver/failure.h"
#include "device/base/open_below.h"
#include "device/base/work_folder.h"

namespace Archiver {
namespace {

constexpr char kCannotWrite[] = "cannot write archive";
constexpr char kCannotName[] = "cannot name the finished archive";
constexpr char kChanged[] = "it has changed meanwhile";

bool IsSameFile(const struct stat& one, const struct stat& other) {
  return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

}  // namespace

Target::Target(std::string path, const std::vector<std::string>& fixed)
    : path_(std::move(path)),
      name_(path_.substr(path_.rfind('/') + 1)),
      fixed_(fixed),
      folder_(OpenFolder()),
      old_(Device::OpenBelow(folder_.Get(), name_, O_PATH)) {
  if (!old_ && errno != ENOENT) {
    throw SystemFailure(kCannotWrite, path_, errno);
  }
  if (old_ && (fstat(old_.Get(), &seen_) != 0 || !S_ISREG(seen_.st_mode))) {
    throw NamedFailure(kCannotWrite, path_, "something else than a file has the name");
  }
}

Device::FileDescriptor Target::OpenFolder() const {
  Device::FileDescriptor folder = Device::OpenUserPath(fixed_, path_.substr(0, path_.rfind('/')),
                                                       O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (!folder) {
    throw SystemFailure("cannot open the folder of archive", path_, errno);
  }
  return folder;
}

bool Target::IsAsSeen(int folder, const std::string& name) const {
  struct stat now {};
  if (fstatat(folder, name.c_str(), &now, AT_SYMLINK_NOFOLLOW) != 0) {
    return errno == ENOENT && !old_;
  }
  return old_ && IsSameFile(now, seen_) && now.st_size == seen_.st_size &&
         now.st_mtim.tv_sec == seen_.st_mtim.tv_sec && now.st_mtim.tv_nsec == seen_.st_mtim.tv_nsec;
}

Device::FileDescriptor Target::Publish(int work_folder) const {
  Device::FileDescriptor result = Device::OpenBelow(work_folder, Device::kWorkResult, O_PATH);
  struct stat here {};
  struct stat there {};
  if (!result || fstat(folder_.Get(), &here) != 0 || fstat(OpenFolder().Get(), &there) != 0) {
    throw SystemFailure(kCannotName, path_, errno);
  }
  if (!IsSameFile(here, there)) {
    throw NamedFailure(kCannotName, path_, "its folder has moved meanwhile");
  }
  const auto rename_as = [&](unsigned int flags) {
    return renameat2(work_folder, Device::kWorkResult, folder_.Get(), name_.c_str(), flags) == 0;
  };
  // Exchanged, the old archive can be looked at before it goes; it goes with the work folder.
  bool is_named = rename_as(old_ ? RENAME_EXCHANGE : RENAME_NOREPLACE);
  bool is_as_seen = is_named || (errno != EEXIST && errno != ENOENT);
  if (is_named && old_ && !IsAsSeen(work_folder, Device::kWorkResult)) {
    rename_as(RENAME_EXCHANGE);
    is_as_seen = false;
  } else if (!is_named && (errno == EINVAL || errno == ENOSYS)) {
    // A file system that knows neither kind of rename.
    is_as_seen = IsAsSeen(folder_.Get(), name_);
    is_named = is_as_seen && rename_as(0);
  }
  if (!is_as_seen) {
    throw NamedFailure(kCannotName, path_, kChanged);
  }
  if (!is_named) {
    throw SystemFailure(kCannotName, path_, errno);
  }
  return result;
}

}  // namespace Archiver
