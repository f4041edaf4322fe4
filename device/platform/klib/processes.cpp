// Starting processes: the worker's fork, and programs by argument vector.
#include <fcntl.h>
#include <malloc.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstring>
#include <map>
#include <memory>
#include <string>
#include <system_error>
#include <vector>

#include "device/base/child_process.h"
#include "device/base/file_descriptor.h"
#include "device/base/try_or_log.h"
#include "device/model/device.h"
#include "device/platform/host_services.h"
#include "device/platform/klib/archive.h"
#include "device/platform/klib/klib_error.h"
#include "device/platform/lumo/identity.h"
#include "device/platform/operations.h"
#include "device/tasks/job_queue.h"
#include "device/tasks/leftovers.h"
#include "device/tasks/task_store.h"
#include "device/tasks/workers.h"
#include "platform/klib/system.h"

namespace Device {

namespace {

constexpr char kArchiverProgram[] = "/usr/bin/7z";
constexpr unsigned int kRunAndWait = 187;

ChildProcess StartProgram(const char* program, const char* const* arguments, int output) {
  ProgramStart start;
  start.program = program;
  for (; *arguments != nullptr; ++arguments) {
    start.arguments.emplace_back(*arguments);
  }
  start.output = output;
  return ChildProcess::Start(start);
}

// A program whose output is read, the archiver. The reader looks at the lines alone: how the
// program ended is seen here, and told in a last line when it was not well.
struct ProgramOutput {
  FileDescriptor output;
  ChildProcess program;
  ArchiverRun archiver;  // when it is that
  bool has_ended = false;
  int status = 0;         // wait status, once it has ended
  std::string last_line;  // what is left of it
  std::string line;       // that is read, up to now

  void TakeNews(const char* text, std::size_t size) {
    for (const char* const end = text + size; text != end; ++text) {
      if (*text != '\n') {
        line += *text;
      } else {
        TakeArchiverLine(std::exchange(line, {}));
      }
    }
  }

  void TakeEnd() {
    has_ended = true;
    status = program.Wait();
    if (WIFSIGNALED(status)) {
      last_line = "\nError: the archiver was killed\n";
    } else if (WEXITSTATUS(status) != 0) {
      last_line =
          "\nError: the archiver failed with status " + std::to_string(WEXITSTATUS(status)) + "\n";
    } else if (archiver.call) {
      TakeArchive(archiver);
    }
  }
};

ssize_t ReadOutput(void* cookie, char* buffer, std::size_t size) {
  auto& source = *static_cast<ProgramOutput*>(cookie);
  if (!source.has_ended) {
    const ssize_t got = TEMP_FAILURE_RETRY(read(source.output.Get(), buffer, size));
    if (got != 0) {
      source.TakeNews(buffer, std::max<ssize_t>(got, 0));
      return got;
    }
    source.TakeEnd();
  }
  const std::size_t copied = source.last_line.copy(buffer, size);
  source.last_line.erase(0, copied);
  source.TakeNews(buffer, copied);
  return static_cast<ssize_t>(copied);
}

// The streams that KLIBCPopenv has returned and KLIBCPclose not closed yet. Not destroyed at the
// end of the process: an archiver whose worker is told to end is told too, and cleans up by itself.
std::map<FILE*, std::unique_ptr<ProgramOutput>>& Streams() {
  static auto& streams = *new std::map<FILE*, std::unique_ptr<ProgramOutput>>;
  return streams;
}

FILE* OpenProgram(const char* program, const char* mode, char* const* arguments) {
  if (std::strcmp(mode, "r") != 0) {
    KlibError(EINVAL);
    return nullptr;
  }
  try {
    malloc_trim(0);  // the caller is going to wait for the program, for hours maybe
    Pipe pipe;
    ArchiverRun archiver;
    ChildProcess child = std::strcmp(program, kArchiverProgram) == 0
                             ? StartArchiver(arguments, pipe.writer.Get(), archiver)
                             : StartProgram(program, arguments, pipe.writer.Get());
    auto source = std::make_unique<ProgramOutput>(ProgramOutput{
        std::move(pipe.reader), std::move(child), std::move(archiver), false, 0, {}, {}});
    FILE* const stream = fopencookie(source.get(), mode, {ReadOutput, nullptr, nullptr, nullptr});
    if (stream == nullptr) {
      ThrowErrno("stream");
    }
    Streams().emplace(stream, std::move(source));
    return stream;
  } catch (const std::system_error& error) {
    KlibError(error.code().value());
    return nullptr;
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s: %s", program, error.what());
    TheArchiverNews()[kArchiverReason] = error.what();
    KlibError(EPERM);
    return nullptr;
  }
}

int CloseProgram(FILE* stream) {
  const auto found = Streams().find(stream);
  if (found == Streams().end()) {
    return KlibError(EBADF);
  }
  const std::unique_ptr<ProgramOutput> source = std::move(found->second);
  Streams().erase(found);
  std::fclose(stream);
  source->output.Close();  // a program that still writes sees that nobody reads
  if (!source->has_ended) {
    source->TakeEnd();
  }
  return source->status;
}

// A session and a process group of its own, and nothing of the request's. Returns when it is the
// worker's turn.
void BecomeWorker(uid_t user, Pipe& entered) {
  // A signal's handler ends it in the midst of anything: what it holds then is not waited for.
  on_exit([](int status, void* /*none*/) { _exit(status); }, nullptr);
  setsid();                       // and no terminal: the user can make the archiver do anything
  std::signal(SIGTERM, SIG_DFL);  // the host may have a handler, which ends nothing
  EnterQueue(user);
  entered.writer.Close();
  const FileDescriptor null(open("/dev/null", O_RDWR | O_CLOEXEC));
  dup2(null.Get(), STDIN_FILENO);
  dup2(null.Get(), STDOUT_FILENO);
  TheHost().leave_request();
  RemoveOldLists();
  WaitForTurn();
}

pid_t ForkWorker() {
  TryOrLog("leftovers", [] { RemoveLeftovers(CurrentUser()); });
  CloseStores();
  try {
    const uid_t user = TheDevice().config.FindUser(CurrentUser())->uid;
    if (!MayEnterQueue(user)) {
      syslog(LOG_ERR, "fork worker: the user has too many jobs");
      return KlibError(EAGAIN);
    }
    Pipe entered;
    ChildProcess worker = ChildProcess::Fork();
    if (worker.Pid() == 0) {
      if (!TryOrLog("worker", [&] { BecomeWorker(user, entered); })) {
        _exit(EXIT_FAILURE);
      }
    } else {
      RegisterWorker(CurrentUser(), worker.Pid());
      TheHost().worker = worker.Pid();
      TheHost().worker_entered = std::move(entered.reader);
    }
    return worker.Release();
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "fork worker: %s", error.what());
    return KlibError(EIO);
  }
}

int RunProgram(const char* program, unsigned int flags, const char* const* arguments) {
  if (flags != kRunAndWait) {
    return KlibError(EINVAL);
  }
  try {
    const int status = StartProgram(program, arguments, -1).Wait();
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  } catch (const std::system_error& error) {
    return KlibError(error.code().value());
  }
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
  return Operation("KLIBCPclose", stream).Run([&] { return Device::CloseProgram(stream); });
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
      .Run([&] { return Device::RunProgram(program, flags, arguments.data()); });
}
