#include "device/host/file_listing.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <map>
#include <memory>

#include "device/base/json_text.h"
#include "device/base/open_below.h"
#include "device/base/work_folder.h"
#include "device/model/device.h"
#include "device/platform/lumo/errors.h"
#include "device/platform/lumo/paths.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

const char* KindOf(mode_t mode) {
  return S_ISDIR(mode) ? "folder" : S_ISREG(mode) ? "file" : S_ISLNK(mode) ? "link" : "other";
}

struct Entry {
  explicit Entry(const struct stat& status)
      : kind(KindOf(status.st_mode)),
        size(S_ISDIR(status.st_mode) ? 0 : status.st_size),
        modified(status.st_mtime) {}

  const char* kind;
  Json::Int64 size;
  Json::Int64 modified;
};

// Text by text: values of all entries would take too much memory.
std::string Body(const std::string& path, bool is_writable,
                 const std::map<std::string, Entry>& entries) {
  std::string body = "{\"entries\":[";
  for (const auto& [name, entry] : entries) {
    body += ToUtf8Text(JsonObject({{"name", name},
                                   {"kind", entry.kind},
                                   {"size", entry.size},
                                   {"modified", entry.modified}}));
    body += ',';
  }
  if (!entries.empty()) {
    body.pop_back();
  }
  return body + "],\"path\":" + ToUtf8Text(path) + ",\"writable\":" + ToText(is_writable) + "}";
}

// What the user has no access to at all is not shown.
Listing ListShares(const std::string& user) {
  std::map<std::string, Entry> entries;
  std::vector<std::string> names = {kHomeShare};
  for (const Share& share : TheDevice().config.shares) {
    names.push_back(share.name);
  }
  for (const std::string& name : names) {
    const ResolvedPath share = Resolve(TheDevice(), user, "/" + name);
    struct stat status {};
    if (share.error == 0 && AccessOf(share, user) != Access::kNone &&
        stat(share.real_path.c_str(), &status) == 0) {
      entries.emplace(name, status);
    }
  }
  return {0, Body("/", false, entries)};
}

Listing FailWithErrno(int error_number) {
  SetLastErrno(error_number);
  return {LumoLibGetErr(), {}};
}

bool IsWritable(const ResolvedPath& folder, int fd) {
  return (folder.share == nullptr || !folder.share->read_only) &&
         faccessat(fd, ".", W_OK | X_OK, AT_EACCESS) == 0;
}

}  // namespace

Listing ListFolder(const std::string& user, const std::string& path) {
  if (path.find_first_not_of('/') == std::string::npos && !path.empty()) {
    return ListShares(user);
  }
  const ResolvedPath folder = Resolve(TheDevice(), user, path);
  if (folder.error != 0) {
    return {folder.error, {}};
  }
  if (AccessOf(folder, user) == Access::kNone) {
    return {KAVO::kErrNoPrivilege, {}};
  }
  const int fd =
      OpenUserPath(TheDevice().FixedFolders(user), folder.real_path, O_RDONLY | O_DIRECTORY)
          .Release();
  if (fd < 0) {
    return errno == ELOOP ? Listing{KAVO::kErrOutsideShare, {}} : FailWithErrno(errno);
  }
  const std::unique_ptr<DIR, int (*)(DIR*)> directory(fdopendir(fd), closedir);
  std::map<std::string, Entry> entries;
  while (const dirent* const found = readdir(directory.get())) {
    const std::string name = found->d_name;
    struct stat status {};
    // One that has gone meanwhile is not there.
    if (name != "." && name != ".." && !IsWorkFolderName(name) &&
        fstatat(fd, found->d_name, &status, AT_SYMLINK_NOFOLLOW) == 0) {
      entries.emplace(name, status);
    }
  }
  return {0, Body(folder.user_path, IsWritable(folder, fd), entries)};
}

}  // namespace Device
