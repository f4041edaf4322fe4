#include "device/platform/lumo/errors.h"

#include <algorithm>
#include <cerrno>
#include <iterator>

#include "device/platform/operations.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

int last_error = 0;

struct TextRow {
  int code;
  const char* text;
};
constexpr TextRow kTexts[] = {
    {kErrInternal, "the request failed without an answer"},
    {kErrBadParameter, "bad or missing parameter"},
    {kErrNoApi, "no such API"},
    {kErrNoMethod, "no such method"},
    {kErrNoVersion, "no such version of the method"},
    {kErrSystem, "system error"},
    {kErrSession, "the session has ended"},
    {kErrNoUser, "no such user"},
    {kErrNoPrivilege, "no privilege"},
    {kErrNotFound, "no such file or folder"},
    {kErrReadOnly, "read-only file system"},
    {kErrNameTooLong, "file name too long"},
    {kErrNameTooLongCrypt, "file name too long for an encrypted shared folder"},
    {kErrQuota, "disk quota exceeded"},
    {kErrNoSpace, "no space left on device"},
    {kErrBadName, "not a valid file name"},
    {kErrOutsideShare, "the path leads out of its shared folder"},
    {kErrNoTask, "no such task"},
    {kErrArchive, "the archive could not be made"},
    {kErrArchiveName, "the archive's name is longer than 255 bytes"},
};

struct ErrnoRow {
  int error_number;
  int code;
};
constexpr ErrnoRow kErrnos[] = {
    {0, 0},
    {EACCES, kErrNoPrivilege},
    {EPERM, kErrNoPrivilege},
    {ENOENT, kErrNotFound},
    {ENOTDIR, kErrNotFound},
    {ELOOP, kErrNotFound},
    {EROFS, kErrReadOnly},
    {ENAMETOOLONG, kErrNameTooLong},
    {EDQUOT, kErrQuota},
    {ENOSPC, kErrNoSpace},
};

int FromErrno(int error_number) {
  const auto* const row =
      std::find_if(std::begin(kErrnos), std::end(kErrnos),
                   [&](const ErrnoRow& each) { return each.error_number == error_number; });
  return row == std::end(kErrnos) ? static_cast<int>(kErrSystem) : row->code;
}

}  // namespace

void SetLastError(int code) { last_error = code; }
void SetLastErrno(int error_number) { SetLastError(FromErrno(error_number)); }

const char* ErrorText(int code) {
  const auto* const row = std::find_if(std::begin(kTexts), std::end(kTexts),
                                       [&](const TextRow& each) { return each.code == code; });
  return row == std::end(kTexts) ? "unknown error" : row->text;
}

std::map<int, std::string> ErrorTexts() {
  std::map<int, std::string> texts;
  for (const TextRow& row : kTexts) {
    texts[row.code] = row.text;
  }
  return texts;
}

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
