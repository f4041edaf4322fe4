#include "device/platform/lumo/errors.h"

#include <cerrno>

#include "device/platform/operations.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

int last_error = 0;

const std::map<int, std::string> kTexts = {
    {KAVO::kErrInternal, "the request failed without an answer"},
    {KAVO::kErrBadParameter, "bad or missing parameter"},
    {KAVO::kErrNoApi, "no such API"},
    {KAVO::kErrNoMethod, "no such method"},
    {KAVO::kErrNoVersion, "no such version of the method"},
    {KAVO::kErrSystem, "system error"},
    {KAVO::kErrSession, "the session has ended"},
    {KAVO::kErrNoUser, "no such user"},
    {KAVO::kErrNoPrivilege, "no privilege"},
    {KAVO::kErrNotFound, "no such file or folder"},
    {KAVO::kErrReadOnly, "read-only file system"},
    {KAVO::kErrNameTooLong, "file name too long"},
    {KAVO::kErrNameTooLongEncrypted, "file name too long for an encrypted shared folder"},
    {KAVO::kErrQuota, "disk quota exceeded"},
    {KAVO::kErrNoSpace, "no space left on device"},
    {KAVO::kErrBadName, "not a valid file name"},
    {KAVO::kErrOutsideShare, "the path leads out of its shared folder"},
    {KAVO::kErrNoTask, "no such task"},
    {KAVO::kErrGeneral, "the archive could not be made"},
    {KAVO::kErrArchiveNameTooLong, "the archive's name is longer than 255 bytes"},
};

const std::map<int, int> kErrnos = {
    {0, 0},
    {EACCES, KAVO::kErrNoPrivilege},
    {EPERM, KAVO::kErrNoPrivilege},
    {ENOENT, KAVO::kErrNotFound},
    {ENOTDIR, KAVO::kErrNotFound},
    {ELOOP, KAVO::kErrNotFound},
    {EROFS, KAVO::kErrReadOnly},
    {ENAMETOOLONG, KAVO::kErrNameTooLong},
    {EDQUOT, KAVO::kErrQuota},
    {ENOSPC, KAVO::kErrNoSpace},
};

int FromErrno(int error_number) {
  const auto row = kErrnos.find(error_number);
  return row == kErrnos.end() ? static_cast<int>(KAVO::kErrSystem) : row->second;
}

}  // namespace

int SetLastError(int code) {
  last_error = code;
  return -1;
}
int SetLastErrno(int error_number) { return SetLastError(FromErrno(error_number)); }

const char* ErrorText(int code) {
  const auto row = kTexts.find(code);
  return row == kTexts.end() ? "unknown error" : row->second.c_str();
}

const std::map<int, std::string>& ErrorTexts() { return kTexts; }

}  // namespace Device

int LumoLibGetErr() {
  return Device::Operation("LumoLibGetErr").Run([] { return Device::last_error; });
}

int LumoParseErrnoToError(int error_number, const char* source, const char* destination) {
  return Device::Operation("LumoParseErrnoToError", error_number, source, destination).Run([&] {
    return Device::FromErrno(error_number);
  });
}

const char* LumoParseErrorToVeskString(int code, int reserved) {
  return Device::Operation("LumoParseErrorToVeskString", code, reserved).Run([&] {
    return Device::ErrorText(code);
  });
}
