// What users may do on shared folders, and with files.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "device/base/open_below.h"
#include "device/model/device.h"
#include "device/platform/klib/archive.h"
#include "device/platform/lumo/errors.h"
#include "device/platform/lumo/identity.h"
#include "device/platform/lumo/paths.h"
#include "device/platform/operations.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

constexpr int kAccessRead = 1;
constexpr int kAccessWrite = 2;
constexpr int kAccessPass = 4;

constexpr int kLevelNone = 0;
constexpr int kLevelRead = 1;
constexpr int kLevelWrite = 2;
constexpr int kFlagWriteSuspended = 0x2;

int LevelOf(Access access) {
  return access == Access::kNone        ? kLevelNone
         : access == Access::kReadWrite ? kLevelWrite
                                        : kLevelRead;
}

int GetPrivilege(const char* path, const std::string& user, int* level, int* flags) {
  const ResolvedPath resolved = Resolve(user, path);
  if (resolved.error != 0) {
    return SetLastError(resolved.error);
  }
  *level = LevelOf(AccessOf(resolved, user));
  *flags = resolved.share != nullptr && resolved.share->read_only ? kFlagWriteSuspended : 0;
  return 0;
}

bool MayList(const std::string& user, const char* path) {
  const ResolvedPath resolved = Resolve(user, path);
  const Access access = resolved.error == 0 ? AccessOf(resolved, user) : Access::kNone;
  return access == Access::kReadOnly || access == Access::kReadWrite;
}

int AskKernel(const char* path, int mode) {
  const int bits = ((mode & kAccessRead) != 0 ? R_OK : 0) |
                   ((mode & kAccessWrite) != 0 ? W_OK : 0) | ((mode & kAccessPass) != 0 ? X_OK : 0);
  // What is written to is the destination's folder, never one behind a link.
  const bool is_misled =
      (mode & kAccessWrite) != 0 &&
      !OpenUserPath(TheDevice().FixedFolders(CurrentUser()), path, O_PATH | O_DIRECTORY);
  const bool is_allowed = !is_misled && faccessat(AT_FDCWD, path, bits, AT_EACCESS) == 0;
  return is_allowed ? 0 : SetLastErrno(errno);
}

int ChownToAdmins(const char* path, const std::string& name) {
  const User* const user = TheDevice().config.FindUser(name);
  if (user == nullptr) {
    return SetLastError(KAVO::kErrNoUser);
  }
  const FileDescriptor archive = OpenArchive(path);
  // Without root there are no such users and groups, only the caller.
  if (TheDevice().switches_identity && archive &&
      fchownat(archive.Get(), "", user->uid, kAdminsGroup, AT_EMPTY_PATH) != 0) {
    return SetLastErrno(errno);
  }
  return 0;
}

}  // namespace
}  // namespace Device

using Device::Operation;

int LumoLibGetPrivilege(const char* path, const char* user, const char* session_id, int* level,
                        int* flags) {
  return Operation("LumoLibGetPrivilege", path, user, session_id)
      .Output("level", *level)
      .Output("flags", *flags)
      .Run([&] { return Device::GetPrivilege(path, user, level, flags); });
}

int CheckShareListPrivilege(const char* user, const char* session_id, const char* path) {
  return Operation("CheckShareListPrivilege", user, session_id, path).Run([&] {
    return Device::MayList(user, path) ? 1 : 0;
  });
}

int ACLAccess(const char* path, int mode) {
  return Operation("ACLAccess", path, mode).Run([&] { return Device::AskKernel(path, mode); });
}

int LumoLibCheckEncryptShare(const std::string& path, bool* encrypted) {
  return Operation("LumoLibCheckEncryptShare", path).Run([&] {
    const Device::ResolvedPath resolved = Device::Resolve(Device::CurrentUser(), path);
    if (resolved.error != 0) {
      Device::SetLastError(resolved.error);
      return 0;
    }
    *encrypted = resolved.share != nullptr && resolved.share->encrypted;
    return 1;
  });
}

int LumoLibChown2Admin(const char* path, const char* user) {
  return Operation("LumoLibChown2Admin", path, user).Run([&] {
    return Device::ChownToAdmins(path, user);
  });
}
