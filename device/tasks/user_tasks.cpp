#include "device/tasks/user_tasks.h"

#include <algorithm>
#include <cmath>
#include <iterator>
#include <utility>

#include "device/base/json_text.h"
#include "device/base/try_or_log.h"
#include "device/model/device.h"
#include "device/tasks/job_queue.h"
#include "device/tasks/workers.h"
#include "platform/kavo/error_codes.h"

namespace Device {

namespace {

bool HasLostWorker(const std::string& user, const TaskRow& row) {
  return !row.finished && !row.HasErrors() && HasDied(user, WorkerOf(row));
}

// What the task manager noted when the task was made.
Json::Value InfoOf(const TaskRow& row) {
  const Json::Value info = row.Property(kPropData).Member(row.id);
  return info.isObject() ? info : Json::Value(Json::objectValue);
}

// As the task manager noted it: the request's parameters, which have it too, can be large.
Json::Value Destination(const TaskRow& row) {
  const Json::Value title = InfoOf(row)["title"];
  return title.isString() ? title : Json::Value("");
}

// The module stores a fraction of 32 bits, such as 0.28999999; meant are hundredths.
double Progress(const TaskRow& row) {
  constexpr double kSteps = 100;
  const Json::Value progress = row.Property("progress").Value();
  return progress.isNumeric() ? std::round(progress.asDouble() * kSteps) / kSteps : 0;
}

Json::Value GeneralError(const TaskRow& row) {
  Json::Value errors(Json::arrayValue);
  errors.append(JsonObject({{"path", Destination(row)}, {"code", KAVO::kErrGeneral}}));
  return errors;
}

// Full paths in a text of the module's or the archiver's, as users write them.
std::string WithUserPaths(std::string text) {
  std::map<std::string, std::string> user_paths;
  for (const Share& share : TheDevice().config.shares) {
    user_paths[TheDevice().SharePath(share)] = "/" + share.name;
  }
  for (const User& user : TheDevice().config.users) {
    user_paths[TheDevice().HomePath(user)] = std::string("/") + kHomeShare;
  }
  for (const auto& [folder, path] : user_paths) {
    for (std::size_t at = text.find(folder); at != std::string::npos;
         at = text.find(folder, at + 1)) {
      const char next = text.c_str()[at + folder.size()];
      if (next == '/' || next == '\'' || next == 0) {
        text.replace(at, folder.size(), path);
      }
    }
  }
  return text;
}

void StoreFailure(const std::string& user, TaskRow& row) {
  // A row of a list lacks "params"; what it has not read stays as it is.
  StoredValue data = row.Property(kPropData);
  data.members[kDataErrors] = ToText(GeneralError(row));
  const std::int64_t version = row.version;
  const bool is_tried = TryOrLog("end of a killed worker", [&] {
    const Json::Value news = JsonObject({{kArchiverReason, "the job was killed"}});
    StoreOf(user).UpdateTask(row, {{kPropData, data}, {kPropArchiver, news}}, true);
  });
  if (!is_tried) {
    row.properties[kPropData] = std::move(data);
    row.finished = true;
    row.version = version;
  }
}

// False when the task was removed meanwhile.
bool EndIfWorkerIsLost(const std::string& user, TaskRow& row) {
  if (!HasLostWorker(user, row)) {
    return true;
  }
  // What the worker stored last counts: it may have ended between the two looks.
  if (!StoreOf(user).RefreshTask(row)) {
    return false;
  }
  if (HasLostWorker(user, row)) {
    StoreFailure(user, row);
  }
  return true;
}

}  // namespace

std::optional<TaskRow> ReadTask(const std::string& user, const std::string& id) {
  std::optional<TaskRow> row = StoreOf(user).FindTask(id);
  return row && EndIfWorkerIsLost(user, *row) ? std::move(row) : std::nullopt;
}

void ReadTasks(const std::string& user, std::map<std::string, TaskRow>& rows) {
  StoreOf(user).RefreshTasks(rows);
  for (auto row = rows.begin(); row != rows.end();) {
    row = EndIfWorkerIsLost(user, row->second) ? std::next(row) : rows.erase(row);
  }
}

std::vector<TaskRow> AllTasks(const std::string& user) {
  std::map<std::string, TaskRow> rows;
  ReadTasks(user, rows);
  std::vector<TaskRow> all;
  all.reserve(rows.size());
  for (auto& [id, row] : rows) {
    all.push_back(std::move(row));
  }
  std::stable_sort(all.begin(), all.end(), [](const TaskRow& one, const TaskRow& other) {
    return one.updated < other.updated;
  });
  return all;
}

pid_t WorkerOf(const TaskRow& row) {
  const Json::Value pid = row.Property(kPropData).Member(kDataPid);
  return pid.isInt() ? pid.asInt() : -1;
}

bool HasData(const TaskRow& row) { return row.Property(kPropData).IsObject(); }

Json::Value TaskView(const TaskRow& row, const std::map<pid_t, std::size_t>& waiting) {
  const StoredValue& data = row.Property(kPropData);
  const StoredValue& archiver = row.Property(kPropArchiver);
  const Json::Value total_size = data.Member("total_size");
  Json::Value view = JsonObject({{"taskid", row.id},
                                 {"dest_file_path", Destination(row)},
                                 {"progress", Progress(row)},
                                 {"total_size", total_size.isNull() ? Json::Value(0U) : total_size},
                                 {"started", InfoOf(row).get("started", 0)}});
  const auto add_if_known = [&](const char* name) {
    if (archiver.HasMember(name)) {
      view[name] = archiver.Member(name);
    }
  };
  const auto waits = waiting.find(WorkerOf(row));
  if (row.HasErrors()) {
    view["state"] = "failed";
    const bool is_listed = data.members.at(kDataErrors).size() <= kLargeMember;
    const Json::Value errors = is_listed ? data.Member(kDataErrors) : Json::Value();
    view[kDataErrors] = errors.isArray() ? errors : GeneralError(row);
    for (Json::Value& item : view[kDataErrors]) {
      item["path"] = WithUserPaths(item["path"].asString());
    }
    if (archiver.HasMember(kArchiverReason)) {
      view[kArchiverReason] = WithUserPaths(archiver.Member(kArchiverReason).asString());
    }
  } else if (row.finished) {
    view["state"] = "finished";
    add_if_known(kArchiverSize);
  } else if (waits != waiting.end()) {
    view["state"] = "waiting";
    view["before"] = Json::UInt64{waits->second};
  } else {
    view["state"] = "running";
    add_if_known(kArchiverFile);
  }
  if (row.finished) {
    view["ended"] = Json::Int64{row.updated};
  }
  return view;
}

Json::Value TaskList(const std::string& user) {
  Json::Value tasks(Json::arrayValue);
  const auto waiting = WaitingWorkers();
  for (const TaskRow& row : AllTasks(user)) {
    if (HasData(row)) {
      tasks.append(TaskView(row, waiting));
    }
  }
  return JsonObject({{"tasks", tasks}});
}

}  // namespace Device
