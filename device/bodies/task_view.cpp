#include "device/bodies/task_view.h"

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
  return pid < 0 || IsWorkerAlive(user, pid) || IsBeingStopped(user, pid) ? kTaskRunning
                                                                          : kTaskDead;
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

void EndDeadTasks(const std::string& user) {
  for (const TaskRow& seen : StoreOf(user).AllTasks()) {
    if (!IsDead(user, seen)) {
      continue;
    }
    // What the worker stored last counts: it may have ended between the two looks.
    std::optional<TaskRow> row = StoreOf(user).FindTask(seen.id);
    if (!row || !IsDead(user, *row)) {
      continue;
    }
    Json::Value data = DataOf(*row);
    Json::Value item(Json::objectValue);
    item["path"] = Destination(data);
    item["code"] = kErrArchive;
    data["errors"].append(item);
    StoreOf(user).UpdateTask(*row, {{kPropData, &data}}, true);
  }
}

}  // namespace Device
