#include "device/archiver/links.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <memory>

#include "device/archiver/failure.h"
#include "device/archiver/unique_fd.h"

namespace Archiver {
namespace {

constexpr char kCannotRead[] = "cannot read";

struct CloseDir {
  void operator()(DIR* dir) const { closedir(dir); }
};

struct stat Status(const std::string& path, int flags) {
  struct stat info {};
  if (fstatat(AT_FDCWD, path.c_str(), &info, flags) != 0) {
    throw SystemFailure(kCannotRead, path, errno);
  }
  return info;
}

void CollectLinks(int parent, const char* name, const std::string& path,
                  std::vector<std::string>* links) {
  const int fd = openat(parent, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  const std::unique_ptr<DIR, CloseDir> dir(fd < 0 ? nullptr : fdopendir(fd));
  if (!dir) {
    throw SystemFailure(kCannotRead, path, errno);
  }
  while (const dirent* entry = readdir(dir.get())) {
    const std::string child = entry->d_name;
    if (child == "." || child == "..") {
      continue;
    }
    mode_t type = DTTOIF(entry->d_type);
    if (entry->d_type == DT_UNKNOWN) {
      struct stat info {};
      if (fstatat(fd, entry->d_name, &info, AT_SYMLINK_NOFOLLOW) != 0) {
        throw SystemFailure(kCannotRead, path + "/" + child, errno);
      }
      type = info.st_mode;
    }
    if (S_ISLNK(type)) {
      links->push_back(path + "/" + child);
    } else if (S_ISDIR(type)) {
      CollectLinks(fd, entry->d_name, path + "/" + child, links);
    }
  }
}

}  // namespace

std::vector<std::string> FindLinks(const std::vector<std::string>& sources) {
  std::vector<std::string> links;
  for (const std::string& source : sources) {
    const bool is_share = source.find('/') == std::string::npos;
    const mode_t type = Status(source, is_share ? 0 : AT_SYMLINK_NOFOLLOW).st_mode;
    if (S_ISLNK(type)) {
      links.push_back(source);
    } else if (S_ISDIR(type)) {
      CollectLinks(AT_FDCWD, source.c_str(), source, &links);
    }
  }
  return links;
}

LinkMirror::LinkMirror(const std::vector<std::string>& links)
    : path_(std::filesystem::temp_directory_path() / "kavo-7z-links-XXXXXX") {
  if (mkdtemp(path_.data()) == nullptr) {
    throw SystemFailure("cannot create folder", path_, errno);
  }
  try {
    for (const std::string& link : links) {
      const std::filesystem::path copy = std::filesystem::path(path_) / link;
      std::filesystem::create_directories(copy.parent_path());
      std::filesystem::create_symlink(std::filesystem::read_symlink(link), copy);
      const struct stat info = Status(link, AT_SYMLINK_NOFOLLOW);
      const timespec times[] = {info.st_atim, info.st_mtim};
      utimensat(AT_FDCWD, copy.c_str(), times, AT_SYMLINK_NOFOLLOW);
    }
  } catch (...) {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
    throw;
  }
}

LinkMirror::~LinkMirror() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

}  // namespace Archiver
