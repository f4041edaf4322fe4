#include "device/archiver/zip_program.h"

#include <poll.h>
#include <sys/wait.h>

#include <array>
#include <cerrno>
#include <system_error>

#include "device/archiver/failure.h"
#include "device/base/file_descriptor.h"

namespace Archiver {
namespace {

// To the end of the stream.
std::string ReadReason(const Device::FileDescriptor& errors, const Cancel& cancel) {
  std::string text;
  for (;;) {
    pollfd watched[] = {
        {errors.Get(), POLLIN, 0}, {cancel.SignalFd(), POLLIN, 0}, {cancel.ReportFd(), 0, 0}};
    if (poll(watched, 3, -1) < 0 && errno != EINTR) {
      throw SystemFailure("cannot read from", "kavo-zip", errno);
    }
    cancel.Check();
    std::array<char, 4096> buffer{};
    const ssize_t size = watched[0].revents == 0
                             ? -1
                             : TEMP_FAILURE_RETRY(read(errors.Get(), buffer.data(), buffer.size()));
    if (size == 0) {
      return text;
    }
    text.append(buffer.data(), size < 0 ? 0 : static_cast<size_t>(size));
  }
}

}  // namespace

bool RunZipProgram(Device::ProgramStart start, const std::string& name, const Cancel& cancel) {
  Device::Pipe errors;
  start.errors = errors.writer.Get();
  start.ends_with_caller = true;
  try {
    Device::ChildProcess process = Device::ChildProcess::Start(start);
    errors.writer.Close();
    const std::string reason = ReadReason(errors.reader, cancel);
    const int status = process.Wait();
    if (WIFEXITED(status) && (WEXITSTATUS(status) == kZipYes || WEXITSTATUS(status) == kZipNo)) {
      return WEXITSTATUS(status) == kZipYes;
    }
    cancel.Check();
    throw NamedFailure(kCannotUpdate, name, reason.empty() ? "kavo-zip failed" : reason);
  } catch (const std::system_error& error) {
    throw SystemFailure("cannot start", "kavo-zip", error.code().value());
  }
}

}  // namespace Archiver
