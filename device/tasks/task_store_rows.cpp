// The store's small tables: workers, what they leave behind, notifications.
#include <ctime>

#include "device/base/json_text.h"
#include "device/tasks/task_store.h"

namespace Device {

using Statement = Database::Statement;

void TaskStore::AddWorker(pid_t pid, std::uint64_t start_time) {
  database_.Run("INSERT OR REPLACE INTO workers VALUES (?, ?, 0, 0)", pid, start_time);
}

std::optional<WorkerRow> TaskStore::FindWorker(pid_t pid) {
  Statement select(database_, "SELECT start_time, stopped, ended FROM workers WHERE pid = ?", pid);
  if (!select.Step()) {
    return std::nullopt;
  }
  return WorkerRow{static_cast<std::uint64_t>(select.Number(0)), select.Number(1),
                   select.Number(2) != 0};
}

void TaskStore::NoteStop(pid_t pid) {
  database_.Run("UPDATE workers SET stopped = ? WHERE pid = ?", std::time(nullptr), pid);
}

void TaskStore::NoteEnd(pid_t pid) {
  database_.Run("UPDATE workers SET ended = 1 WHERE pid = ?", pid);
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

void TaskStore::RemoveWorker(pid_t pid) { database_.Run("DELETE FROM workers WHERE pid = ?", pid); }

void TaskStore::AddLeftovers(const LeftoversRow& row) {
  database_.Run("INSERT INTO leftovers VALUES (NULL, ?, ?, ?, ?)", row.worker, row.list, row.folder,
                row.work_folder);
}

std::vector<LeftoversRow> TaskStore::AllLeftovers() {
  std::vector<LeftoversRow> rows;
  Statement select(database_, "SELECT number, worker, list, folder, work_folder FROM leftovers");
  while (select.Step()) {
    rows.push_back({select.Number(0), static_cast<pid_t>(select.Number(1)), select.Text(2),
                    select.Text(3), select.Text(4)});
  }
  return rows;
}

void TaskStore::RemoveLeftovers(std::int64_t number) {
  database_.Run("DELETE FROM leftovers WHERE number = ?", number);
}

void TaskStore::AddNotification(const NotificationRow& row) {
  database_.Run("INSERT INTO notifications VALUES (?, ?, ?, ?, ?, ?)", row.time, row.app, row.task,
                row.title, row.message, ToText(JsonArray(row.arguments)));
}

std::vector<NotificationRow> TaskStore::NotificationsAfter(std::int64_t number) {
  std::vector<NotificationRow> rows;
  Statement select(database_,
                   "SELECT rowid, time, app, task, title, message, arguments FROM notifications "
                   "WHERE rowid > ? ORDER BY rowid",
                   number);
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
  return database_.Number("SELECT max(rowid) FROM notifications");
}

}  // namespace Device
