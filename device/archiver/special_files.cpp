#include "device/archiver/special_files.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>
#include <utility>

#include "device/archiver/failure.h"
#include "device/base/file_descriptor.h"

namespace Archiver {

namespace fs = std::filesystem;

namespace {

constexpr char kCannotRead[] = "cannot read";
constexpr mode_t kPermissions = 0777;

struct CloseDir {
  void operator()(DIR* dir) const { closedir(dir); }
};

struct stat Status(int folder, const std::string& path, int flags) {
  struct stat info {};
  if (fstatat(folder, path.c_str(), &info, flags) != 0) {
    throw SystemFailure(kCannotRead, path, errno);
  }
  return info;
}

class Scan {
 public:
  Scan(bool links_too, const std::vector<std::string>& excluded)
      : links_too_(links_too), excluded_(excluded) {}

  void Visit(int parent, const char* name, mode_t type, const std::string& path) {
    if (S_ISDIR(type)) {
      VisitFolder(parent, name, path);
    } else if (IsSpecial(type)) {
      found.push_back(path);
    }
  }

  std::vector<std::string> found;

 private:
  bool IsSpecial(mode_t type) const { return S_ISLNK(type) ? links_too_ : !S_ISREG(type); }

  bool IsLeftOut(const char* name) const {
    return std::strcmp(name, ".") == 0 || std::strcmp(name, "..") == 0 ||
           std::find(excluded_.begin(), excluded_.end(), name) != excluded_.end();
  }

  void VisitFolder(int parent, const char* name, const std::string& path) {
    const int fd = openat(parent, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    const std::unique_ptr<DIR, CloseDir> dir(fd < 0 ? nullptr : fdopendir(fd));
    if (!dir) {
      throw SystemFailure(kCannotRead, path, errno);
    }
    while (const dirent* entry = readdir(dir.get())) {
      const char* const child = entry->d_name;
      const mode_t type = entry->d_type == DT_UNKNOWN
                              ? Status(fd, child, AT_SYMLINK_NOFOLLOW).st_mode
                              : DTTOIF(entry->d_type);
      // Plain files, which are the most, take no more than that look.
      if ((S_ISDIR(type) || IsSpecial(type)) && !IsLeftOut(child)) {
        Visit(fd, child, type, std::string(path).append("/").append(child));
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
  const Device::FileDescriptor folder(open(place.folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  Scan scan(!place.shares.empty(), excluded);
  for (const std::string& source : sources) {
    const int flags = place.shares.count(source) != 0 ? 0 : AT_SYMLINK_NOFOLLOW;
    scan.Visit(folder.Get(), source.c_str(), Status(folder.Get(), source, flags).st_mode, source);
  }
  return std::move(scan.found);
}

SpecialsMirror::SpecialsMirror(const WorkPlace& place, const std::vector<std::string>& specials)
    : path_(fs::temp_directory_path() / "kavo-7z-mirror-XXXXXX") {
  if (mkdtemp(path_.data()) == nullptr) {
    throw SystemFailure("cannot create folder", path_, errno);
  }
  try {
    for (const std::string& special : specials) {
      const fs::path original = fs::path(place.folder) / special;
      const fs::path copy = fs::path(path_) / special;
      const struct stat info = Status(AT_FDCWD, original, AT_SYMLINK_NOFOLLOW);
      fs::create_directories(copy.parent_path());
      if (S_ISLNK(info.st_mode)) {
        fs::create_symlink(fs::read_symlink(original), copy);
      } else if (mknod(copy.c_str(), S_IFREG | (info.st_mode & kPermissions), 0) != 0) {
        throw SystemFailure("cannot copy", special, errno);
      }
      const timespec times[] = {info.st_atim, info.st_mtim};
      utimensat(AT_FDCWD, copy.c_str(), times, AT_SYMLINK_NOFOLLOW);
    }
  } catch (...) {
    std::error_code ignored;
    fs::remove_all(path_, ignored);
    throw;
  }
}

SpecialsMirror::~SpecialsMirror() {
  std::error_code ignored;
  fs::remove_all(path_, ignored);
}

}  // namespace Archiver
