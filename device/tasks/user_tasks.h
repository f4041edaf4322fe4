// A user's tasks as clients see them. To be used with the user's identity.
//
// What is shown to clients is read here, and here alone a worker's death is noticed: a task whose
// worker went without an outcome gets the one that it could not store, a single error item, the
// destination with the code of a general failure. Where the store has no room for it, the row has
// it alone.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "device/tasks/task_store.h"

namespace Device {

// Nothing when the user has no such task. Throws std::runtime_error, as the store does.
std::optional<TaskRow> ReadTask(const std::string& user, const std::string& id);

// Brings the rows, by id, up to date: new ones come, and those that are gone go. Throws
// std::runtime_error.
void ReadTasks(const std::string& user, std::map<std::string, TaskRow>& rows);

// All of the user's tasks, the one that changed last at the end. Throws std::runtime_error.
std::vector<TaskRow> AllTasks(const std::string& user);

// False for a moment, until "start" has stored what the task is about.
bool HasData(const TaskRow& row);

// The process that does or did it; -1 while there is none.
pid_t WorkerOf(const TaskRow& row);

// "taskid", "dest_file_path", "state" ("waiting", "running", "finished" or "failed"), "progress" (0
// to 1), "total_size" (bytes), "started" and, of one that has ended, "ended" (seconds since 1970).
// While it waits, "before": how many jobs come before it; while it runs, "file": what the archiver
// packs; when it has finished, "archive_size" (bytes); when it has failed, "errors" and "reason":
// what the archiver said, or that the job was killed. "file", "archive_size" and "reason" are there
// when they are known. No password. `waiting` is what WaitingWorkers says.
Json::Value TaskView(const TaskRow& row, const std::map<pid_t, std::size_t>& waiting);

// {"tasks": [views]} of all that have data, in the order of AllTasks. Throws std::runtime_error.
Json::Value TaskList(const std::string& user);

}  // namespace Device
