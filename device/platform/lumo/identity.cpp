// The identity and the file-creation mask of a process.
#include "device/platform/lumo/identity.h"

#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "device/model/device.h"
#include "device/platform/host_services.h"
#include "device/platform/lumo/errors.h"
#include "device/platform/operations.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

constexpr mode_t kWorkingMask = 022;

std::string current_user;

// For good: what the process starts cannot go back either.
bool BecomeUser(const User& user) {
  if (!TheDevice().switches_identity || geteuid() == user.uid) {
    return true;
  }
  const gid_t groups[] = {kUsersGroup, kAdminsGroup};
  return setgroups(user.admin ? 2 : 1, groups) == 0 &&
         setresgid(kUsersGroup, kUsersGroup, kUsersGroup) == 0 &&
         setresuid(user.uid, user.uid, user.uid) == 0;
}

}  // namespace

int SwitchTo(const char* session_id, const char* name) {
  const User* const user = name == nullptr ? nullptr : TheDevice().config.FindUser(name);
  if (user == nullptr) {
    SetLastError(KAVO::kErrNoUser);
    errno = ENOENT;
    return -1;
  }
  if (session_id != nullptr && *session_id != '\0' &&
      !TheHost().has_session(session_id, user->name)) {
    SetLastError(KAVO::kErrSession);
    errno = EACCES;
    return -1;
  }
  if (!BecomeUser(*user)) {
    return SetLastErrno(errno);
  }
  current_user = user->name;
  return 0;
}

const std::string& CurrentUser() { return current_user; }

}  // namespace Device

using Device::Operation;

int LumoLibUGIDSet(const char* session_id, const char* user) {
  return Operation("LumoLibUGIDSet", session_id, user).Run([&] {
    return Device::SwitchTo(session_id, user);
  });
}

std::uint32_t LumoLibUmask() {
  return Operation("LumoLibUmask").Run([] {
    return static_cast<std::uint32_t>(umask(Device::kWorkingMask));
  });
}

void LumoLibRestoreUmask(std::uint32_t saved) {
  Operation("LumoLibRestoreUmask", saved).Run([&] { umask(saved); });
}

std::uint32_t LumoLibGetUmask() {
  return Operation("LumoLibGetUmask").Run([] {
    const mode_t mask = umask(0);
    umask(mask);
    return static_cast<std::uint32_t>(mask);
  });
}
