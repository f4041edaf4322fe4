#include "device/archiver/password.h"

#include <sys/mman.h>

#include <algorithm>
#include <cerrno>

#include "device/archiver/failure.h"

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
  bool whole = static_cast<bool>(fd);
  for (size_t done = 0; whole && done < text.size();) {
    const ssize_t size = write(fd.Get(), text.data() + done, text.size() - done);
    whole = size > 0 || (size < 0 && errno == EINTR);
    done += size > 0 ? static_cast<size_t>(size) : 0;
  }
  if (!whole || lseek(fd.Get(), 0, SEEK_SET) != 0) {
    throw SystemFailure("cannot write", "unnamed file for 7z", errno);
  }
  return fd;
}

}  // namespace Archiver
