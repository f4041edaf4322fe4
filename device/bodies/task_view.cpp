#include "device/bodies/task_view.h"

#include <syslog.h>

#include <stdexcept>
#include <utility>

#include "device/bodies/errors.h"
#include "device/bodies/workers.h"

namespace Device {

namespace {

constexpr char kPropData[] = "data";

const Json::Value& Property(const TaskRow& row, const std::string& name) {
  const auto found = row.properties.find(name);
  return found == row.properties.end() ? Json::Value::nullSingleton() : found->second;
}

// The task's data; an empty object as long as there is none.
const Json::Value& DataOf(const TaskRow& row) {
  static const Json::Value kNone(Json::objectValue);
  const Json::Value& data = Property(row, kPropData);
  return data.isObject() ? data : kNone;
}

std::string StateOf(const std::string& user, const TaskRow& row, const Json::Value& data) {
  if (data.isMember("errors")) {
    return "failed";
  }
  if (row.finished) {
    return "finished";
  }
  const pid_t pid = data["pid"].isInt() ? data["pid"].asInt() : -1;
  const bool has_worker = pid >= 0 && StoreOf(user).FindWorker(pid);
  return has_worker && !IsWorkerAlive(user, pid) && !IsBeingStopped(user, pid) ? kTaskDead
                                                                               : kTaskRunning;
}

Json::Value Destination(const Json::Value& data) {
  const Json::Value& params = data["params"];
  const Json::Value dest = params.isObject() ? params["dest_file_path"] : Json::Value();
  return dest.isString() ? dest : Json::Value("");
}

bool IsDead(const std::string& user, const TaskRow& row) {
  return StateOf(user, row, DataOf(row)) == kTaskDead;
}

}  // namespace

bool HasData(const TaskRow& row) { return Property(row, kPropData).isObject(); }

Json::Value TaskView(const std::string& user, const TaskRow& row) {
  const Json::Value& data = DataOf(row);
  const Json::Value& progress = Property(row, "progress");
  const Json::Value& info = data[row.id];
  Json::Value view(Json::objectValue);
  view["taskid"] = row.id;
  view["dest_file_path"] = Destination(data);
  view["state"] = StateOf(user, row, data);
  view["progress"] = progress.isNumeric() ? progress.asDouble() : 0.0;
  view["total_size"] = data.get("total_size", 0U);
  view["started"] = info.isObject() ? info.get("started", 0) : Json::Value(0);
  if (data.isMember("errors")) {
    view["errors"] = data["errors"];
  }
  return view;
}

bool EndIfDead(const std::string& user, TaskRow& row) {
  if (!IsDead(user, row)) {
    return true;
  }
  // What the worker stored last counts: it may have ended between the two looks.
  if (!StoreOf(user).RefreshTask(row)) {
    return false;
  }
  if (!IsDead(user, row)) {
    return true;
  }
  const std::int64_t version = row.version;
  Json::Value data = DataOf(row);
  Json::Value item(Json::objectValue);
  item["path"] = Destination(data);
  item["code"] = kErrArchive;
  data["errors"].append(item);
  try {
    StoreOf(user).UpdateTask(row, {{kPropData, &data}}, true);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "end of a killed worker: %s", error.what());
    row.properties[kPropData] = data;
    row.finished = true;
    row.version = version;
  }
  return true;
}

std::vector<TaskRow> EndDeadTasks(const std::string& user) {
  std::vector<TaskRow> rows;
  for (TaskRow& row : StoreOf(user).AllTasks()) {
    if (EndIfDead(user, row)) {
      rows.push_back(std::move(row));
    }
  }
  return rows;
}

}  // namespace Device
