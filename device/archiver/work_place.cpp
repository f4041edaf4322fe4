#include "device/archiver/work_place.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <set>
#include <utility>

#include "device/archiver/failure.h"
#include "device/base/open_below.h"

namespace Archiver {
namespace {

constexpr char kCannotPack[] = "cannot pack";
constexpr char kWildcards[] = "*?";  // 7z looks for such a name among all, though it is no pattern

namespace fs = std::filesystem;

Device::FileDescriptor OpenFolder(const std::string& path) {
  Device::FileDescriptor folder(open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!folder) {
    throw SystemFailure("cannot open", path, errno);
  }
  return folder;
}

std::string RealPath(const Device::FileDescriptor& folder) {
  return fs::read_symlink(Device::PathOf(folder.Get()));
}

std::string Parent(const std::string& path) {
  const std::string parent = fs::path(path).parent_path();
  return parent.empty() ? "." : parent;
}

bool IsStagingFolder(const std::string& list_path) {
  std::error_code ignored;
  return fs::equivalent(".", Parent(list_path), ignored);
}

bool LeadsToFolder(const std::string& name) {
  std::error_code ignored;
  return fs::is_symlink(name, ignored) && fs::is_directory(name, ignored);
}

struct stat StatusOf(const Device::FileDescriptor& opened, const std::string& source) {
  struct stat info {};
  if (fstat(opened.Get(), &info) != 0) {
    throw SystemFailure(kCannotPack, source, errno);
  }
  return info;
}

// What follows `folder` and a slash in `path`; empty when `path` lies elsewhere.
std::string Below(const std::string& folder, const std::string& path) {
  const std::string start = folder == "/" ? folder : folder + "/";
  return path.compare(0, start.size(), start) == 0 ? path.substr(start.size()) : std::string();
}

}  // namespace

WorkPlace FindWorkPlace(const std::vector<std::string>& sources, const std::string& list_path) {
  WorkPlace place{OpenFolder("."), {}};
  if (!IsStagingFolder(list_path)) {
    return place;
  }
  std::set<std::string> names;
  for (const std::string& source : sources) {
    names.insert(source.substr(0, source.find('/')));
  }
  const std::string here = RealPath(place.folder);
  std::set<std::string> folders;
  for (const std::string& name : names) {
    if (!LeadsToFolder(name)) {
      folders.insert(here);
      continue;
    }
    Device::FileDescriptor share = OpenFolder(name);
    const std::string path = RealPath(share);
    place.shares.emplace(name, std::move(share));
    folders.insert(Below(Parent(path), path) == name ? Parent(path) : here);
  }
  if (folders.size() == 1 && *folders.begin() != here) {
    return {OpenFolder(*folders.begin()), {}};
  }
  return place;
}

Device::FileDescriptor OpenSource(const WorkPlace& place, const std::string& source) {
  const size_t slash = source.find('/');
  const auto share = place.shares.find(source.substr(0, slash));
  Device::FileDescriptor opened =
      share == place.shares.end() ? Device::OpenBelow(place.folder.Get(), source, O_PATH)
      : slash == std::string::npos
          ? Device::OpenBelow(share->second.Get(), ".", O_PATH)
          : Device::OpenBelow(share->second.Get(), source.substr(slash + 1), O_PATH);
  if (!opened && errno == ELOOP) {
    throw NamedFailure(kCannotPack, source, "it lies behind a symbolic link");
  }
  if (!opened) {
    throw SystemFailure(kCannotPack, source, errno);
  }
  return opened;
}

Identities AllowSources(const WorkPlace& place, const std::vector<std::string>& sources,
                        Device::Fence& fence) {
  Identities no_files;
  bool is_listed = false;
  for (const std::string& source : sources) {
    is_listed = is_listed || source.find_first_of(kWildcards) != std::string::npos;
    const Device::FileDescriptor opened = OpenSource(place, source);
    const struct stat info = StatusOf(opened, source);
    if (S_ISREG(info.st_mode) || S_ISDIR(info.st_mode)) {
      fence.AllowReading(opened.Get());
    }
    if (!S_ISREG(info.st_mode)) {
      no_files.emplace(source, std::pair(info.st_dev, info.st_ino));
    }
  }
  if (is_listed) {
    fence.AllowListing(place.folder.Get());
    for (const auto& [name, share] : place.shares) {
      fence.AllowListing(share.Get());
    }
  }
  return no_files;
}

void CheckIdentities(const WorkPlace& place, const Identities& sources) {
  for (const auto& [source, identity] : sources) {
    const struct stat info = StatusOf(OpenSource(place, source), source);
    if (identity != std::pair(info.st_dev, info.st_ino)) {
      throw NamedFailure(kCannotPack, source, "it was exchanged meanwhile");
    }
  }
}

std::vector<std::string> NamesOf(const WorkPlace& place, const Target& target) {
  const std::string path = fs::path(RealPath(target.Folder())) / target.Name();
  std::vector<std::string> names;
  if (std::string below = Below(RealPath(place.folder), path); !below.empty()) {
    names.push_back(std::move(below));
  }
  for (const auto& [share, root] : place.shares) {
    if (const std::string below = Below(RealPath(root), path); !below.empty()) {
      names.push_back(std::string(share).append("/").append(below));
    }
  }
  return names;
}

}  // namespace Archiver
