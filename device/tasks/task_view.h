// What the task store has, as a client of the device sees it. To be used with the user's identity.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

#include "device/tasks/task_store.h"

namespace Device {

// States of a task, beside "finished" and "failed".
inline constexpr char kTaskRunning[] = "running";
inline constexpr char kTaskDead[] = "dead";  // the worker went without an outcome

// False for a moment, until "start" has stored what the task is about.
bool HasData(const TaskRow& row);

// "taskid", "dest_file_path", "state", "progress" (0 to 1), "total_size" (bytes), "started"
// (seconds since 1970) and, of a failed one, "errors". No password.
Json::Value TaskView(const std::string& user, const TaskRow& row);

// Gives a task whose worker went without an outcome the one that it could not store: one error
// item, the destination with the code of a failed archive. Where the store has no room for it, the
// row has it alone. False when the task was removed meanwhile.
bool EndIfDead(const std::string& user, TaskRow& row);

// All tasks of the user's, none of them dead.
std::vector<TaskRow> EndDeadTasks(const std::string& user);

}  // namespace Device
