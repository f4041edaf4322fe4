#include "device/tasks/task_view.h"

#include <syslog.h>

#include <stdexcept>
#include <utility>

#include "device/base/json_text.h"
#include "device/platform/lumo/errors.h"
#include "device/tasks/workers.h"

namespace Device {

namespace {

const StoredValue& Property(const TaskRow& row, const std::string& name) {
  static const StoredValue kNone;
  const auto found = row.properties.find(name);
  return found == row.properties.end() ? kNone : found->second;
}

std::string StateOf(const std::string& user, const TaskRow& row) {
  const StoredValue& data = Property(row, kPropData);
  if (data.HasMember(kDataErrors)) {
    return "failed";
  }
  if (row.finished) {
    return "finished";
  }
  const Json::Value pid = data.Member(kDataPid);
  return pid.isInt() && HasDied(user, pid.asInt()) ? kTaskDead : kTaskRunning;
}

// What the task manager noted when the task was made.
Json::Value InfoOf(const TaskRow& row) {
  const Json::Value info = Property(row, kPropData).Member(row.id);
  return info.isObject() ? info : Json::Value(Json::objectValue);
}

// The task manager's note has it too, and is small; the request's parameters can be large.
Json::Value Destination(const TaskRow& row) {
  Json::Value title = InfoOf(row)["title"];
  if (title.isString()) {
    return title;
  }
  const Json::Value params = Property(row, kPropData).Member("params");
  const Json::Value dest = params.isObject() ? params["dest_file_path"] : Json::Value();
  return dest.isString() ? dest : Json::Value("");
}

bool IsDead(const std::string& user, const TaskRow& row) { return StateOf(user, row) == kTaskDead; }

// In the row alone when the store has no room.
void StoreFailure(const std::string& user, TaskRow& row) {
  Json::Value item(Json::objectValue);
  item["path"] = Destination(row);
  item["code"] = kErrArchive;
  Json::Value errors(Json::arrayValue);
  errors.append(item);
  StoredValue data = Property(row, kPropData);
  data.members[kDataErrors] = ToText(errors);
  const std::int64_t version = row.version;
  try {
    StoreOf(user).UpdateTask(row, {{kPropData, data}}, true);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "end of a killed worker: %s", error.what());
    row.properties[kPropData] = std::move(data);
    row.finished = true;
    row.version = version;
  }
}

}  // namespace

bool HasData(const TaskRow& row) { return Property(row, kPropData).IsObject(); }

Json::Value TaskView(const std::string& user, const TaskRow& row) {
  const StoredValue& data = Property(row, kPropData);
  const Json::Value progress = Property(row, "progress").Value();
  const Json::Value total_size = data.Member("total_size");
  Json::Value view(Json::objectValue);
  view["taskid"] = row.id;
  view["dest_file_path"] = Destination(row);
  view["state"] = StateOf(user, row);
  view["progress"] = progress.isNumeric() ? progress.asDouble() : 0.0;
  view["total_size"] = total_size.isNull() ? Json::Value(0U) : total_size;
  view["started"] = InfoOf(row).get("started", 0);
  if (data.HasMember(kDataErrors)) {
    view[kDataErrors] = data.Member(kDataErrors);
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
  if (IsDead(user, row)) {
    StoreFailure(user, row);
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
