#include "device/cli/client.h"

#include <iostream>
#include <optional>
#include <stdexcept>

#include "device/base/json_text.h"
#include "device/cli/output.h"
#include "device/host/sessions.h"
#include "device/model/device.h"
#include "device/platform/lumo/errors.h"
#include "device/platform/lumo/identity.h"
#include "device/tasks/job_queue.h"
#include "device/tasks/user_tasks.h"

namespace Device {

void OpenFor(const Target& target) {
  Open(target.folder);
  if (!TheDevice().switches_identity && !target.is_quiet) {
    std::cerr << "kavo-device: not root: every user of the device is you\n";
  }
  if (!target.user.empty() && TheDevice().config.FindUser(target.user) == nullptr) {
    throw std::runtime_error("no user '" + target.user + "'");
  }
}

Json::Value AskAs(const std::string& user, const std::function<Json::Value()>& body) {
  FileDescriptor stream;
  const std::optional<Json::Value> answer = AskProcess(stream, [&] {
    try {
      if (SwitchTo(nullptr, user.c_str()) < 0) {
        throw std::runtime_error("cannot take on the identity of '" + user + "'");
      }
      return JsonObject({{"result", body()}});
    } catch (const std::exception& error) {
      return JsonObject({{"failure", error.what()}});
    }
  });
  if (!answer || answer->isMember("failure")) {
    throw Failure(answer ? (*answer)["failure"].asString() : "a process has died");
  }
  return (*answer)["result"];
}

std::vector<std::string> ErrorLines(const Json::Value& task) {
  std::vector<std::string> lines;
  for (const Json::Value& item : task[kDataErrors]) {
    const std::string path = item["path"].asString();
    lines.push_back((path.empty() ? task["dest_file_path"].asString() : path) + ": " +
                    ErrorText(item["code"].asInt()) + " (" + item["code"].asString() + ")");
  }
  if (lines.empty() && task["state"] == "failed") {
    lines.push_back(task["dest_file_path"].asString() + ": failed without a reason");
  }
  if (task.isMember("reason") && !lines.empty()) {
    lines.back() += ": " + task["reason"].asString();
  }
  return lines;
}

Client::Client(const Target& target, bool is_follower)
    : user_(target.user), is_follower_(is_follower) {
  OpenFor(target);
  session_id_ = SignIn(user_);
  launcher_ = std::make_unique<Launcher>(is_follower ? WorkerLog::kHere : WorkerLog::kSyslogOnly);
}

Outcome Client::Ask(const std::string& method, const Json::Value& params) {
  constexpr int kApiVersion = 3;
  return launcher_->Call(
      {"KAVO.Zantro.Compress", method, kApiVersion, params, user_, session_id_, is_follower_});
}

Json::Value Client::Task(const std::string& id) const {
  return AskAs(user_, [&] {
    const std::optional<TaskRow> row = ReadTask(user_, id);
    return row ? TaskView(*row, WaitingWorkers()) : Json::Value();
  });
}

}  // namespace Device
