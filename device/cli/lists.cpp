// What there is for a user: tasks, one or all, a folder, notifications.
#include <algorithm>
#include <cmath>
#include <ctime>
#include <iostream>

#include "device/base/json_text.h"
#include "device/cli/client.h"
#include "device/cli/commands.h"
#include "device/cli/output.h"
#include "device/host/task_events.h"
#include "device/host/user_files.h"
#include "device/platform/lumo/errors.h"
#include "device/tasks/user_tasks.h"

namespace Device {

namespace {

void PrintTask(const Json::Value& task) {
  std::cout << task["taskid"].asString() << '\t' << StateText(task) << '\t'
            << std::lround(task["progress"].asDouble() * 100) << " %\t"
            << Shown(task["dest_file_path"].asString());
  const char* separator = "\t";
  for (const std::string& line : ErrorLines(task)) {
    std::cout << separator << Shown(line);
    separator = "; ";
  }
  std::cout << '\n';
}

void PrintEntry(const Json::Value& entry) {
  std::cout << Shown(entry["name"].asString()) << (entry["kind"] == "folder" ? "/" : "") << '\n';
}

void PrintNotification(const Json::Value& view) {
  const std::time_t time = view["time"].asInt64();
  char text[sizeof "2000-01-01 00:00:00"];
  std::strftime(text, sizeof text, "%F %T", std::localtime(&time));
  std::cout << text << '\t' << view["taskid"].asString() << '\t' << view["message"].asString();
  for (const Json::Value& argument : view["arguments"]) {
    std::cout << '\t' << Shown(argument.asString());
  }
  std::cout << '\n';
}

// `body` returns an object whose array `items` is to be printed, when not as JSON.
int PrintList(const Target& target, const char* items, void (*print)(const Json::Value&),
              const std::function<Json::Value()>& body) {
  OpenFor(target);
  const Json::Value list = AskAs(target.user, body);
  if (target.is_json) {
    PrintJson(list);
  } else {
    std::for_each(list[items].begin(), list[items].end(), print);
  }
  return kExitDone;
}

}  // namespace

int TasksCommand(const Target& target) {
  return PrintList(target, "tasks", PrintTask, [&] { return TaskList(target.user); });
}

int LsCommand(const Target& target, const std::string& folder) {
  return PrintList(target, "entries", PrintEntry, [&] {
    try {
      return ParseJson(DecodeByteEscapes(ListFolder(target.user, folder)));
    } catch (const Refused& refused) {
      throw Failure(folder + ": " + refused.what());
    }
  });
}

int NotificationsCommand(const Target& target) {
  return PrintList(target, "notifications", PrintNotification, [&] {
    Json::Value list = JsonObject({{"notifications", Json::arrayValue}});
    for (const auto& [number, view] : StoreOf(target.user).NotificationsAfter(0)) {
      list["notifications"].append(view);
    }
    return list;
  });
}

int TaskCommand(const Target& target, const std::string& command,
                const std::vector<std::string>& ids) {
  Client client(target, false);
  int status = kExitDone;
  for (const std::string& id : ids) {
    const Json::Value task = client.Task(id);
    const bool has_ended = task["state"] == "finished" || task["state"] == "failed";
    Json::Value result = command == "status" ? task : JsonObject({{"taskid", id}});
    std::string error = task.isNull() ? "no such task" : "";
    if (command == "dismiss" && !task.isNull() && !has_ended) {
      error = "the job has not ended; \"stop\" ends it";
    } else if (error.empty() && command != "status") {
      // A "status" that reports the end of a task takes it off the list.
      const std::string method = command == "stop" ? "stop" : "status";
      const int code = client.Ask(method, JsonObject({{"taskid", id}})).code;
      error = code == 0 ? "" : ErrorText(code);
    }
    if (!error.empty()) {
      PrintError(id + ": " + error);
      result = JsonObject({{"taskid", id}, {"error", error}});
      status = kExitFailed;
    }
    if (target.is_json) {
      PrintJson(result);
    } else if (error.empty() && command == "status") {
      PrintTask(task);
    }
  }
  return status;
}

}  // namespace Device
