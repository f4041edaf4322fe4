// "tasks" and "notifications": what the device keeps for a user, read under that user's identity.
#include <sys/wait.h>

#include <cmath>
#include <ctime>
#include <functional>
#include <iostream>
#include <stdexcept>

#include "device/base/child_process.h"
#include "device/cli/commands.h"
#include "device/cli/output.h"
#include "device/model/device.h"
#include "device/tasks/job_queue.h"
#include "device/tasks/task_store.h"
#include "device/tasks/user_tasks.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

// Runs the body in a process that has the user's identity.
int RunAs(const std::string& user, const std::function<void()>& body) {
  if (TheDevice().config.FindUser(user) == nullptr) {
    throw std::runtime_error("no user '" + user + "'");
  }
  const int status = ChildProcess::Run([&] {
                       if (LumoLibUGIDSet(nullptr, user.c_str()) < 0) {
                         throw std::runtime_error("cannot take on the identity of '" + user + "'");
                       }
                       body();
                       CloseStores();
                       return FinishOutput() ? kExitDone : kExitFailed;
                     }).Wait();
  return WIFEXITED(status) ? WEXITSTATUS(status) : kExitFailed;
}

void PrintTask(const TaskRow& row, const std::map<pid_t, std::size_t>& waiting) {
  const Json::Value task = TaskView(row, waiting);
  std::cout << row.id << '\t' << task["state"].asString() << '\t'
            << std::lround(task["progress"].asDouble() * 100) << " %\t"
            << task["dest_file_path"].asString() << '\n';
}

std::string TimeText(std::time_t time) {
  std::tm local{};
  char text[sizeof "2000-01-01 00:00:00"];
  localtime_r(&time, &local);
  std::strftime(text, sizeof text, "%F %T", &local);
  return text;
}

}  // namespace

int TasksCommand(const std::string& folder, const std::string& user) {
  Open(folder);
  return RunAs(user, [&] {
    const auto waiting = WaitingWorkers();
    for (const TaskRow& row : AllTasks(user)) {
      PrintTask(row, waiting);
    }
  });
}

int NotificationsCommand(const std::string& folder, const std::string& user) {
  Open(folder);
  return RunAs(user, [&] {
    for (const NotificationRow& row : StoreOf(user).NotificationsAfter(0)) {
      std::cout << TimeText(row.time) << '\t' << row.task << '\t' << row.message;
      for (const std::string& argument : row.arguments) {
        std::cout << '\t' << argument;
      }
      std::cout << '\n';
    }
  });
}

}  // namespace Device
