// Groups, file attributes, the file index, quoting, and the error channel of the system library.
#include "platform/klib/system.h"

#include <sys/stat.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstring>

#include "device/base/open_below.h"
#include "device/base/try_or_log.h"
#include "device/model/device.h"
#include "device/platform/klib/archive.h"
#include "device/platform/klib/klib_error.h"
#include "device/platform/lumo/identity.h"
#include "device/platform/operations.h"
#include "device/tasks/task_store.h"

namespace Device {

namespace {

struct KlibErrorState {
  int error_number = 0;
  const char* file = "";
  int line = 0;
} klib_error;

constexpr int kByPath = -1;

int IsAdmin(const char* name) {
  const User* const user = TheDevice().config.FindUser(name);
  if (user == nullptr) {
    return KlibError(ENOENT);
  }
  return user->admin ? 1 : 0;
}

int AddToIndex(const char* path) {
  const bool is_done = TryOrLog("file index", [&] {
    if (OpenArchive(path)) {
      StoreOf(CurrentUser()).AddToIndex(path);
    }
  });
  return is_done ? 0 : KlibError(EIO);
}

int SetMode(const char* path, mode_t mode) {
  const FileDescriptor archive = OpenArchive(path);
  return archive ? chmod(PathOf(archive.Get()).c_str(), mode) : 0;
}

// Each character that means something to a shell behind a backslash; a line feed, which a backslash
// would take away, in single quotes. At the most three bytes for one.
std::string QuoteForShell(const std::string& text) {
  constexpr char kPlain[] = "%+,-./:=@_";
  std::string quoted;
  for (const char each : text) {
    if (each == '\n') {
      quoted += "'\n'";
      continue;
    }
    const auto byte = static_cast<unsigned char>(each);
    if (byte < 0x80 && std::isalnum(byte) == 0 && std::strchr(kPlain, each) == nullptr) {
      quoted += '\\';
    }
    quoted += each;
  }
  return quoted;
}

}  // namespace

int KlibError(int error_number, const char* file, int line) {
  klib_error = {error_number, file, line};
  return -1;
}

}  // namespace Device

using Device::Operation;

int KLIBCErrGet() {
  return Operation("KLIBCErrGet").Run([] { return Device::klib_error.error_number; });
}

const char* KLIBCErrorGetFile() {
  return Operation("KLIBCErrorGetFile").Run([] { return Device::klib_error.file; });
}

int KLIBCErrorGetLine() {
  return Operation("KLIBCErrorGetLine").Run([] { return Device::klib_error.line; });
}

int KLIBGroupIsAdminGroupMem(const char* user, int reserved) {
  return Operation("KLIBGroupIsAdminGroupMem", user, reserved).Run([&] {
    return Device::IsAdmin(user);
  });
}

int KLIBKavoIndexAdd(const char* path, int scope) {
  return Operation("KLIBKavoIndexAdd", path, scope).Run([&] { return Device::AddToIndex(path); });
}

int KAVOFSAclChmod(const char* path, int descriptor, mode_t mode) {
  return Operation("KAVOFSAclChmod", path, descriptor, mode).Run([&] {
    return descriptor == Device::kByPath ? Device::SetMode(path, mode) : fchmod(descriptor, mode);
  });
}

int KLIBCEncShParam(const char* text, char* buffer, size_t size) {
  return Operation("KLIBCEncShParam", text, size).Run([&] {
    const std::string quoted = Device::QuoteForShell(text);
    if (quoted.size() >= size) {
      return -1;
    }
    std::copy_n(quoted.c_str(), quoted.size() + 1, buffer);
    return static_cast<int>(quoted.size());
  });
}
