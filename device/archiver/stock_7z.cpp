#include "device/archiver/stock_7z.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>

#include "device/archiver/error_text.h"
#include "device/archiver/failure.h"
#include "device/archiver/progress.h"
#include "device/base/file_descriptor.h"

namespace Archiver {

const char* const kStock7z = KAVO_STOCK_7Z;

namespace {

constexpr int kWarned = 1;  // its exit status
constexpr char kCannotStart[] = "cannot start";

struct Pipe {
  explicit Pipe(const std::string& program) {
    std::array<int, 2> ends{};
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
      throw SystemFailure(kCannotStart, program, errno);
    }
    reader = Device::FileDescriptor(ends[0]);
    writer = Device::FileDescriptor(ends[1]);
  }
  Device::FileDescriptor reader, writer;
};

// Kills and reaps its process unless that was waited for.
class Process {
 public:
  explicit Process(pid_t pid) : pid_(pid) {}
  Process(const Process&) = delete;
  Process& operator=(const Process&) = delete;
  ~Process() {
    if (pid_ > 0) {
      kill(pid_, SIGKILL);
      Wait();
    }
  }
  int Wait() {
    int status = 0;
    while (waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
    }
    pid_ = -1;
    return status;
  }

 private:
  pid_t pid_;
};

struct Streams {
  int input, output, errors, exec_errors;
};

// Between fork and exec: async-signal-safe calls only.
[[noreturn]] void BecomeChild(const Child7z& child, char* const* argv, char* const* environment,
                              const Streams& streams, pid_t parent) {
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
  signal(SIGPIPE, SIG_DFL);
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  if (getppid() == parent && chdir(child.folder.c_str()) == 0 &&
      dup2(streams.input, STDIN_FILENO) >= 0 && dup2(streams.output, STDOUT_FILENO) >= 0 &&
      dup2(streams.errors, STDERR_FILENO) >= 0) {
    for (const int fd : child.kept_fds) {
      fcntl(fd, F_SETFD, 0);
    }
    execve(child.program.c_str(), argv, environment);
  }
  const int error = errno;
  [[maybe_unused]] const ssize_t told = write(streams.exec_errors, &error, sizeof error);
  _exit(127);
}

std::vector<char*> Pointers(const std::vector<std::string>& texts) {
  std::vector<char*> result;
  result.reserve(texts.size() + 1);
  for (const std::string& text : texts) {
    result.push_back(const_cast<char*>(text.c_str()));
  }
  result.push_back(nullptr);
  return result;
}

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
  ssize_t size = 0;
  do {
    size = read(fd.Get(), buffer.data(), buffer.size());
  } while (size < 0 && errno == EINTR);
  if (size <= 0) {
    fd.Close();
    return {};
  }
  return {buffer.data(), static_cast<size_t>(size)};
}

void PassOn(const std::vector<Event>& events, Report& report) {
  for (const Event& event : events) {
    switch (event.kind) {
      case Event::Kind::kTotal:
        report.Total(event.value);
        break;
      case Event::Kind::kFile:
        report.Compressing(event.name);
        break;
      case Event::Kind::kPercent:
        report.Progress(event.value);
        break;
    }
  }
}

void Drain(Device::FileDescriptor& output, Device::FileDescriptor& errors, ErrorText* text,
           const Cancel& cancel, Report& report) {
  OutputParser parser;
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
      PassOn(parser.Feed(ReadSome(output)), report);
    }
  }
}

Device::FileDescriptor OpenNull() {
  Device::FileDescriptor fd(open("/dev/null", O_RDONLY | O_CLOEXEC));
  if (!fd) {
    throw SystemFailure("cannot open", "/dev/null", errno);
  }
  return fd;
}

}  // namespace

void Run7z(const Child7z& child, const Cancel& cancel, Report& report) {
  Pipe output(child.program);
  Pipe errors(child.program);
  Pipe exec_errors(child.program);
  const Device::FileDescriptor no_input = OpenNull();
  std::vector<std::string> arguments = child.arguments;
  arguments.insert(arguments.begin(), child.program);
  const std::vector<char*> argv = Pointers(arguments);
  const std::vector<std::string> variables = Environment();
  const std::vector<char*> environment = Pointers(variables);
  const Streams streams = {child.input_fd < 0 ? no_input.Get() : child.input_fd,
                           output.writer.Get(), errors.writer.Get(), exec_errors.writer.Get()};
  const pid_t parent = getpid();
  const pid_t pid = fork();
  if (pid < 0) {
    throw SystemFailure(kCannotStart, child.program, errno);
  }
  if (pid == 0) {
    BecomeChild(child, argv.data(), environment.data(), streams, parent);
  }
  Process process(pid);
  for (Pipe* pipe : {&output, &errors, &exec_errors}) {
    pipe->writer.Close();
  }
  int error = 0;
  if (read(exec_errors.reader.Get(), &error, sizeof error) == sizeof error) {
    throw SystemFailure(kCannotStart, child.program, error);
  }

  ErrorText text(child.left_out);
  Drain(output.reader, errors.reader, &text, cancel, report);
  if (text.HasWarning()) {
    throw Failure("not everything can be packed: " + text.Line());
  }
  const int status = process.Wait();
  cancel.Check();  // the whole group gets the signal, and 7z may have been the first to go
  if (WIFEXITED(status) && WEXITSTATUS(status) <= (text.HasPassedOver() ? kWarned : 0) &&
      text.Empty()) {
    return;
  }
  const std::string end = WIFSIGNALED(status)
                              ? "7z was killed by signal " + std::to_string(WTERMSIG(status))
                              : "7z failed with status " + std::to_string(WEXITSTATUS(status));
  throw Failure(text.Empty() ? end : end + ": " + text.Line());
}

}  // namespace Archiver
