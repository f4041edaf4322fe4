// Starting processes: the worker's fork, and programs by argument vector.
#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstring>
#include <map>
#include <memory>
#include <stdexcept>
#include <string_view>
#include <utility>
#include <vector>

#include "device/base/file_descriptor.h"
#include "device/model/device.h"
#include "device/platform/klib/klib_error.h"
#include "device/platform/operations.h"
#include "device/tasks/task_store.h"
#include "device/tasks/workers.h"
#include "platform/klib/system.h"

namespace Device {

namespace {

constexpr char kArchiverProgram[] = "/usr/bin/7z";
constexpr char kKilledLine[] = "\nError: the archiver was killed\n";
constexpr unsigned int kRunAndWait = 187;

// Which process writes to a stream that KLIBCPopenv returned.
std::map<FILE*, pid_t>& Streams() {
  static std::map<FILE*, pid_t> streams;
  return streams;
}

// The device's own program where it has one of that name.
std::string ProgramFile(const std::string& program) {
  return program == kArchiverProgram ? "/proc/self/fd/" + std::to_string(TheDevice().archiver.Get())
                                     : program;
}

// Starts a program with nothing to read and its standard output in `output`, or in this process's
// when that is -1. It stays in this process group. 0, or the reason as an error number.
int Spawn(const char* program, char* const* arguments, int output, pid_t& pid) {
  sigset_t all;
  sigset_t none;
  sigfillset(&all);
  sigemptyset(&none);
  posix_spawnattr_t attributes;
  posix_spawnattr_init(&attributes);
  // Also in the moment before the program runs, the child has none of this process's handlers.
  posix_spawnattr_setsigdefault(&attributes, &all);
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  if (output >= 0) {
    posix_spawn_file_actions_adddup2(&actions, output, STDOUT_FILENO);
  }
  const int error =
      posix_spawn(&pid, ProgramFile(program).c_str(), &actions, &attributes, arguments, environ);
  posix_spawn_file_actions_destroy(&actions);
  posix_spawnattr_destroy(&attributes);
  return error;
}

int WaitForExit(pid_t pid) {
  int status = 0;
  while (waitpid(pid, &status, 0) < 0) {
    if (errno != EINTR) {
      return -1;
    }
  }
  return status;
}

// What stands behind the stream of the archiver, the one program that is read from. Its reader
// looks at the lines alone, and when all of its processes were killed there is none that says so.
struct Reading {
  FileDescriptor output;
  pid_t pid;
  std::string_view last_line;  // what is left of it, once the output has ended
  bool has_ended;
};

bool WasKilled(pid_t pid) {
  siginfo_t ended{};
  while (waitid(P_PID, static_cast<id_t>(pid), &ended, WEXITED | WNOWAIT) < 0 && errno == EINTR) {
  }
  return ended.si_code == CLD_KILLED || ended.si_code == CLD_DUMPED;
}

ssize_t ReadOutput(void* cookie, char* buffer, std::size_t size) {
  auto& reading = *static_cast<Reading*>(cookie);
  if (!reading.has_ended) {
    ssize_t got = 0;
    do {
      got = read(reading.output.Get(), buffer, size);
    } while (got < 0 && errno == EINTR);
    if (got != 0) {
      return got;
    }
    reading.has_ended = true;
    reading.last_line = WasKilled(reading.pid) ? kKilledLine : "";
  }
  const std::size_t copied = reading.last_line.copy(buffer, size);
  reading.last_line.remove_prefix(copied);
  return static_cast<ssize_t>(copied);
}

int CloseOutput(void* cookie) {
  delete static_cast<Reading*>(cookie);
  return 0;
}

FILE* StreamOf(FileDescriptor& output, const char* mode, pid_t pid) {
  auto reading = std::make_unique<Reading>(Reading{std::move(output), pid, {}, false});
  FILE* const stream =
      fopencookie(reading.get(), mode, {ReadOutput, nullptr, nullptr, CloseOutput});
  if (stream != nullptr) {
    static_cast<void>(reading.release());  // CloseOutput deletes it
  }
  return stream;
}

FILE* OpenProgram(const char* program, const char* mode, char* const* arguments) {
  int ends[2];
  if (std::strcmp(mode, "r") != 0 || pipe2(ends, O_CLOEXEC) != 0) {
    KLIB_ERROR(errno);
    return nullptr;
  }
  FileDescriptor read_end(ends[0]);
  const FileDescriptor write_end(ends[1]);
  pid_t pid = 0;
  const int error = Spawn(program, arguments, write_end.Get(), pid);
  if (error != 0) {
    KLIB_ERROR(error);
    return nullptr;
  }
  FILE* const stream = StreamOf(read_end, mode, pid);
  if (stream == nullptr) {
    KLIB_ERROR(errno);
    kill(pid, SIGKILL);
    WaitForExit(pid);
    return nullptr;
  }
  Streams()[stream] = pid;
  return stream;
}

// A process group of its own; nothing of the request's that somebody waits to see closed.
void BecomeWorker() {
  // No session of its own: where the kernel shares out time by sessions, the launcher would get no
  // more than each job does.
  setpgid(0, 0);
  TheDevice().outcome.Close();
  const FileDescriptor null(open("/dev/null", O_RDWR | O_CLOEXEC));
  dup2(null.Get(), STDIN_FILENO);
  dup2(null.Get(), STDOUT_FILENO);
  struct stat status {};
  const bool is_awaited =
      fstat(STDERR_FILENO, &status) == 0 && (S_ISFIFO(status.st_mode) || S_ISSOCK(status.st_mode));
  if (is_awaited && !TheDevice().is_followed) {
    // Whoever reads there would wait for the worker's end; its lines go to syslog alone.
    dup2(null.Get(), STDERR_FILENO);
  }
}

pid_t ForkWorker() {
  CloseStores();
  const pid_t pid = fork();
  if (pid < 0) {
    KLIB_ERROR(errno);
  } else if (pid == 0) {
    BecomeWorker();
  } else {
    try {
      RegisterWorker(TheDevice().current_user, pid);
    } catch (const std::exception& error) {
      syslog(LOG_ERR, "register worker: %s", error.what());
      kill(pid, SIGKILL);
      WaitForExit(pid);
      KLIB_ERROR(EIO);
      return -1;
    }
  }
  return pid;
}

int RunProgram(const char* program, unsigned int flags, std::vector<const char*> arguments) {
  if (flags != kRunAndWait) {
    KLIB_ERROR(EINVAL);
    return -1;
  }
  pid_t pid = 0;
  const int error = Spawn(program, const_cast<char* const*>(arguments.data()), -1, pid);
  if (error != 0) {
    KLIB_ERROR(error);
    return -1;
  }
  const int status = WaitForExit(pid);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

}  // namespace
}  // namespace Device

using Device::Operation;

pid_t KLIBCProcFork() {
  return Operation("KLIBCProcFork").Run([] { return Device::ForkWorker(); });
}

FILE* KLIBCPopenv(const char* program, const char* mode, char* const argv[], int flag) {
  return Operation("KLIBCPopenv", program, mode, argv, flag).Run([&] {
    return Device::OpenProgram(program, mode, argv);
  });
}

int KLIBCPclose(FILE* stream) {
  return Operation("KLIBCPclose", stream).Run([&] {
    const auto found = Device::Streams().find(stream);
    if (found == Device::Streams().end()) {
      KLIB_ERROR(EBADF);
      return -1;
    }
    const pid_t pid = found->second;
    Device::Streams().erase(found);
    std::fclose(stream);
    return Device::WaitForExit(pid);
  });
}

int KLIBCExecl(const char* program, unsigned int flags, ...) {
  std::vector<const char*> arguments = {program};
  va_list list;
  va_start(list, flags);
  do {
    arguments.push_back(va_arg(list, const char*));
  } while (arguments.back() != nullptr);
  va_end(list);
  return Operation("KLIBCExecl", program, flags, const_cast<char* const*>(arguments.data()) + 1)
      .Run([&] { return Device::RunProgram(program, flags, arguments); });
}
