#include "device/archiver/special_files.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstring>
#include <memory>
#include <utility>

#include "device/archiver/failure.h"
#include "device/base/for_each_part.h"
#include "device/base/open_below.h"
#include "device/base/work_folder.h"

namespace Archiver {

namespace {

constexpr char kCannotRead[] = "cannot read";
constexpr char kCannotCopy[] = "cannot copy";
constexpr int kOpenFolder = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;

struct stat Status(int folder, const char* path, int flags) {
  struct stat info {};
  if (fstatat(folder, path, &info, flags) != 0) {
    throw SystemFailure(kCannotRead, path, errno);
  }
  return info;
}

// Where a link leads that is open as a path.
std::string TextOfLink(const Device::FileDescriptor& link) {
  std::array<char, PATH_MAX> text{};
  const ssize_t length = readlinkat(link.Get(), "", text.data(), text.size());
  if (length < 0) {
    throw SystemFailure(kCannotRead, "link", errno);
  }
  return {text.data(), static_cast<size_t>(length)};
}

// A folder of the mirror, made if it is not there. Never behind a link: by what others exchange
// while it is listed, a folder can hold what was found as a link.
Device::FileDescriptor FolderIn(int parent, const std::string& name) {
  mkdirat(parent, name.c_str(), S_IRWXU);
  Device::FileDescriptor folder = Device::OpenBelow(parent, name, O_PATH | O_DIRECTORY);
  if (!folder) {
    throw SystemFailure(kCannotCopy, name, errno);
  }
  return folder;
}

class Scan {
 public:
  Scan(bool links_too, const std::vector<std::string>& excluded)
      : links_too_(links_too), excluded_(excluded) {}

  void Visit(const Device::FileDescriptor& source, const std::string& path) {
    const mode_t type = Status(source.Get(), "", AT_EMPTY_PATH).st_mode;
    if (S_ISDIR(type)) {
      VisitFolder(openat(source.Get(), ".", kOpenFolder), path);
    } else if (IsSpecial(type)) {
      found.push_back(path);
    }
  }

  std::vector<std::string> found;

 private:
  bool IsSpecial(mode_t type) const {
    return S_ISLNK(type) ? links_too_ : !S_ISREG(type) && !S_ISDIR(type);
  }

  bool IsLeftOut(const char* name) const {
    return std::strcmp(name, ".") == 0 || std::strcmp(name, "..") == 0 ||
           Device::IsWorkFolderName(name) ||
           std::find(excluded_.begin(), excluded_.end(), name) != excluded_.end();
  }

  void VisitFolder(int fd, const std::string& path) {
    const std::unique_ptr<DIR, int (*)(DIR*)> dir(fd < 0 ? nullptr : fdopendir(fd), closedir);
    if (!dir) {
      throw SystemFailure(kCannotRead, path, errno);
    }
    while (const dirent* entry = readdir(dir.get())) {
      const char* const child = entry->d_name;
      const mode_t type = entry->d_type == DT_UNKNOWN
                              ? Status(fd, child, AT_SYMLINK_NOFOLLOW).st_mode
                              : DTTOIF(entry->d_type);
      // Plain files, which are the most, take no more than that look.
      if (S_ISDIR(type) && !IsLeftOut(child)) {
        VisitFolder(openat(fd, child, kOpenFolder), std::string(path).append("/").append(child));
      } else if (IsSpecial(type) && !IsLeftOut(child)) {
        found.push_back(std::string(path).append("/").append(child));
      }
    }
  }

  bool links_too_;
  const std::vector<std::string>& excluded_;
};

}  // namespace

std::vector<std::string> FindSpecials(const WorkPlace& place,
                                      const std::vector<std::string>& sources,
                                      const std::vector<std::string>& excluded) {
  Scan scan(!place.shares.empty(), excluded);
  for (const std::string& source : sources) {
    scan.Visit(OpenSource(place, source), source);
  }
  return std::move(scan.found);
}

Device::FileDescriptor MirrorSpecials(const WorkPlace& place,
                                      const std::vector<std::string>& specials, int work_folder) {
  Device::FileDescriptor mirror = FolderIn(work_folder, Device::kWorkMirror);
  for (const std::string& special : specials) {
    const Device::FileDescriptor original = OpenSource(place, special);
    const struct stat info = Status(original.Get(), "", AT_EMPTY_PATH);
    Device::FileDescriptor folder = FolderIn(mirror.Get(), ".");
    const size_t slash = special.rfind('/');
    if (slash != std::string::npos) {
      Device::ForEachPart(special.substr(0, slash), "/", [&](std::string_view part) {
        folder = FolderIn(folder.Get(), std::string(part));
      });
    }
    const std::string name = special.substr(slash + 1);
    const bool is_copied =
        S_ISLNK(info.st_mode)
            ? symlinkat(TextOfLink(original).c_str(), folder.Get(), name.c_str()) == 0
            : mknodat(folder.Get(), name.c_str(), S_IFREG | (info.st_mode & ACCESSPERMS), 0) == 0;
    if (!is_copied) {
      throw SystemFailure(kCannotCopy, special, errno);
    }
    const timespec times[] = {info.st_atim, info.st_mtim};
    utimensat(folder.Get(), name.c_str(), times, AT_SYMLINK_NOFOLLOW);
  }
  return mirror;
}

}  // namespace Archiver
