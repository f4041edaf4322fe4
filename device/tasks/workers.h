// Worker processes of a user: known by process id and start time, so that one that has taken over a
// process id is never taken for a worker.
#pragma once

#include <sys/types.h>

#include <set>
#include <string>
#include <vector>

namespace Device {

// Enters a process that has just been forked. Throws std::runtime_error.
void RegisterWorker(const std::string& user, pid_t pid);

// True if a signal has stopped the worker, or a process of its group, which takes longer to find
// out. It goes on when another one comes.
bool IsStopped(pid_t pid, bool with_group = false);

// True if the process is a worker of the user's and has not ended; a zombie has.
bool IsWorkerAlive(const std::string& user, pid_t pid);

// True for 30 s after "stop" has begun to end the worker: its task is going to be removed, or has
// been.
bool IsBeingStopped(const std::string& user, pid_t pid);

// True of a worker that is gone without having done all that a worker does, unless "stop" is ending
// it: it has stored no outcome and never will.
bool HasDied(const std::string& user, pid_t pid);

// Ends a worker of the user's and all that runs in its process group: asks first, and insists after
// a grace of 5 s. True when they are gone, also when they were before; false when the process was
// never registered as this user's worker, or could not be ended.
bool EndWorker(const std::string& user, pid_t pid);

// Forgets those of the workers that have ended, but those to be kept and those being stopped.
void ForgetEndedWorkers(const std::string& user, const std::vector<pid_t>& workers,
                        const std::set<pid_t>& kept);

}  // namespace Device
