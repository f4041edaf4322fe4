#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <set>

#include "device/base/json_text.h"
#include "device/base/work_folder.h"
#include "device/host/user_files.h"
#include "device/model/device.h"

namespace Device {

namespace {

const char* KindOf(mode_t mode) {
  return S_ISDIR(mode) ? "folder" : S_ISREG(mode) ? "file" : S_ISLNK(mode) ? "link" : "other";
}

std::string Quoted(const std::string& name) {
  const bool is_plain = std::all_of(name.begin(), name.end(), [](char each) {
    return each >= ' ' && each <= '~' && each != '"' && each != '\\';
  });
  return is_plain ? '"' + name + '"' : ToUtf8Text(name);  // which takes its time
}

std::string Body(const std::string& path, bool is_writable, const std::string& entries) {
  return "{\"entries\":[" + entries + "],\"path\":" + ToUtf8Text(path) +
         ",\"writable\":" + ToText(is_writable) + "}";
}

// What the user has no access to at all is not shown.
std::string ListShares(const std::string& user) {
  std::string entries;
  std::set<std::string> names = {kHomeShare};
  for (const Share& share : TheDevice().config.shares) {
    names.insert(share.name);
  }
  for (const std::string& name : names) {
    const ResolvedPath share = Resolve(user, "/" + name);
    struct stat status {};
    if (share.error == 0 && AccessOf(share, user) != Access::kNone &&
        stat(share.real_path.c_str(), &status) == 0) {
      AddEntry(entries, name, status);
    }
  }
  return Body("/", false, entries);
}

bool IsWritable(const ResolvedPath& folder, int fd) {
  return (folder.share == nullptr || !folder.share->read_only) &&
         faccessat(fd, ".", W_OK | X_OK, AT_EACCESS) == 0;
}

}  // namespace

// Text by text: values of all entries would take too much memory, and ten times as long.
void AddEntry(std::string& entries, const std::string& name, const struct stat& status) {
  const off_t size = S_ISDIR(status.st_mode) ? 0 : status.st_size;
  entries.append(entries.empty() ? "" : ",").append("{\"kind\":\"").append(KindOf(status.st_mode));
  entries.append("\",\"modified\":").append(std::to_string(status.st_mtime));
  entries.append(",\"name\":").append(Quoted(name));
  entries.append(",\"size\":").append(std::to_string(size)).append("}");
}

std::string ListFolder(const std::string& user, const std::string& path) {
  if (path.find_first_not_of('/') == std::string::npos && !path.empty()) {
    return ListShares(user);
  }
  const ResolvedPath folder = ResolveForUser(user, path);
  const int fd = OpenForUser(user, folder, O_RDONLY | O_DIRECTORY).Release();
  const std::unique_ptr<DIR, int (*)(DIR*)> directory(fdopendir(fd), closedir);
  std::vector<std::string> names;
  while (const dirent* const found = readdir(directory.get())) {
    const std::string name = found->d_name;
    if (name != "." && name != ".." && !IsWorkFolderName(name)) {
      names.push_back(name);
    }
  }
  std::sort(names.begin(), names.end());
  std::string entries;
  for (const std::string& name : names) {
    struct stat status {};
    // One that has gone meanwhile is not there.
    if (fstatat(fd, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) {
      AddEntry(entries, name, status);
    }
  }
  return Body(folder.share_path, IsWritable(folder, fd), entries);
}

}  // namespace Device
