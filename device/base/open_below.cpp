#include "device/base/open_below.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

namespace Device {

namespace {

FileDescriptor OpenEntry(int folder, const std::string& name, int flags) {
  FileDescriptor opened(openat(folder, name.c_str(), flags | O_NOFOLLOW | O_CLOEXEC));
  struct stat status {};
  if (!opened && errno == ENOTDIR) {
    const bool is_link =
        fstatat(folder, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISLNK(status.st_mode);
    errno = is_link ? ELOOP : ENOTDIR;
  }
  return opened;
}

}  // namespace

FileDescriptor OpenBelow(int folder, const std::string& path, int flags) {
  FileDescriptor parent;
  std::size_t begin = 0;
  for (std::size_t end = path.find('/'); end != std::string::npos; end = path.find('/', begin)) {
    FileDescriptor next = OpenEntry(parent ? parent.Get() : folder, path.substr(begin, end - begin),
                                    O_PATH | O_DIRECTORY);
    if (!next) {
      return next;
    }
    parent = std::move(next);
    begin = end + 1;
  }
  return OpenEntry(parent ? parent.Get() : folder, path.substr(begin), flags);
}

FileDescriptor OpenUserPath(const std::vector<std::string>& fixed, const std::string& path,
                            int flags) {
  // The top folder's entries are the system's own.
  std::string root = path.empty() ? "/" : path.substr(0, path.find('/', 1));
  for (const std::string& folder : fixed) {
    if (folder.size() >= root.size() && IsWithin(path, folder)) {
      root = folder;
    }
  }
  const FileDescriptor folder(open(root.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  const std::string rest = path.substr(std::min(path.size(), root.size()));
  const std::size_t begin = rest.find_first_not_of('/');
  return OpenBelow(folder.Get(), begin == std::string::npos ? "." : rest.substr(begin), flags);
}

bool IsWithin(const std::string& path, const std::string& folder) {
  return path.compare(0, folder.size(), folder) == 0 &&
         (path.size() == folder.size() || path[folder.size()] == '/');
}

}  // namespace Device
