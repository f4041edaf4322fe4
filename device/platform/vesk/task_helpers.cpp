// What the task manager's library offers beside its classes: waiting, saving, removing, killing.
#include <malloc.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <ctime>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <thread>

#include "device/base/json_text.h"
#include "device/base/try_or_log.h"
#include "device/platform/lumo/identity.h"
#include "device/platform/operations.h"
#include "device/platform/vesk/task_state.h"
#include "device/tasks/leftovers.h"
#include "device/tasks/user_tasks.h"
#include "device/tasks/workers.h"

namespace Device {

namespace {

constexpr char kPropProgress[] = "progress";
constexpr std::time_t kDeadKept = 3600;  // seconds
constexpr std::time_t kFinishedKept = 24 * kDeadKept;

// Reloads the task until it is as wanted. False after the time-out, or when the task was removed.
bool WaitForTask(Vesk::Task::State& task, int seconds, const std::function<bool()>& is_wanted) {
  using Clock = std::chrono::steady_clock;
  constexpr Clock::duration kShortestPause = std::chrono::microseconds(200);
  constexpr Clock::duration kLongestPause = std::chrono::milliseconds(50);
  constexpr int kLate = 4;  // by a quarter of the time that it takes, at the most
  const Clock::time_point begin = Clock::now();
  while (task.Reload()) {
    if (is_wanted()) {
      return true;
    }
    const Clock::duration gone = Clock::now() - begin;
    if (gone >= std::chrono::seconds(seconds)) {
      return false;
    }
    std::this_thread::sleep_for(std::clamp(gone / kLate, kShortestPause, kLongestPause));
  }
  return false;
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
  std::map<std::string, TaskRow> rows;
  StoreOf(user).RefreshTasks(rows);
  for (const auto& [id, row] : rows) {
    if (IsStale(user, row)) {
      StoreOf(user).RemoveTask(id);
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
    std::map<std::string, Device::StoredValue> properties;
    properties.emplace(Device::kPropData, data);
    properties.emplace(Device::kPropProgress, Json::Value(static_cast<double>(progress)));
    const bool is_stored = task->state->StoreNow(std::move(properties), false);
    // The data of a job of many sources is large, and it may be long until the next progress.
    malloc_trim(0);
    return is_stored ? 1 : 0;
  });
}

int WaitForTaskDataReady(Vesk::Task* task, const char* property, int seconds) {
  return Operation("WaitForTaskDataReady", task, property, seconds).Run([&] {
    const auto is_there = [&] { return !task->state->Find(property).IsNull(); };
    return Device::WaitForTask(*task->state, seconds, is_there) ? 1 : 0;
  });
}

int WaitForTaskDataKeyReady(Vesk::Task* task, const char* property, const char* key, int seconds) {
  return Operation("WaitForTaskDataKeyReady", task, property, key, seconds).Run([&] {
    const auto is_there = [&] { return task->state->Find(property).HasMember(key); };
    return Device::WaitForTask(*task->state, seconds, is_there) ? 1 : 0;
  });
}

Json::Value LumoLibBkgTaskInfoCreate(const Json::Value& data, const std::string& kind) {
  return Operation("LumoLibBkgTaskInfoCreate", data, kind).Run([&] {
    return Device::JsonObject({{"kind", kind},
                               {"task", data["taskid"]},
                               {"title", data["params"]["dest_file_path"]},
                               {"started", Json::Int64{std::time(nullptr)}}});
  });
}

void LumoLibRemoveFinishedTask(Vesk::Task* task, int pid, bool reserved) {
  Operation("LumoLibRemoveFinishedTask", task, pid, reserved).Run([&] {
    Vesk::Task::State* const state = task == nullptr ? nullptr : task->state;
    // As the answer has it: of a worker that has ended since, the next one reports the end.
    if (state != nullptr && (state->row.finished || state->row.HasErrors())) {
      state->Remove();
    }
  });
}

void CleanTimeOutTasks(const char* user) {
  Operation("CleanTimeOutTasks", user).Run([&] {
    Device::TryOrLog("clean tasks", [&] {
      Device::RemoveStaleTasks(user);
      Device::StoreOf(user).NoteEnd(getpid());  // a worker's last call
    });
  });
}

int DoKill(int pid) {
  return Operation("DoKill", pid).Run([&] {
    bool is_gone = false;
    Device::TryOrLog("kill worker", [&] {
      is_gone = Device::EndWorker(Device::CurrentUser(), pid);
      Device::RemoveLeftovers(Device::CurrentUser());
    });
    return is_gone ? 1 : 0;
  });
}
