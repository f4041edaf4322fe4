#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>

#include "device/base/json_text.h"
#include "device/base/open_below.h"
#include "device/host/user_files.h"
#include "device/model/device.h"
#include "device/platform/lumo/errors.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

constexpr int kAccessWrite = 2;

// In the order of the worker's questions. 0, or a KAVO::ErrorCode.
int CheckFolder(const std::string& user, const ResolvedPath& path, const std::string& folder) {
  if (path.error != 0) {
    return path.error;
  }
  if (AccessOf(path, user) != Access::kReadWrite ||
      (path.share != nullptr && path.share->read_only)) {
    return KAVO::kErrNoPrivilege;
  }
  const bool is_good =
      LumoCheckPath(folder.c_str(), false, 0, nullptr, true, false, nullptr) == 0 &&
      ACLAccess(folder.c_str(), kAccessWrite) == 0;
  return is_good ? 0 : LumoLibGetErr();
}

const char* FolderText(int code, const std::string& folder) {
  struct stat status {};
  if (code == KAVO::kErrNotFound) {
    return lstat(folder.c_str(), &status) == 0 ? "this is not a folder" : "there is no such folder";
  }
  return code == KAVO::kErrNoPrivilege ? "you may not write in this folder" : ErrorText(code);
}

bool IsTaken(const FileDescriptor& folder, const std::string& name, struct stat& status) {
  return fstatat(folder.Get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0;
}

// "album (2).zip".
std::string FreeName(const FileDescriptor& folder, const std::string& name) {
  const std::size_t dot = std::min(name.rfind('.'), name.size());
  std::string free = name;
  struct stat status {};
  for (int number = 2; IsTaken(folder, free, status); ++number) {
    free = name.substr(0, dot) + " (" + std::to_string(number) + ")" + name.substr(dot);
  }
  return free;
}

}  // namespace

Json::Value CheckDestination(const std::string& user, const std::string& path) {
  Json::Value answer = JsonObject({{"exists", false}, {"error", {}}, {"field", {}}});
  const auto fail = [&](const char* field, const char* error) {
    answer["field"] = field;
    answer["error"] = error;
    return answer;
  };
  const ResolvedPath resolved = Resolve(user, path);
  const std::string full_path = resolved.error == 0 ? resolved.real_path : "/";
  const std::size_t slash = full_path.rfind('/');
  const std::string parent = full_path.substr(0, slash);
  if (const int code = CheckFolder(user, resolved, parent); code != 0) {
    return fail("folder", FolderText(code, parent));
  }
  const std::string name = full_path.substr(slash + 1);
  if (LumoCheckFileName(parent.c_str(), name.c_str()) < 0) {
    return fail("name", ErrorText(LumoLibGetErr()));
  }
  const FileDescriptor folder =
      OpenUserPath(TheDevice().FixedFolders(user), parent, O_PATH | O_DIRECTORY);
  struct stat status {};
  if (IsTaken(folder, name, status)) {
    if (!S_ISREG(status.st_mode)) {
      return fail("name", S_ISDIR(status.st_mode) ? "a folder has this name"
                                                  : "something else than a file has this name");
    }
    answer["exists"] = true;
    answer["size"] = Json::Int64{status.st_size};
    answer["modified"] = Json::Int64{status.st_mtime};
  }
  const std::string free = FreeName(folder, name);
  if (LumoCheckFileName(parent.c_str(), free.c_str()) >= 0) {
    answer["free_name"] = free;
  }
  return answer;
}

}  // namespace Device
