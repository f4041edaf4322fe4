// The store's small tables: workers, what they leave behind, notifications.
#include <ctime>

#include "device/base/json_text.h"
#include "device/tasks/task_store.h"

namespace Device {

using Statement = Database::Statement;

void TaskStore::AddWorker(pid_t pid, std::uint64_t start_time) {
  Statement(database_, "INSERT OR REPLACE INTO workers VALUES (?, ?, 0, 0)")
      .Bind(std::int64_t{pid})
      .Bind(static_cast<std::int64_t>(start_time))
      .Step();
}

std::optional<WorkerRow> TaskStore::FindWorker(pid_t pid) {
  Statement select(database_, "SELECT start_time, stopped, ended FROM workers WHERE pid = ?");
  if (!select.Bind(std::int64_t{pid}).Step()) {
    return std::nullopt;
  }
  return WorkerRow{static_cast<std::uint64_t>(select.Number(0)), select.Number(1),
                   select.Number(2) != 0};
}

void TaskStore::NoteStop(pid_t pid) {
  Statement(database_, "UPDATE workers SET stopped = ? WHERE pid = ?")
      .Bind(std::time(nullptr))
      .Bind(std::int64_t{pid})
      .Step();
}

void TaskStore::NoteEnd(pid_t pid) {
  Statement(database_, "UPDATE workers SET ended = 1 WHERE pid = ?").Bind(std::int64_t{pid}).Step();
  database_.EraseMarked();  // this process may have been the one that read
}

std::vector<pid_t> TaskStore::AllWorkers() {
  std::vector<pid_t> workers;
  Statement select(database_, "SELECT pid FROM workers");
  while (select.Step()) {
    workers.push_back(static_cast<pid_t>(select.Number(0)));
  }
  return workers;
}

void TaskStore::RemoveWorker(pid_t pid) {
  Statement(database_, "DELETE FROM workers WHERE pid = ?").Bind(std::int64_t{pid}).Step();
}

void TaskStore::AddLeftovers(pid_t worker, const Leftovers& leftovers) {
  Statement(database_, "INSERT INTO leftovers VALUES (NULL, ?, ?, ?, ?)")
      .Bind(std::int64_t{worker})
      .Bind(leftovers.list)
      .Bind(leftovers.folder)
      .Bind(leftovers.work_folder)
      .Step();
}

std::vector<LeftoversRow> TaskStore::AllLeftovers() {
  std::vector<LeftoversRow> rows;
  Statement select(database_, "SELECT number, worker, list, folder, work_folder FROM leftovers");
  while (select.Step()) {
    rows.push_back({select.Number(0),
                    static_cast<pid_t>(select.Number(1)),
                    {select.Text(2), select.Text(3), select.Text(4)}});
  }
  return rows;
}

void TaskStore::RemoveLeftovers(std::int64_t number) {
  Statement(database_, "DELETE FROM leftovers WHERE number = ?").Bind(number).Step();
}

void TaskStore::AddNotification(const NotificationRow& row) {
  Statement(database_, "INSERT INTO notifications VALUES (?, ?, ?, ?, ?, ?)")
      .Bind(row.time)
      .Bind(row.app)
      .Bind(row.task)
      .Bind(row.title)
      .Bind(row.message)
      .Bind(ToText(JsonArray(row.arguments)))
      .Step();
}

std::vector<NotificationRow> TaskStore::NotificationsAfter(std::int64_t number) {
  std::vector<NotificationRow> rows;
  Statement select(database_,
                   "SELECT rowid, time, app, task, title, message, arguments FROM notifications "
                   "WHERE rowid > ? ORDER BY rowid");
  select.Bind(number);
  while (select.Step()) {
    NotificationRow row;
    row.number = select.Number(0);
    row.time = select.Number(1);
    row.app = select.Text(2);
    row.task = select.Text(3);
    row.title = select.Text(4);
    row.message = select.Text(5);
    for (const Json::Value& argument : ParseJson(select.Text(6))) {
      row.arguments.push_back(argument.asString());
    }
    rows.push_back(std::move(row));
  }
  return rows;
}

std::int64_t TaskStore::LastNotification() {
  Statement select(database_, "SELECT ifnull(max(rowid), 0) FROM notifications");
  return select.Step() ? select.Number(0) : 0;
}

}  // namespace Device
