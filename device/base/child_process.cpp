#include "device/base/child_process.h"

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <system_error>

#include "device/base/file_descriptor.h"

namespace Device {

namespace {

constexpr int kCannotStart = 127;

std::vector<char*> Pointers(const std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  pointers.reserve(texts.size() + 1);
  for (const std::string& text : texts) {
    pointers.push_back(const_cast<char*>(text.c_str()));
  }
  pointers.push_back(nullptr);
  return pointers;
}

// A user can read the environment of the user's own programs, and root's may hold secrets.
std::vector<std::string> EnvironmentOf(const ProgramStart& start) {
  std::vector<std::string> variables = start.environment;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    const std::string variable = *entry;
    if (variable.rfind("PATH=", 0) == 0 || variable.rfind("TZ=", 0) == 0 ||
        variable.rfind("KAVO_", 0) == 0) {
      variables.push_back(variable);
    }
  }
  return variables;
}

void ResetSignals() {
  for (int number = 1; number < NSIG; ++number) {
    signal(number, SIG_DFL);
  }
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
}

// Puts a descriptor in the place of a standard stream; -1 leaves that as it is.
bool Redirect(int from, int to) {
  return from < 0 || (from == to ? fcntl(to, F_SETFD, 0) : dup2(from, to)) >= 0;
}

// In the child: returns only when the program cannot run, with the reason in errno.
void Execute(const ProgramStart& start, int null, char* const* arguments, char* const* environment,
             pid_t parent) {
  ResetSignals();
  if (start.ends_with_caller) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (getppid() != parent) {
      raise(SIGKILL);  // the parent has ended in the moment before
    }
  }
  if ((start.folder < 0 || fchdir(start.folder) == 0) &&
      Redirect(start.input < 0 ? null : start.input, STDIN_FILENO) &&
      Redirect(start.output, STDOUT_FILENO) &&
      Redirect(start.errors < 0 ? null : start.errors, STDERR_FILENO) &&
      (start.fence == nullptr || start.fence->Enter())) {
    close_range(STDERR_FILENO + 1, ~0U, CLOSE_RANGE_CLOEXEC);  // what was there at our own start
    for (const int fd : start.kept) {
      fcntl(fd, F_SETFD, 0);
    }
    execve(start.program.c_str(), arguments, environment);
  }
}

// The child shares the caller's memory until the program runs: a copy would cost more than a small
// job. Every signal is held back, so that no handler of the caller's runs there. Why the program
// does not run, the child tells `failure`.
pid_t Spawn(const ProgramStart& start, int null, char* const* arguments, char* const* environment,
            int failure) {
  sigset_t all;
  sigset_t saved;
  sigfillset(&all);
  sigprocmask(SIG_SETMASK, &all, &saved);
  const pid_t parent = getpid();
  const pid_t pid = vfork();
  if (pid == 0) {
    Execute(start, null, arguments, environment, parent);
    const int error = errno;
    [[maybe_unused]] const ssize_t told = write(failure, &error, sizeof error);
    _exit(kCannotStart);
  }
  sigprocmask(SIG_SETMASK, &saved, nullptr);
  return pid;
}

}  // namespace

ChildProcess ChildProcess::Start(const ProgramStart& start) {
  Pipe failure;  // gets the error number, or just closes when the program runs
  const FileDescriptor null(open("/dev/null", O_RDWR | O_CLOEXEC));
  const std::vector<char*> arguments = Pointers(start.arguments);
  const std::vector<std::string> environment = EnvironmentOf(start);
  const std::vector<char*> variables = Pointers(environment);
  ChildProcess child(
      Spawn(start, null.Get(), arguments.data(), variables.data(), failure.writer.Get()));
  if (child.pid_ < 0) {
    ThrowErrno("vfork");
  }
  failure.writer.Close();
  int error = 0;
  if (read(failure.reader.Get(), &error, sizeof error) == sizeof error) {
    errno = error;
    ThrowErrno("cannot start '" + start.program + "'");
  }
  return child;
}

ChildProcess ChildProcess::Run(const std::function<int()>& body) {
  ChildProcess child = Fork();
  if (child.Pid() == 0) {
    int status = 1;
    try {
      status = body();
    } catch (const std::exception& error) {
      syslog(LOG_ERR, "%s", error.what());
    }
    _exit(status);
  }
  return child;
}

ChildProcess ChildProcess::Fork() {
  const pid_t pid = fork();
  if (pid < 0) {
    ThrowErrno("fork");
  }
  return ChildProcess(pid);
}

ChildProcess::~ChildProcess() {
  if (pid_ > 0) {
    kill(pid_, SIGKILL);
    Wait();
  }
}

int ChildProcess::Wait() {
  const pid_t pid = Release();
  int status = 0;
  return TEMP_FAILURE_RETRY(waitpid(pid, &status, 0)) < 0 ? -1 : status;
}

}  // namespace Device
