#include "device/host/task_events.h"

#include <poll.h>

#include <algorithm>
#include <map>
#include <vector>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/host/sessions.h"
#include "device/tasks/job_queue.h"
#include "device/tasks/user_tasks.h"
#include "device/tasks/workers.h"

namespace Device {

namespace {

constexpr int kPauseMs = 200;

class Watcher {
 public:
  Watcher(int stream, std::string user)
      : stream_(stream), user_(std::move(user)), last_(StoreOf(user_).LastNotification()) {}

  // False when nobody reads any more.
  bool Look() {
    const std::int64_t version = StoreOf(user_).Version();
    std::vector<pid_t> workers = WorkersAtWork();
    auto waiting = WaitingWorkers();
    const bool is_new = version != version_ || workers != workers_ || waiting != waiting_;
    waiting_ = std::move(waiting);
    // All tasks are read only when there is something new: they can be large.
    if (is_new) {
      SendTasks();
      SendNotifications();
    }
    version_ = version;
    workers_ = std::move(workers);
    return is_read_;
  }

 private:
  // One that is being stopped counts until its task is gone: the request may have died.
  std::vector<pid_t> WorkersAtWork() const {
    std::vector<pid_t> workers = StoreOf(user_).AllWorkers();
    const auto has_gone = [this](pid_t pid) {
      return !IsWorkerAlive(user_, pid) && !IsBeingStopped(user_, pid);
    };
    workers.erase(std::remove_if(workers.begin(), workers.end(), has_gone), workers.end());
    return workers;
  }

  void Send(const char* event, const Json::Value& data) {
    const std::string text =
        std::string("event: ") + event + "\ndata: " + ToUtf8Text(data) + "\n\n";
    is_read_ = is_read_ && WriteFrame(stream_, text);
  }

  void SendTasks() {
    std::map<std::string, Json::Value> tasks;
    std::map<std::string, pid_t> workers;
    for (const auto& [id, row] : rows_) {
      workers[id] = WorkerOf(row);
    }
    ReadTasks(user_, rows_);
    for (const auto& [id, row] : rows_) {
      if (!HasData(row)) {
        continue;
      }
      const Json::Value view = TaskView(row, waiting_);
      tasks[id] = view;
      if (const auto known = tasks_.find(id); known == tasks_.end() || known->second != view) {
        Send("task", view);
      }
    }
    for (const auto& [id, task] : tasks_) {
      if (tasks.count(id) == 0) {
        Json::Value gone = JsonObject({{"taskid", id}});
        if (IsBeingStopped(user_, workers[id])) {
          gone["stopped"] = true;
        }
        Send("gone", gone);
      }
    }
    tasks_ = std::move(tasks);
  }

  void SendNotifications() {
    for (const auto& [number, view] : StoreOf(user_).NotificationsAfter(last_)) {
      Send("notification", view);
      last_ = number;
    }
  }

  int stream_;
  std::string user_;
  std::int64_t last_;           // notification that was sent
  std::int64_t version_ = -1;   // of the store, when it was looked at
  std::vector<pid_t> workers_;  // that were at work
  std::map<pid_t, std::size_t> waiting_;
  std::map<std::string, TaskRow> rows_;
  std::map<std::string, Json::Value> tasks_;  // as they were sent
  bool is_read_ = true;
};

}  // namespace

void SendTaskEvents(int stream, const std::string& user, const std::string& session_id) {
  Watcher watcher(stream, user);
  while (watcher.Look() && !UserOfSession(session_id).empty()) {
    // Nothing is ever sent here: it becomes readable when the other side is closed.
    pollfd other_side = {stream, POLLIN, 0};
    if (poll(&other_side, 1, kPauseMs) != 0) {
      return;
    }
  }
}

}  // namespace Device
