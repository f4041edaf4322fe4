#include "device/tasks/job_queue.h"

#include <fcntl.h>
#include <malloc.h>
#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <limits>
#include <tuple>

#include "device/base/file_descriptor.h"
#include "device/model/device.h"
#include "device/tasks/workers.h"

namespace Device {

namespace {

// Where locks lie: the first byte is held while the queue changes, the others say by their bits
// from above: running or waiting, ticket, user.
constexpr off64_t kChange = 0;
constexpr int kRunningBit = 62;
constexpr int kTicketBit = 32;
constexpr off64_t kLastByte = std::numeric_limits<off64_t>::max();

off64_t PlaceOf(const QueuedJob& job) {
  return off64_t{job.is_running} << kRunningBit | off64_t{job.ticket} << kTicketBit |
         off64_t{job.user};
}

QueuedJob JobAt(off64_t place, pid_t worker) {
  constexpr off64_t kTicketMask = (off64_t{1} << (kRunningBit - kTicketBit)) - 1;
  return {worker, static_cast<uid_t>(place),
          static_cast<std::uint32_t>(place >> kTicketBit & kTicketMask),
          (place >> kRunningBit & 1) != 0};
}

struct flock64 Range(short type, off64_t first, off64_t length) {
  struct flock64 range {};
  range.l_type = type;
  range.l_whence = SEEK_SET;
  range.l_start = first;
  range.l_len = length;
  return range;
}

// False when another process has the byte, unless the command, F_SETLKW64, waits for it.
bool SetLock(int command, short type, off64_t place) {
  struct flock64 range = Range(type, place, 1);
  const bool is_set = TEMP_FAILURE_RETRY(fcntl(TheDevice().queue.Get(), command, &range)) == 0;
  if (!is_set && errno != EACCES && errno != EAGAIN) {
    ThrowErrno("queue of jobs");
  }
  return is_set;
}

// A user can stop a worker of the user's own by SIGSTOP while it holds the byte. So nobody waits
// for the byte for long: without it, a job too many may come to run.
class Change {
 public:
  Change() {
    constexpr int kTries = 250;
    constexpr int kPauseMs = 2;
    for (int tries = 0; tries < kTries && !SetLock(F_SETLK64, F_WRLCK, kChange); ++tries) {
      poll(nullptr, 0, kPauseMs);
    }
  }
  ~Change() { SetLock(F_SETLK64, F_UNLCK, kChange); }
  Change(const Change&) = delete;
  Change& operator=(const Change&) = delete;
};

// The kernel names any one lock of a range: the parts before and behind it are then asked about.
void AddJobsOfOthers(off64_t first, off64_t last, std::vector<QueuedJob>& jobs) {
  if (first > last) {
    return;
  }
  // A length of 0 reaches to the end. Asked about a read lock, the kernel names write locks alone:
  // the places of jobs, not who waits for one.
  struct flock64 found = Range(F_RDLCK, first, last == kLastByte ? 0 : last - first + 1);
  if (fcntl(TheDevice().queue.Get(), F_GETLK64, &found) != 0) {
    ThrowErrno("queue of jobs");
  }
  if (found.l_type != F_UNLCK) {
    jobs.push_back(JobAt(found.l_start, found.l_pid));
    AddJobsOfOthers(first, found.l_start - 1, jobs);
    AddJobsOfOthers(found.l_start + found.l_len, last, jobs);
  }
}

std::vector<QueuedJob> JobsOfOthers() {
  std::vector<QueuedJob> jobs;
  AddJobsOfOthers(kChange + 1, kLastByte, jobs);
  return jobs;
}

bool IsIn(const QueuedJob& job, const std::vector<QueuedJob>& jobs) {
  return std::any_of(jobs.begin(), jobs.end(), [&](const QueuedJob& each) {
    return each.worker == job.worker && PlaceOf(each) == PlaceOf(job);
  });
}

void WaitForEndOfAny(const std::vector<QueuedJob>& jobs) {
  constexpr int kPauseMs = 50;  // where processes have no descriptors, under emulators
  int timeout = 3000;           // nobody tells when a signal has stopped one
  std::vector<FileDescriptor> processes;
  std::vector<pollfd> ends;
  for (const QueuedJob& job : jobs) {
    processes.emplace_back(static_cast<int>(syscall(SYS_pidfd_open, job.worker, 0)));
    ends.push_back({processes.back().Get(), POLLIN, 0});
    if (!processes.back()) {
      timeout = kPauseMs;
    }
  }
  // One that has ended meanwhile may have left its process id to another process.
  const std::vector<QueuedJob> living = JobsOfOthers();
  if (std::all_of(jobs.begin(), jobs.end(),
                  [&](const QueuedJob& job) { return IsIn(job, living); })) {
    poll(ends.data(), ends.size(), timeout);
  }
}

QueuedJob own_job;

// True when it is the own job's turn, which counts as running from now on. `jobs` becomes those
// there are.
bool TakeTurn(std::vector<QueuedJob>& jobs) {
  const Change change;
  jobs = JobsOfOthers();
  // A user who stops a worker by SIGSTOP must not keep its place from others.
  jobs.erase(
      std::remove_if(jobs.begin(), jobs.end(),
                     [](const QueuedJob& job) { return IsStopped(job.worker, job.is_running); }),
      jobs.end());
  jobs.push_back(own_job);
  if (!IsIn(own_job, NextToRun(jobs, TheDevice().config.jobs_at_once, MostJobs()))) {
    return false;
  }
  QueuedJob running = own_job;
  running.is_running = true;
  SetLock(F_SETLK64, F_WRLCK, PlaceOf(running));
  SetLock(F_SETLK64, F_UNLCK, PlaceOf(own_job));
  own_job = running;
  return true;
}

// Until something has changed that this job waits for. Of each user's waiting jobs the first alone
// waits for the running ones, every other for the one before it: to wake all whenever a job ends
// would cost too much.
void WaitForChange(const std::vector<QueuedJob>& jobs) {
  const QueuedJob* before = nullptr;  // the user's job that waits before this one
  std::vector<QueuedJob> ahead = NextToRun(jobs, TheDevice().config.jobs_at_once, MostJobs());
  for (const QueuedJob& job : jobs) {
    if (job.is_running) {
      ahead.push_back(job);
    } else if (job.user == own_job.user && job.ticket < own_job.ticket &&
               (before == nullptr || job.ticket > before->ticket)) {
      before = &job;
    }
  }
  if (before == nullptr) {
    WaitForEndOfAny(ahead);
  } else {
    SetLock(F_SETLKW64, F_RDLCK, PlaceOf(*before));
    SetLock(F_SETLK64, F_UNLCK, PlaceOf(*before));
  }
}

}  // namespace

std::multimap<std::size_t, QueuedJob> WaitingInOrder(std::vector<QueuedJob> jobs) {
  std::sort(jobs.begin(), jobs.end(), [](const QueuedJob& one, const QueuedJob& other) {
    return std::tuple(!one.is_running, one.ticket) < std::tuple(!other.is_running, other.ticket);
  });
  std::map<uid_t, std::size_t> counts;
  std::multimap<std::size_t, QueuedJob> waiting;
  for (const QueuedJob& job : jobs) {
    const std::size_t rank = counts[job.user]++;
    if (!job.is_running) {
      waiting.emplace(rank, job);
    }
  }
  return waiting;
}

std::vector<QueuedJob> NextToRun(const std::vector<QueuedJob>& jobs, std::size_t of_user,
                                 std::size_t of_device) {
  // A user who stops jobs and lets them go on has more of them at work, and no more places.
  std::map<uid_t, std::size_t> running;
  std::size_t at_work = 0;
  for (const QueuedJob& job : jobs) {
    if (job.is_running && ++running[job.user] <= of_user) {
      ++at_work;
    }
  }
  std::vector<QueuedJob> next;
  for (const auto& [rank, job] : WaitingInOrder(jobs)) {
    if (rank < of_user && at_work < of_device) {
      next.push_back(job);
      ++at_work;
    }
  }
  return next;
}

std::size_t MostJobs() {
  const Config& config = TheDevice().config;
  return std::min<std::size_t>(sysconf(_SC_NPROCESSORS_ONLN) + 1,
                               config.users.size() * config.jobs_at_once);
}

std::uint64_t MemoryOfJob() {
  const std::uint64_t granted = TheDevice().config.memory_for_jobs;
  return (granted != 0 ? granted : InstalledMemory() / 2) / MostJobs();
}

bool MayEnterQueue(uid_t user) {
  constexpr std::size_t kMostOfUser = 256;  // each is a process
  constexpr std::size_t kMostBytes = std::size_t{128} << 20U;
  const struct mallinfo2 heap = mallinfo2();
  const std::size_t own_bytes = heap.uordblks + heap.hblkhd;  // the worker keeps its request's
  const std::vector<QueuedJob> jobs = JobsOfOthers();
  const auto of_user = static_cast<std::size_t>(
      std::count_if(jobs.begin(), jobs.end(), [&](const auto& job) { return job.user == user; }));
  return of_user < std::min(kMostOfUser, kMostBytes / std::max<std::size_t>(own_bytes, 1));
}

void EnterQueue(uid_t user) {
  const Change change;
  std::uint32_t ticket = 0;
  for (const QueuedJob& job : JobsOfOthers()) {
    ticket = std::max(ticket, job.ticket);
  }
  own_job = {getpid(), user, ticket + 1, false};
  while (!SetLock(F_SETLK64, F_WRLCK, PlaceOf(own_job))) {
    ++own_job.ticket;
  }
}

void WaitForTurn() {
  std::vector<QueuedJob> jobs;
  while (!TakeTurn(jobs)) {
    malloc_trim(0);  // what the request has left, for as long as it may take
    WaitForChange(jobs);
  }
}

std::map<pid_t, std::size_t> WaitingWorkers() {
  std::map<pid_t, std::size_t> before;
  for (const auto& [rank, job] : WaitingInOrder(JobsOfOthers())) {
    before.emplace(job.worker, before.size());
  }
  return before;
}

}  // namespace Device
