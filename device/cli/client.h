// What the commands ask of a device in a user's name.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "device/cli/commands.h"
#include "device/host/launcher.h"

namespace Device {

// Opens the device. A user whom it does not have is refused. Throws std::runtime_error.
void OpenFor(const Target& target);

// Runs the body in a process that has the user's identity, and returns what it returns. What it
// throws is thrown here as Failure.
Json::Value AskAs(const std::string& user, const std::function<Json::Value()>& body);

// Why a task failed: "PATH: WORDS (CODE)" for each error, the last with the archiver's own reason.
std::vector<std::string> ErrorLines(const Json::Value& task);

// The requests that a client of the API makes.
class Client {
 public:
  // Opens the device and signs the user in. A follower waits for its task's end: its worker logs to
  // the same standard error, and the desktop is not told of the end.
  Client(const Target& target, bool is_follower);

  Outcome Ask(const std::string& method, const Json::Value& params);
  // Null when there is no such task.
  Json::Value Task(const std::string& id) const;

 private:
  const std::string user_;
  const bool is_follower_;
  std::string session_id_;
  std::unique_ptr<Launcher> launcher_;
};

}  // namespace Device
