// What the task manager's library offers beside its classes: waiting, saving, removing, killing.
#include <poll.h>
#include <syslog.h>

#include <algorithm>
#include <chrono>
#include <ctime>
#include <functional>
#include <set>

#include "device/bodies/device.h"
#include "device/bodies/json_text.h"
#include "device/bodies/operations.h"
#include "device/bodies/task_state.h"
#include "device/bodies/workers.h"

namespace Device {

namespace {

constexpr char kPropData[] = "data";
constexpr char kPropProgress[] = "progress";
constexpr char kDataErrors[] = "errors";
constexpr char kDataPid[] = "pid";
constexpr std::time_t kDeadKept = 3600;  // seconds
constexpr std::time_t kFinishedKept = 24 * kDeadKept;

// Reloads the task until it is as wanted. False after the time-out, or when the task was removed.
bool WaitForTask(Vesk::Task::State& task, int seconds, const std::function<bool()>& is_wanted) {
  constexpr int kFirstPauseMs = 1;
  constexpr int kLongestPauseMs = 50;
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(seconds);
  int pause = kFirstPauseMs;
  while (task.Reload()) {
    if (is_wanted()) {
      return true;
    }
    if (std::chrono::steady_clock::now() >= deadline) {
      return false;
    }
    poll(nullptr, 0, pause);
    pause = std::min(2 * pause, kLongestPauseMs);
  }
  return false;
}

bool HoldsErrors(const Json::Value& data) { return data.isObject() && data.isMember(kDataErrors); }

// The worker that the task's data names, -1 when it names none.
pid_t WorkerOf(const TaskRow& row) {
  const auto data = row.properties.find(kPropData);
  const bool has_pid =
      data != row.properties.end() && data->second.isObject() && data->second[kDataPid].isInt();
  return has_pid ? data->second[kDataPid].asInt() : -1;
}

// When a worker went is not known; its last word in the store counts.
bool IsStale(const std::string& user, const TaskRow& row) {
  const std::time_t age = std::time(nullptr) - row.updated;
  if (row.finished) {
    return age > kFinishedKept;
  }
  return age > kDeadKept && !IsWorkerAlive(user, WorkerOf(row));
}

void RemoveStaleTasks(const std::string& user) {
  // Read before the tasks: the worker of a task that is made meanwhile is not among them.
  const std::vector<pid_t> workers = StoreOf(user).AllWorkers();
  std::set<pid_t> named;
  for (const TaskRow& row : StoreOf(user).AllTasks()) {
    if (IsStale(user, row)) {
      StoreOf(user).RemoveTask(row.id);
    } else {
      named.insert(WorkerOf(row));
    }
  }
  ForgetEndedWorkers(user, workers, named);
}

}  // namespace
}  // namespace Device

using Device::Operation;

int SaveTaskData(Vesk::Task* task, Json::Value& data, float progress) {
  return Operation("SaveTaskData", task, data, progress).Run([&] {
    const Json::Value fraction = static_cast<double>(progress);
    return task->state->StoreNow({{Device::kPropData, &data}, {Device::kPropProgress, &fraction}},
                                 false)
               ? 1
               : 0;
  });
}

int WaitForTaskDataReady(Vesk::Task* task, const char* property, int seconds) {
  return Operation("WaitForTaskDataReady", task, property, seconds).Run([&] {
    const auto is_there = [&] { return !task->state->Get(property).isNull(); };
    return Device::WaitForTask(*task->state, seconds, is_there) ? 1 : 0;
  });
}

int WaitForTaskDataKeyReady(Vesk::Task* task, const char* property, const char* key, int seconds) {
  return Operation("WaitForTaskDataKeyReady", task, property, key, seconds).Run([&] {
    const auto is_there = [&] {
      const Json::Value value = task->state->Get(property);
      return value.isObject() && value.isMember(key);
    };
    return Device::WaitForTask(*task->state, seconds, is_there) ? 1 : 0;
  });
}

Json::Value LumoLibBkgTaskInfoCreate(const Json::Value& data, const std::string& kind) {
  return Operation("LumoLibBkgTaskInfoCreate", data, kind).Run([&] {
    Json::Value info(Json::objectValue);
    info["kind"] = kind;
    info["task"] = data["taskid"];
    info["title"] = data["params"]["dest_file_path"];
    info["started"] = static_cast<Json::Int64>(std::time(nullptr));
    return info;
  });
}

void LumoLibRemoveFinishedTask(Vesk::Task* task, int pid, bool reserved) {
  Operation("LumoLibRemoveFinishedTask", task, pid, reserved).Run([&] {
    Vesk::Task::State* const state = task == nullptr ? nullptr : task->state;
    try {
      // As the answer has it: of a worker that has ended since, the next one reports the end.
      if (state != nullptr &&
          (state->row.finished || Device::HoldsErrors(state->Get(Device::kPropData)))) {
        state->Remove();
      }
    } catch (const std::exception& error) {
      syslog(LOG_ERR, "remove finished task: %s", error.what());
    }
  });
}

void CleanTimeOutTasks(const char* user) {
  Operation("CleanTimeOutTasks", user).Run([&] {
    try {
      Device::RemoveStaleTasks(user);
    } catch (const std::exception& error) {
      syslog(LOG_ERR, "clean tasks: %s", error.what());
    }
  });
}

int DoKill(int pid) {
  return Operation("DoKill", pid).Run([&] {
    try {
      return Device::EndWorker(Device::TheDevice().current_user, pid) ? 1 : 0;
    } catch (const std::exception& error) {
      syslog(LOG_ERR, "kill worker: %s", error.what());
      return 0;
    }
  });
}
