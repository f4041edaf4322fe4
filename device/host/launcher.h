// The web API host: loads the module once and runs each request in a process of its own, so that
// one that crashes costs that request alone.
#pragma once

#include <json/json.h>

#include <chrono>
#include <memory>
#include <string>

namespace KAVO {
class APIRequest;
class APIResponse;
}  // namespace KAVO

namespace Device {

struct Request {
  std::string api;
  std::string method;
  int version = 0;
  Json::Value params{Json::objectValue};
  std::string user;
  std::string session_id;
  bool is_followed = false;  // the client watches the task to its end: no desktop notification
};

struct Outcome {
  int code = 0;
  Json::Value data;
};

// A row of a module's API table, as the host reads it: four machine words; a row of zeros ends it.
struct ApiRow {
  const char* api;
  std::intptr_t version;
  const char* method;
  void (*handler)(KAVO::APIRequest*, KAVO::APIResponse*);
};

class Launcher {
 public:
  // Loads the open device's module. The calling process becomes
  // the one that reaps the workers. Throws std::runtime_error that names the module and the reason.
  Launcher();

  // Runs one request to its outcome. A request that no row serves, that throws or that crashes has
  // an outcome too: an error code of the host's.
  Outcome Call(const Request& request);

  // Runs one request in this very process, which takes on the user's identity. What the handler
  // throws passes through.
  Outcome CallHere(const Request& request);

  // The same; what the handler throws becomes an error code of the host's.
  Outcome CallSafely(const Request& request);

  // Takes leave of workers that have ended. False when none has.
  static bool Reap();

  // The same, but waits for one, for `pause` at the most; a signal ends the waiting too.
  static void AwaitWorker(std::chrono::milliseconds pause);

  // For who asks about a task from time to time: `pause`, or, when the last answer took long, as
  // that of a large job does, 50 times as long as it took, up to 5 s.
  static std::chrono::milliseconds PauseBeforeAsking(std::chrono::milliseconds pause,
                                                     std::chrono::milliseconds answer_time);

 private:
  // Null, and the host's error code in `code`, when no row serves the request.
  const ApiRow* FindRow(const Request& request, int& code) const;

  std::unique_ptr<void, int (*)(void*)> module_;
  const ApiRow* table_ = nullptr;
};

}  // namespace Device
