#include "device/archiver/password.h"

#include <sys/mman.h>

#include <algorithm>
#include <cerrno>

#include "device/archiver/failure.h"
#include "device/base/file_io.h"

namespace Archiver {

void CheckPassword(const Request& request) {
  const std::string& password = request.password;
  if (password.find('\n') != std::string::npos) {
    throw Failure("the password holds a line break");
  }
  const bool plain =
      std::all_of(password.begin(), password.end(), [](char c) { return c >= ' ' && c <= '~'; });
  if (request.zip && !plain) {
    throw Failure("the password of a zip archive can hold printable ASCII characters only");
  }
}

Device::FileDescriptor PasswordInput(const Request& request) {
  if (request.password.empty()) {
    return Device::FileDescriptor();
  }
  // It asks once to open an old archive and once to encrypt new files.
  const std::string answer = request.password + '\n';
  return UnnamedFile(answer + answer);
}

Device::FileDescriptor UnnamedFile(const std::string& text) {
  Device::FileDescriptor fd(memfd_create("kavo-7z", MFD_CLOEXEC));
  if (!fd || !Device::WriteAll(fd.Get(), text) || lseek(fd.Get(), 0, SEEK_SET) != 0) {
    throw SystemFailure("cannot write", "unnamed file for 7z", errno);
  }
  return fd;
}

}  // namespace Archiver
