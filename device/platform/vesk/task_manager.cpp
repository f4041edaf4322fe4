// Vesk::Task and Vesk::TaskMgr over the task store.
#include <syslog.h>

#include <cstdarg>
#include <map>
#include <memory>
#include <stdexcept>
#include <utility>

#include "device/base/random_id.h"
#include "device/base/try_or_log.h"
#include "device/platform/host_services.h"
#include "device/platform/klib/archive.h"
#include "device/platform/operations.h"
#include "device/platform/vesk/task_state.h"
#include "device/tasks/user_tasks.h"

using Device::Operation;

namespace Vesk {

struct TaskMgr::State {
  std::string user;
};

namespace {

constexpr int kTaskIdWords = 2;
constexpr char kPropNotify[] = "blMsg";

// How many arguments follow a message key; none follow others.
const std::map<std::string, std::size_t> kArgumentCounts = {
    {"filebrowser:filebrowser_compress_completed", 1},
    {"filebrowser:filebrowser_compress_failed", 2}};

// Says why the store cannot serve; the module may keep the exception to itself.
template <typename Body>
auto LogAndThrow(const char* operation, Body body) {
  try {
    return body();
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s: %s", operation, error.what());
    throw;
  }
}

}  // namespace

const Device::StoredValue& Task::State::Find(const std::string& name) const {
  const auto gathered = pending.find(name);
  return gathered == pending.end() ? row.Property(name) : gathered->second;
}

bool Task::State::Set(const std::string& name, Device::StoredValue value) {
  pending[name] = std::move(value);
  return is_updating || Store(false);
}

bool Task::State::Store(bool is_finished) {
  is_updating = false;
  return StoreNow(std::exchange(pending, {}), is_finished);
}

bool Task::State::StoreNow(std::map<std::string, Device::StoredValue> properties,
                           bool is_finished) {
  // For who watches the task: the module keeps no names of files and no reasons.
  if (const Json::Value& news = Device::TheArchiverNews(); !news.empty()) {
    properties[Device::kPropArchiver] = news;
  }
  bool is_stored = false;
  if (!Device::TryOrLog("store task", [&] {
        is_stored = Device::StoreOf(user).UpdateTask(row, std::move(properties), is_finished);
      })) {
    Forget();
  }
  return is_stored;
}

void Task::State::Forget() {
  try {
    if (std::optional<Device::TaskRow> stored = Device::StoreOf(user).FindTask(row.id)) {
      row = std::move(*stored);
    }
  } catch (const std::exception&) {
    row.version = 0;  // all of it is read as soon as it can be
  }
}

bool Task::State::Reload() {
  bool is_there = true;
  Device::TryOrLog("reload task", [&] { is_there = Device::StoreOf(user).RefreshTask(row); });
  if (!is_there) {
    row.properties.clear();
  }
  return is_there;
}

void Task::State::Remove() {
  Device::TryOrLog("remove task",
                   [&] { Device::StoreOf(user).RemoveTask(row.id, Device::WorkerOf(row)); });
}

Task::Task(const char* user, const char* task_id) : state(nullptr) {
  Operation("Vesk::Task::Task", user, task_id).Run([&] {
    auto task_state = std::make_unique<State>();
    task_state->user = user;
    task_state->row.id = Device::TheHost().task = task_id;
    // When nobody watches the task, the desktop is to be told of its end.
    task_state->row.properties[kPropNotify] = Json::Value(Device::TheHost().notifies_desktop);
    LogAndThrow("make task", [&] { Device::StoreOf(user).AddTask(task_state->row); });
    state = task_state.release();
  });
}

Task::Task(State* task_state) : state(task_state) {}

Task::~Task() { delete state; }

const char* Task::getTaskId() const {
  return Operation("Vesk::Task::getTaskId").Run([&] { return state->row.id.c_str(); });
}

void Task::beginUpdate() {
  Operation("Vesk::Task::beginUpdate").Run([&] { state->is_updating = true; });
}

bool Task::endUpdate() {
  return Operation("Vesk::Task::endUpdate").Run([&] { return state->Store(false); });
}

bool Task::setProperty(const char* name, const Json::Value& value) {
  return Operation("Vesk::Task::setProperty", name, value).Run([&] {
    return state->Set(name, value);
  });
}

Json::Value Task::getProperty(const char* name) const {
  return Operation("Vesk::Task::getProperty", name).Run([&] { return state->Find(name).Value(); });
}

bool Task::getBoolProperty(const char* name, bool fallback) const {
  return Operation("Vesk::Task::getBoolProperty", name, fallback).Run([&] {
    const Json::Value value = state->Find(name).Value();
    return value.isBool() ? value.asBool() : fallback;
  });
}

double Task::getDoubleProperty(const char* name, double fallback) const {
  return Operation("Vesk::Task::getDoubleProperty", name, fallback).Run([&] {
    const Json::Value value = state->Find(name).Value();
    return value.isNumeric() ? value.asDouble() : fallback;
  });
}

void Task::reload() {
  Operation("Vesk::Task::reload").Run([&] { state->Reload(); });
}

bool Task::finish(bool reserved) {
  return Operation("Vesk::Task::finish", reserved).Run([&] { return state->Store(true); });
}

bool Task::isFinished() const {
  return Operation("Vesk::Task::isFinished").Run([&] { return state->row.finished; });
}

void Task::remove() {
  Operation("Vesk::Task::remove").Run([&] { state->Remove(); });
}

void Task::sendNotifyMessageNoEncode(const char* app, const char* task_id, const char* title,
                                     const char* message, ...) {
  Device::NotificationRow row{app, task_id, title, message, {}};
  va_list arguments;
  va_start(arguments, message);
  const auto found = kArgumentCounts.find(message);
  for (std::size_t left = found == kArgumentCounts.end() ? 0 : found->second; left > 0; --left) {
    const char* const argument = va_arg(arguments, const char*);
    row.arguments.emplace_back(argument == nullptr ? "" : argument);
  }
  va_end(arguments);
  Operation("Vesk::Task::sendNotifyMessageNoEncode", app, task_id, title, message, row.arguments)
      .Run([&] {
        Device::TryOrLog("send notification",
                         [&] { Device::StoreOf(state->user).AddNotification(row); });
      });
}

TaskMgr::TaskMgr(const char* user) : state_(nullptr) {
  Operation("Vesk::TaskMgr::TaskMgr", user).Run([&] { state_ = new State{user}; });
}

TaskMgr::~TaskMgr() { delete state_; }

std::string TaskMgr::getUniqueTaskId(const char* prefix) {
  return Operation("Vesk::TaskMgr::getUniqueTaskId", prefix).Run([&] {
    return LogAndThrow("make task id", [&] {
      std::string id;
      do {
        id = prefix + Device::RandomId(kTaskIdWords);
      } while (Device::StoreOf(state_->user).FindTask(id));
      return id;
    });
  });
}

Task* TaskMgr::getTaskWithThrow(const char* task_id) {
  return Operation("Vesk::TaskMgr::getTaskWithThrow", task_id).Run([&] {
    std::optional<Device::TaskRow> row =
        LogAndThrow("find task", [&] { return Device::ReadTask(state_->user, task_id); });
    if (!row) {
      throw std::runtime_error("no task '" + std::string(task_id) + "'");
    }
    Device::TheHost().task = row->id;
    return new Task(new Task::State{state_->user, std::move(*row), false, {}});
  });
}

}  // namespace Vesk
