// The queue of jobs: which workers run, and which wait until there is room.
//
// Of one user so many workers run as "jobs_at_once" in device.json says, of the device one more
// than it has processors. Of those that wait, that worker is next whose user has the fewest at
// work, and of several such the one that was started first. One that a signal has stopped does not
// count until it goes on.
//
// The queue is the set of locks that the workers hold on a file which stays empty; where a lock
// lies says whose it is. The kernel takes a lock back when its process ends, however that is, so
// nothing is left behind, and the launchers of one device have one queue.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <map>
#include <vector>

namespace Device {

struct QueuedJob {
  pid_t worker = -1;
  uid_t user = 0;
  std::uint32_t ticket = 0;  // grows in the order of start
  bool is_running = false;
};

// The jobs that wait, in the order in which they are to run when each running one takes as long as
// the others: by how many of their user's jobs go before them, or are at work.
std::multimap<std::size_t, QueuedJob> WaitingInOrder(std::vector<QueuedJob> jobs);

// The jobs that wait and for which there is room, in order, when so many of a user and of the
// device may run.
std::vector<QueuedJob> NextToRun(const std::vector<QueuedJob>& jobs, std::size_t of_user,
                                 std::size_t of_device);

// How many jobs run at most on the open device, and how many bytes of memory the 7z of each may
// take.
std::size_t MostJobs();
std::uint64_t MemoryOfJob();

// False when so many of the user's jobs wait or run that no further one may come: 256, fewer before
// one whose request takes more than half a MiB of memory, such as 21 before one of 6 MiB.
bool MayEnterQueue(uid_t user);

// To be called in this order, once in a worker's process: takes a place behind all others, and
// waits until the job may run. It then counts as running until the process ends. Both throw
// std::system_error.
void EnterQueue(uid_t user);
void WaitForTurn();

// For each waiting worker, how many jobs come before its own.
std::map<pid_t, std::size_t> WaitingWorkers();

}  // namespace Device
