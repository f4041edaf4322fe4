#include "device/tasks/workers.h"

#include <dirent.h>
#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cinttypes>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <memory>
#include <optional>
#include <stdexcept>

#include "device/base/file_descriptor.h"
#include "device/base/file_io.h"
#include "device/base/try_or_log.h"
#include "device/tasks/task_store.h"

namespace Device {

namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::seconds kGrace(5);
constexpr std::chrono::milliseconds kGroupPoll(5);

struct ProcessStat {
  char state = 0;  // as in /proc/PID/stat: 'Z' for a zombie
  pid_t group = 0;
  std::uint64_t start_time = 0;  // ticks since boot
};

std::optional<ProcessStat> ReadStat(pid_t pid) {
  constexpr char kFields[] =
      ") %c %*d %d %*d %*d %*d %*u %*u %*u %*u %*u %*u %*u %*d %*d %*d %*d %*d %*d %" SCNu64;
  try {
    const std::string text = ReadTextFile("/proc/" + std::to_string(pid) + "/stat");
    const std::size_t name_end = text.rfind(')');  // the program's name may hold brackets too
    ProcessStat stat;
    if (name_end != std::string::npos && std::sscanf(text.c_str() + name_end, kFields, &stat.state,
                                                     &stat.group, &stat.start_time) == 3) {
      return stat;
    }
  } catch (const std::runtime_error&) {  // no such process
  }
  return std::nullopt;
}

bool HasEnded(const ProcessStat& stat) { return stat.state == 'Z' || stat.state == 'X'; }

// True if there is such a process in the group.
bool HasProcess(pid_t group, bool (*is_such)(const ProcessStat&)) {
  const std::unique_ptr<DIR, int (*)(DIR*)> processes(opendir("/proc"), closedir);
  while (const dirent* const entry = processes ? readdir(processes.get()) : nullptr) {
    const pid_t pid = std::atoi(entry->d_name);  // 0 of what is no process
    const std::optional<ProcessStat> stat = pid > 0 ? ReadStat(pid) : std::nullopt;
    if (stat && stat->group == group && is_such(*stat)) {
      return true;
    }
  }
  return false;
}

bool IsStopped(const ProcessStat& stat) { return stat.state == 'T' || stat.state == 't'; }

bool WaitForGroup(pid_t group, Clock::time_point deadline) {
  while (HasProcess(group, [](const ProcessStat& stat) { return !HasEnded(stat); })) {
    if (Clock::now() >= deadline) {
      return false;
    }
    poll(nullptr, 0, static_cast<int>(kGroupPoll.count()));
  }
  return true;
}

bool IsAlive(pid_t pid, const WorkerRow& worker) {
  const std::optional<ProcessStat> stat = ReadStat(pid);
  return stat && stat->start_time == worker.start_time && !HasEnded(*stat);
}

bool IsBeingStopped(const WorkerRow& worker) {
  // From the first signal to the task's removal; a request that died meanwhile removes nothing.
  constexpr std::time_t kLongest = 30;
  const std::time_t age = std::time(nullptr) - worker.stopped;
  return age >= 0 && age < kLongest;  // below when the clock was set back since
}

void WaitForProcess(const FileDescriptor& process, Clock::time_point deadline) {
  const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
  pollfd ended = {process.Get(), POLLIN, 0};
  poll(&ended, 1, static_cast<int>(std::max<std::int64_t>(left.count(), 0)));
}

}  // namespace

void RegisterWorker(const std::string& user, pid_t pid) {
  const std::optional<ProcessStat> stat = ReadStat(pid);
  if (!stat) {
    throw std::runtime_error("no process " + std::to_string(pid));
  }
  StoreOf(user).AddWorker(pid, stat->start_time);
}

bool IsStopped(pid_t pid, bool with_group) {
  const std::optional<ProcessStat> stat = ReadStat(pid);
  return (stat && IsStopped(*stat)) || (with_group && HasProcess(pid, IsStopped));
}

bool IsWorkerAlive(const std::string& user, pid_t pid) {
  const std::optional<WorkerRow> worker = StoreOf(user).FindWorker(pid);
  return worker && IsAlive(pid, *worker);
}

bool IsBeingStopped(const std::string& user, pid_t pid) {
  const std::optional<WorkerRow> worker = StoreOf(user).FindWorker(pid);
  return worker && IsBeingStopped(*worker);
}

bool HasDied(const std::string& user, pid_t pid) {
  const std::optional<WorkerRow> worker = StoreOf(user).FindWorker(pid);
  return worker && !IsAlive(pid, *worker) && !IsBeingStopped(*worker) && !worker->has_come_to_end;
}

bool EndWorker(const std::string& user, pid_t pid) {
  if (!StoreOf(user).FindWorker(pid)) {
    return false;
  }
  // The descriptor holds on to the process that has the id now; whether that is the worker is asked
  // after, so that no other can slip in between.
  const FileDescriptor process(static_cast<int>(syscall(SYS_pidfd_open, pid, 0)));
  // Where there are no such descriptors, under emulators, the id itself must do.
  const int error = process ? 0 : errno;
  if (error != 0 && error != ESRCH && error != ENOSYS) {
    return false;
  }
  if (error == ESRCH || !IsWorkerAlive(user, pid)) {
    return true;  // it has ended already, and an archiver that nobody reads from ends by itself
  }
  // A store without room keeps no job from being stopped.
  TryOrLog("stop", [&] { StoreOf(user).NoteStop(pid); });
  const Clock::time_point deadline = Clock::now() + kGrace;
  if ((process ? syscall(SYS_pidfd_send_signal, process.Get(), SIGTERM, nullptr, 0)
               : kill(pid, SIGTERM)) != 0) {
    return errno == ESRCH;  // it has ended in this moment
  }
  if (process) {
    WaitForProcess(process, deadline);
  }
  if (WaitForGroup(pid, deadline)) {
    return true;
  }
  kill(-pid, SIGKILL);
  return WaitForGroup(pid, Clock::now() + kGrace);
}

void ForgetEndedWorkers(const std::string& user, const std::vector<pid_t>& workers,
                        const std::set<pid_t>& kept) {
  for (const pid_t pid : workers) {
    if (kept.count(pid) == 0 && !IsWorkerAlive(user, pid) && !IsBeingStopped(user, pid)) {
      StoreOf(user).RemoveWorker(pid);
    }
  }
}

}  // namespace Device
