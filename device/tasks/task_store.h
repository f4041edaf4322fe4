// The store of one user's tasks, notifications, workers and index entries: an SQLite database in
// WAL mode in the user's own folder. Processes share it; a connection belongs to one process.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "device/tasks/database.h"
#include "device/tasks/stored_value.h"

namespace Device {

// Of a task, what the device itself looks at: a property, and members of it.
inline constexpr char kPropData[] = "data";
inline constexpr char kDataPid[] = "pid";
inline constexpr char kDataErrors[] = "errors";
inline constexpr char kDataParams[] = "params";  // large when there are many sources
inline constexpr std::int64_t kLargeMember = 65536;
// A property of the device's own: what the archiver has told, by member.
inline constexpr char kPropArchiver[] = "archiver";
inline constexpr char kArchiverFile[] = "file";          // that is packed
inline constexpr char kArchiverReason[] = "reason";      // why it failed
inline constexpr char kArchiverSize[] = "archive_size";  // bytes

// A task as the store had it at one moment.
struct TaskRow {
  std::string id;
  bool finished = false;
  std::int64_t updated = 0;  // seconds since 1970
  std::int64_t version = 0;  // grows with every change
  std::map<std::string, StoredValue> properties;

  // Null when it has none of that name.
  const StoredValue& Property(const std::string& name) const;
  // The job has failed, and why is stored.
  bool HasErrors() const { return Property(kPropData).HasMember(kDataErrors); }
};

// A worker process. By its start time, one that has taken over its process id is not mistaken for
// it.
struct WorkerRow {
  std::uint64_t start_time = 0;  // the kernel's ticks since boot
  std::int64_t stopped = 0;      // when "stop" asked it to end, in seconds since 1970; 0: never
  bool has_come_to_end = false;  // it has done all that a worker does
};

// What a worker is going to leave if it is killed.
struct LeftoversRow {
  std::int64_t number = 0;
  pid_t worker = -1;
  std::string list;         // path of the list file
  std::string folder;       // path of the folder in which the archive is made
  std::string work_folder;  // name of the hidden folder there
};

struct NotificationRow {
  std::string app;
  std::string task;
  std::string title;
  std::string message;
  std::vector<std::string> arguments;
};

// Every operation throws std::runtime_error, with the database's own reason, when it fails.
class TaskStore {
 public:
  // Opens the user's store, and makes it when it is not there yet.
  explicit TaskStore(const std::string& user);

  // A new task, with what is in the row.
  void AddTask(TaskRow& row);
  std::optional<TaskRow> FindTask(const std::string& id);
  // Brings the row up to date. Only what has changed is read, of a property that is an object only
  // the members that have. False when there is no such task any more.
  bool RefreshTask(TaskRow& row);
  // Brings all rows, by id, up to date: new ones come, and those that are gone go. As many tasks
  // would take too much memory, none gets kDataParams, and "null" is in place of members with more
  // than kLargeMember characters.
  void RefreshTasks(std::map<std::string, TaskRow>& rows);
  // Stores the properties and the finished state together, and brings the row up to date. Only what
  // differs from the store is written. False when there is no such task.
  bool UpdateTask(TaskRow& row, std::map<std::string, StoredValue> properties, bool finished);
  // Forgets its worker too, unless that was stopped: by that note a stopped task is told from one
  // that was dismissed.
  void RemoveTask(const std::string& id, pid_t worker = -1);

  void AddWorker(pid_t pid, std::uint64_t start_time);
  std::optional<WorkerRow> FindWorker(pid_t pid);
  // Notes that the worker is being stopped from now on.
  void NoteStop(pid_t pid);
  // Notes that the worker, if it is one, has come to its end.
  void NoteEnd(pid_t pid);
  std::vector<pid_t> AllWorkers();
  void RemoveWorker(pid_t pid);

  // Under a number of its own.
  void AddLeftovers(const LeftoversRow& row);
  std::vector<LeftoversRow> AllLeftovers();
  void RemoveLeftovers(std::int64_t number);

  void AddNotification(const NotificationRow& row);
  // The ones after that number, from 1 on in the order of sending: "time" (seconds since 1970),
  // "taskid", "title", "message" (a key), "arguments" (HTML-encoded).
  std::map<std::int64_t, Json::Value> NotificationsAfter(std::int64_t number);
  std::int64_t LastNotification();

  // A number that changes whenever another connection has changed the store.
  std::int64_t Version();

  void AddToIndex(const std::string& path);

 private:
  // Within a transaction.
  bool ReadChanges(TaskRow& row, bool with_large);
  void WriteProperty(TaskRow& row, const std::string& name, StoredValue value);
  void WriteMember(const TaskRow& row, const std::string& name, const std::string& member,
                   const std::string* text);
  void MarkIfSecret(const std::string& lost);

  Database database_;
};

// This process's connection to a user's store.
TaskStore& StoreOf(const std::string& user);
// Closes this process's connections. To be called before a fork: none may cross it.
void CloseStores();

}  // namespace Device
