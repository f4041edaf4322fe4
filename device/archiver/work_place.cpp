#include "device/archiver/work_place.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <set>
#include <string_view>

#include "device/archiver/failure.h"
#include "device/base/file_descriptor.h"

namespace Archiver {
namespace {

constexpr char kCannotPack[] = "cannot pack";

namespace fs = std::filesystem;

std::string RealPath(const std::string& path) {
  std::error_code error;
  const std::string resolved = fs::canonical(path, error);
  if (error) {
    throw SystemFailure("cannot resolve", path, error.value());
  }
  return resolved;
}

std::string Parent(const std::string& path) {
  const std::string parent = fs::path(path).parent_path();
  return parent.empty() ? "." : parent;
}

bool IsStagingFolder(const std::string& list_path) {
  struct stat here {};
  struct stat list_folder {};
  return stat(".", &here) == 0 && stat(Parent(list_path).c_str(), &list_folder) == 0 &&
         here.st_dev == list_folder.st_dev && here.st_ino == list_folder.st_ino;
}

bool LeadsToFolder(const std::string& name) {
  struct stat info {};
  return lstat(name.c_str(), &info) == 0 && S_ISLNK(info.st_mode) &&
         stat(name.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

// What follows `folder` and a slash in `path`; empty when `path` lies elsewhere.
std::string Below(const std::string& folder, const std::string& path) {
  const std::string start = folder == "/" ? folder : folder + "/";
  return path.compare(0, start.size(), start) == 0 ? path.substr(start.size()) : std::string();
}

}  // namespace

WorkPlace FindWorkPlace(const std::vector<std::string>& sources, const std::string& list_path) {
  WorkPlace place{RealPath("."), {}};
  if (!IsStagingFolder(list_path)) {
    return place;
  }
  std::set<std::string> names;
  for (const std::string& source : sources) {
    names.insert(source.substr(0, source.find('/')));
  }
  std::set<std::string> folders;
  for (const std::string& name : names) {
    if (!LeadsToFolder(name)) {
      folders.insert(place.folder);
      continue;
    }
    const std::string share = RealPath(name);
    place.shares.emplace(name, share);
    const bool own_name = Below(Parent(share), share) == name;
    folders.insert(own_name ? Parent(share) : place.folder);
  }
  if (folders.size() == 1 && *folders.begin() != place.folder) {
    return {*folders.begin(), {}};
  }
  return place;
}

std::unordered_set<std::string> CheckSources(const WorkPlace& place,
                                             const std::vector<std::string>& sources) {
  std::unordered_set<std::string> no_files;
  const Device::FileDescriptor folder(open(place.folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  std::unordered_set<std::string_view> folders;
  struct stat info {};
  for (const std::string& source : sources) {
    for (size_t at = source.find('/'); at != std::string::npos; at = source.find('/', at + 1)) {
      if (!folders.insert(std::string_view(source).substr(0, at)).second) {
        continue;
      }
      const std::string parent = source.substr(0, at);
      if (place.shares.count(parent) == 0 &&
          fstatat(folder.Get(), parent.c_str(), &info, AT_SYMLINK_NOFOLLOW) == 0 &&
          S_ISLNK(info.st_mode)) {
        throw NamedFailure(kCannotPack, source, "it lies behind a symbolic link");
      }
    }
    if (fstatat(folder.Get(), source.c_str(), &info, AT_SYMLINK_NOFOLLOW) != 0) {
      throw SystemFailure(kCannotPack, source, errno);
    }
    if (!S_ISREG(info.st_mode)) {
      no_files.insert(source);
    }
  }
  return no_files;
}

std::vector<std::string> NamesWithin(const WorkPlace& place, const std::string& path) {
  const std::string real = RealPath(Parent(path)) + path.substr(path.rfind('/'));
  std::vector<std::string> names;
  if (std::string name = Below(place.folder, real); !name.empty()) {
    names.push_back(std::move(name));
  }
  for (const auto& [share, folder] : place.shares) {
    if (const std::string name = Below(folder, real); !name.empty()) {
      names.push_back(std::string(share).append("/").append(name));
    }
  }
  return names;
}

}  // namespace Archiver
