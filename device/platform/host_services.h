// What the libraries ask of the process's host, the launcher (device/host/launcher), which fills
// this in when it is made. Until then no session is taken for a living one.
#pragma once

#include <sys/types.h>

#include <functional>
#include <string>

#include "device/base/file_descriptor.h"

namespace Device {

struct HostServices {
  // True if the session is a living one of that user.
  std::function<bool(const std::string& session_id, const std::string& user)> has_session =
      [](const std::string&, const std::string&) { return false; };
  // Called in a worker's process when it has been forked: lets go of what belongs to the request.
  std::function<void()> leave_request = [] {};
  // The worker that this request has forked; 0: none.
  pid_t worker = 0;
  // Comes to its end when that worker has its place in the queue. The request's answer waits for
  // it: no job that is started later is to come before.
  FileDescriptor worker_entered;
  // The task that the process is about; empty: none.
  std::string task;
  // Whether the desktop is to be told of the end of the tasks that the process makes.
  bool notifies_desktop = true;
};

inline HostServices& TheHost() {
  static HostServices services;
  return services;
}

}  // namespace Device
