// The web API host: loads the module once and runs each request in a process forked from this one,
// the launcher, so that one that crashes costs that request alone.
#pragma once

#include <functional>
#include <memory>
#include <optional>

#include "device/base/file_descriptor.h"
#include "device/platform/kavo/request.h"
#include "platform/kavo/api_table.h"

namespace Device {

// Whether workers keep this process's standard error, which they may outlive.
enum class WorkerLog {
  kHere,       // they log there, like the launcher
  kSyslogOnly  // who reads standard error to its end would else wait for the workers
};

class Launcher {
 public:
  // Loads the open device's module and serves the libraries of this process as their host. The
  // process becomes the one that reaps the workers. Throws std::runtime_error that names the module
  // and the reason.
  explicit Launcher(WorkerLog worker_log = WorkerLog::kHere);
  ~Launcher();
  Launcher(const Launcher&) = delete;
  Launcher& operator=(const Launcher&) = delete;

  // Runs one request to its outcome. A request that no row serves, that throws or that crashes has
  // an outcome too: an error code of the host's.
  Outcome Call(const Request& request);

  // Runs one request in this very process, which takes on the user's identity. What the handler
  // throws passes through.
  Outcome CallHere(const Request& request);

  // The same; what the handler throws becomes an error code of the host's.
  Outcome CallSafely(const Request& request);

  // Where this request process writes its answer. No worker holds it, so that who reads there does
  // not wait for one.
  FileDescriptor& AnswerStream() { return answer_; }

  // Takes leave of workers that have ended.
  static void Reap();

 private:
  std::unique_ptr<void, int (*)(void*)> module_;
  const KAVO::ApiRow* table_ = nullptr;
  FileDescriptor answer_;
};

// What the body returns in a process of its own, where `stream` is the way back; nothing when that
// dies. Throws std::system_error.
std::optional<Json::Value> AskProcess(FileDescriptor& stream,
                                      const std::function<Json::Value()>& body);

// Removes what killed jobs have left, each user's with that user's identity.
void RemoveLeftoversOfAll();

}  // namespace Device
