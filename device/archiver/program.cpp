#include "device/archiver/program.h"

#include <poll.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <system_error>

#include "device/archiver/failure.h"
#include "device/base/file_descriptor.h"

namespace Archiver {
namespace {

void ReadSome(Device::FileDescriptor& fd, const OutputReader& reader) {
  std::array<char, 65536> buffer{};
  const ssize_t size = TEMP_FAILURE_RETRY(read(fd.Get(), buffer.data(), buffer.size()));
  if (size <= 0) {
    fd.Close();
  } else {
    reader({buffer.data(), static_cast<size_t>(size)});
  }
}

Device::ChildProcess StartOrFail(const Device::ProgramStart& start) {
  try {
    return Device::ChildProcess::Start(start);
  } catch (const std::system_error& error) {
    throw SystemFailure("cannot start", start.arguments.front(), error.code().value());
  }
}

}  // namespace

int RunProgram(Device::ProgramStart start, const Cancel& cancel, const OutputReader& output_reader,
               const OutputReader& errors_reader) {
  Device::Pipe output;
  Device::Pipe errors;
  start.output = output.writer.Get();
  start.errors = errors.writer.Get();
  start.ends_with_caller = true;
  Device::ChildProcess process = StartOrFail(start);
  output.writer.Close();
  errors.writer.Close();
  while (output.reader || errors.reader) {
    pollfd watched[] = {{output.reader.Get(), POLLIN, 0},
                        {errors.reader.Get(), POLLIN, 0},
                        {cancel.SignalFd(), POLLIN, 0},
                        {cancel.ReportFd(), 0, 0}};
    if (poll(watched, 4, -1) < 0 && errno != EINTR) {
      throw SystemFailure("cannot read from", start.arguments.front(), errno);
    }
    cancel.Check();
    if (watched[0].revents != 0) {
      ReadSome(output.reader, output_reader);
    }
    if (watched[1].revents != 0) {
      ReadSome(errors.reader, errors_reader);
    }
  }
  const int status = process.Wait();
  cancel.Check();  // the whole group gets the signal, and the program may have been the first to go
  return status;
}

}  // namespace Archiver
