#include "device/archiver/stock_7z.h"

#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <system_error>

#include "device/archiver/failure.h"
#include "device/archiver/output_of_7z.h"
#include "device/base/child_process.h"
#include "device/base/file_descriptor.h"

namespace Archiver {

const char* const kStock7z = KAVO_STOCK_7Z;

namespace {

constexpr int kWarned = 1;  // its exit status

// The caller's, with a locale under which 7z takes names for UTF-8 and speaks English. With the
// zone that holds anyway, but named, the C library does not look at its file again for each time
// of each source that 7z converts.
std::vector<std::string> Environment() {
  std::vector<std::string> result;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    if (std::strncmp(*entry, "LC_", 3) != 0 && std::strncmp(*entry, "LANG", 4) != 0) {
      result.emplace_back(*entry);
    }
  }
  result.emplace_back("LC_ALL=C.UTF-8");
  if (std::getenv("TZ") == nullptr) {
    result.emplace_back("TZ=:/etc/localtime");
  }
  return result;
}

std::string ReadSome(Device::FileDescriptor& fd) {
  std::array<char, 65536> buffer{};
  const ssize_t size = TEMP_FAILURE_RETRY(read(fd.Get(), buffer.data(), buffer.size()));
  if (size <= 0) {
    fd.Close();
    return {};
  }
  return {buffer.data(), static_cast<size_t>(size)};
}

void Drain(Device::FileDescriptor& output, Device::FileDescriptor& errors, ErrorText* text,
           const Cancel& cancel, const OutputReader& reader) {
  while ((output || errors) && !text->HasWarning()) {
    pollfd watched[] = {{output.Get(), POLLIN, 0},
                        {errors.Get(), POLLIN, 0},
                        {cancel.SignalFd(), POLLIN, 0},
                        {cancel.ReportFd(), 0, 0}};
    if (poll(watched, 4, -1) < 0 && errno != EINTR) {
      throw SystemFailure("cannot read from", kStock7z, errno);
    }
    cancel.Check();
    if (watched[1].revents != 0) {
      text->Feed(ReadSome(errors));
    }
    if (watched[0].revents != 0) {
      reader(ReadSome(output));
    }
  }
}

Device::ChildProcess StartOrFail(const Device::ProgramStart& start) {
  try {
    return Device::ChildProcess::Start(start);
  } catch (const std::system_error& error) {
    throw SystemFailure("cannot start", start.program, error.code().value());
  }
}

}  // namespace

void Run7z(Device::ProgramStart start, const std::set<std::string>& left_out, const Cancel& cancel,
           const OutputReader& reader) {
  Device::Pipe output;
  Device::Pipe errors;
  start.output = output.writer.Get();
  start.errors = errors.writer.Get();
  start.environment = Environment();
  start.ends_with_caller = true;
  Device::ChildProcess process = StartOrFail(start);
  output.writer.Close();
  errors.writer.Close();
  ErrorText text(left_out);
  Drain(output.reader, errors.reader, &text, cancel, reader);
  if (text.HasWarning()) {
    throw Failure("not everything can be packed: " + text.Line());
  }
  const int status = process.Wait();
  cancel.Check();  // the whole group gets the signal, and 7z may have been the first to go
  if (WIFEXITED(status) && WEXITSTATUS(status) <= (text.HasPassedOver() ? kWarned : 0) &&
      text.Empty()) {
    return;
  }
  const std::string end =
      WIFSIGNALED(status) ? "7z was killed by signal " + std::to_string(WTERMSIG(status)) +
                                (WTERMSIG(status) == SIGKILL ? ", maybe for want of memory" : "")
                          : "7z failed with status " + std::to_string(WEXITSTATUS(status));
  throw Failure(text.Empty() ? end : end + ": " + text.Line());
}

}  // namespace Archiver
