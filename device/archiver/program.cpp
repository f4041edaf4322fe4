#include "device/archiver/program.h"

#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <utility>

#include "device/archiver/failure.h"
#include "device/archiver/output_of_7z.h"

namespace Archiver {

const char* const kStock7z = KAVO_STOCK_7Z;

namespace {

constexpr int kWarned = 1;  // its exit status

void ReadSome(Device::FileDescriptor& fd, const OutputReader& reader) {
  std::array<char, 65536> buffer{};
  const ssize_t size = TEMP_FAILURE_RETRY(read(fd.Get(), buffer.data(), buffer.size()));
  if (size <= 0) {
    fd.Close();
  } else {
    reader({buffer.data(), static_cast<size_t>(size)});
  }
}

}  // namespace

int RunProgram(Device::ProgramStart start, const Report& report, const OutputReader& output_reader,
               const OutputReader& errors_reader) {
  Device::Pipe output;
  Device::Pipe errors;
  start.output = output.writer.Get();
  start.errors = errors.writer.Get();
  start.ends_with_caller = true;
  Device::ChildProcess process = Device::ChildProcess::Start(start);
  output.writer.Close();
  errors.writer.Close();
  while (output.reader || errors.reader) {
    pollfd watched[] = {{output.reader.Get(), POLLIN, 0},
                        {errors.reader.Get(), POLLIN, 0},
                        {report.SignalFd(), POLLIN, 0},
                        {report.Fd(), 0, 0}};
    if (poll(watched, 4, -1) < 0 && errno != EINTR) {
      throw SystemFailure("cannot read from", start.arguments.front(), errno);
    }
    report.CheckCancelled();
    if (watched[0].revents != 0) {
      ReadSome(output.reader, output_reader);
    }
    if (watched[1].revents != 0) {
      ReadSome(errors.reader, errors_reader);
    }
  }
  const int status = process.Wait();
  report.CheckCancelled();  // the whole group gets the signal, and the program may have been the
                            // first to go
  return status;
}

void Run7z(Device::ProgramStart start, const std::set<std::string>& left_out, const Report& report,
           const OutputReader& reader) {
  // Under this locale 7z takes names for UTF-8 and speaks English. With the zone that holds anyway,
  // but named, the C library does not look at its file again for each time of each source that 7z
  // converts.
  start.environment.emplace_back("LC_ALL=C.UTF-8");
  if (std::getenv("TZ") == nullptr) {
    start.environment.emplace_back("TZ=:/etc/localtime");
  }
  ErrorText text(left_out);
  const int status = RunProgram(std::move(start), report, reader, [&](const std::string& bytes) {
    text.Feed(bytes);
    if (text.HasWarning()) {
      throw Failure("not everything can be packed: " + text.Line());
    }
  });
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
