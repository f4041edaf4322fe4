// A child process, from its start to its end.
#pragma once

#include <sys/types.h>

#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "device/base/fence.h"

namespace Device {

// How a program is to run. The descriptors are the caller's and stay open there; no others but the
// standard streams are open in the program.
struct ProgramStart {
  std::string program;                   // path
  std::vector<std::string> arguments;    // with the program's name in front
  std::vector<std::string> environment;  // "NAME=VALUE", beside the caller's PATH, TZ and KAVO_...
  int folder = -1;                       // working directory; -1: the caller's
  int input = -1;                        // standard input; -1: /dev/null
  int output = -1;                       // standard output; -1: the caller's
  int errors = -1;                       // standard error; -1: /dev/null
  std::vector<int> kept;                 // further descriptors, open there under their numbers
  bool ends_with_caller = false;         // killed when the calling process ends, however that is
  const Fence* fence = nullptr;          // confines it; null: it may what the caller may
};

// Owns a child: one that was not waited for is killed and reaped.
class ChildProcess {
 public:
  // Starts a program in the caller's process group, with the default action for each signal and
  // none held back. Throws std::system_error with the reason when it cannot run.
  static ChildProcess Start(const ProgramStart& start);
  // Forks a process that runs the body and leaves with its result, or with 1 when the body throws;
  // the reason is logged. Throws std::system_error.
  static ChildProcess Run(const std::function<int()>& body);
  // Forks, and goes on in both processes: in the child the object owns nothing and Pid() is 0.
  // Throws std::system_error.
  static ChildProcess Fork();

  ~ChildProcess();
  ChildProcess(ChildProcess&& other) noexcept : pid_(other.Release()) {}
  ChildProcess& operator=(ChildProcess&& other) noexcept {
    std::swap(pid_, other.pid_);
    return *this;
  }

  pid_t Pid() const { return pid_; }
  // Waits for the end and returns the wait status, -1 when somebody else has reaped the process.
  int Wait();
  // Leaves the process to whoever reaps it by its id.
  pid_t Release() { return std::exchange(pid_, 0); }

 private:
  explicit ChildProcess(pid_t pid) : pid_(pid) {}

  pid_t pid_;
};

}  // namespace Device
