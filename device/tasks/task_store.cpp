#include "device/tasks/task_store.h"

#include <ctime>
#include <limits>
#include <utility>

#include "device/base/json_text.h"
#include "device/model/device.h"

namespace Device {

using Statement = Database::Statement;

namespace {

constexpr int kSchemaVersion = 3;  // one more with each change of the schema

constexpr char kSchema[] = R"(
CREATE TABLE tasks (
  id TEXT PRIMARY KEY, finished INTEGER NOT NULL, updated INTEGER NOT NULL,
  version INTEGER NOT NULL) WITHOUT ROWID;
-- Of each property a row without a member: its value, or "{}" for an object. Of each member of an
-- object a row, whose value is null when it is gone. So a change of one member costs that member.
CREATE TABLE members (
  task TEXT NOT NULL, name TEXT NOT NULL, member TEXT NOT NULL, value TEXT,
  version INTEGER NOT NULL, PRIMARY KEY (task, name, member));
CREATE TABLE workers (
  pid INTEGER PRIMARY KEY, start_time INTEGER NOT NULL, stopped INTEGER NOT NULL,
  ended INTEGER NOT NULL);
CREATE TABLE leftovers (
  number INTEGER PRIMARY KEY, worker INTEGER NOT NULL, list TEXT NOT NULL, folder TEXT NOT NULL, work_folder TEXT NOT NULL);
CREATE TABLE notifications (
  time INTEGER NOT NULL, app TEXT NOT NULL, task TEXT NOT NULL, title TEXT NOT NULL,
  message TEXT NOT NULL, arguments TEXT NOT NULL);
CREATE TABLE file_index (path TEXT PRIMARY KEY, time INTEGER NOT NULL) WITHOUT ROWID;
)";

constexpr bool kForReading = false;
constexpr bool kForWriting = true;
constexpr char kWhole[] = "";                 // in place of a member's name
constexpr char kMemberMark = '.';             // before it
const std::string kSecret = "\"password\":";  // in a text that is erased when it goes

}  // namespace

const StoredValue& TaskRow::Property(const std::string& name) const {
  static const StoredValue kNone;
  const auto found = properties.find(name);
  return found == properties.end() ? kNone : found->second;
}

TaskStore::TaskStore(const std::string& user)
    : database_(TheDevice().StateFolder(user) + "/store.db", kSchema, kSchemaVersion) {
  database_.EraseMarked();
}

void TaskStore::AddTask(TaskRow& row) {
  const std::map<std::string, StoredValue> properties = std::exchange(row.properties, {});
  database_.InTransaction(kForWriting, [&] {
    row.updated = std::time(nullptr);
    row.version = 1;
    database_.Run("INSERT INTO tasks VALUES (?, 0, ?, ?)", row.id, row.updated, row.version);
    for (const auto& [name, value] : properties) {
      WriteProperty(row, name, value);
    }
  });
}

void TaskStore::WriteMember(const TaskRow& row, const std::string& name, const std::string& member,
                            const std::string* text) {
  database_.Run("INSERT OR REPLACE INTO members VALUES (?, ?, ?, ?, ?)", row.id, name, member, text,
                row.version);
}

void TaskStore::MarkIfSecret(const std::string& lost) {
  if (lost.find(kSecret) != std::string::npos) {
    database_.MarkErasure();
  }
}

void TaskStore::WriteProperty(TaskRow& row, const std::string& name, StoredValue value) {
  const bool is_new = row.properties.count(name) == 0;
  StoredValue& known = row.properties[name];
  if (is_new || known.text != value.text) {
    WriteMember(row, name, kWhole, &value.text);
  }
  for (const auto& [member, text] : known.members) {
    if (!value.HasMember(member)) {
      MarkIfSecret(text);
      WriteMember(row, name, kMemberMark + member, nullptr);
    }
  }
  for (const auto& [member, text] : value.members) {
    const auto found = known.members.find(member);
    const bool is_new_member = found == known.members.end();
    if (is_new_member || found->second != text) {
      MarkIfSecret(is_new_member ? "" : found->second);
      WriteMember(row, name, kMemberMark + member, &text);
    }
  }
  known = std::move(value);
}

bool TaskStore::ReadChanges(TaskRow& row, bool with_large) {
  Statement task(database_, "SELECT finished, updated, version FROM tasks WHERE id = ?", row.id);
  if (!task.Step()) {
    return false;
  }
  const std::string left_out = kMemberMark + std::string(kDataParams);
  Statement changes(database_,
                    "SELECT name, member, iif(length(value) > ?, 'null', value) FROM members "
                    "WHERE task = ? AND version > ? AND member IS NOT ? ORDER BY name, member",
                    with_large ? std::numeric_limits<std::int64_t>::max() : kLargeMember, row.id,
                    row.version, with_large ? nullptr : &left_out);
  while (changes.Step()) {
    StoredValue& property = row.properties[changes.Text(0)];
    const std::string member = changes.Text(1);
    if (member == kWhole) {
      property.text = changes.Text(2);
      property.members.clear();
    } else if (const std::string key = member.substr(sizeof kMemberMark); changes.IsNull(2)) {
      property.members.erase(key);
    } else {
      property.members[key] = changes.Text(2);
    }
  }
  row.finished = task.Number(0) != 0;
  row.updated = task.Number(1);
  row.version = task.Number(2);
  return true;
}

bool TaskStore::RefreshTask(TaskRow& row) {
  bool is_found = false;
  database_.InTransaction(kForReading, [&] { is_found = ReadChanges(row, true); });
  return is_found;
}

std::optional<TaskRow> TaskStore::FindTask(const std::string& id) {
  TaskRow row;
  row.id = id;
  return RefreshTask(row) ? std::optional<TaskRow>(std::move(row)) : std::nullopt;
}

void TaskStore::RefreshTasks(std::map<std::string, TaskRow>& rows) {
  database_.InTransaction(kForReading, [&] {
    std::map<std::string, TaskRow> known = std::exchange(rows, {});
    Statement select(database_, "SELECT id FROM tasks");
    while (select.Step()) {
      const std::string id = select.Text(0);
      TaskRow& row = rows[id];
      row = std::move(known[id]);
      row.id = id;
      ReadChanges(row, false);
    }
  });
}

bool TaskStore::UpdateTask(TaskRow& row, std::map<std::string, StoredValue> properties,
                           bool finished) {
  bool is_found = false;
  database_.InTransaction(kForWriting, [&] {
    is_found = ReadChanges(row, true);
    if (!is_found) {
      return;
    }
    ++row.version;
    row.finished = row.finished || finished;
    row.updated = std::time(nullptr);
    database_.Run("UPDATE tasks SET finished = ?, updated = ?, version = ? WHERE id = ?",
                  row.finished, row.updated, row.version, row.id);
    for (auto& [name, value] : properties) {
      WriteProperty(row, name, std::move(value));
    }
  });
  return is_found;
}

void TaskStore::RemoveTask(const std::string& id, pid_t worker) {
  database_.InTransaction(kForWriting, [&] {
    database_.Run("DELETE FROM workers WHERE pid = ? AND stopped = 0", worker);
    if (Statement(database_, "SELECT 1 FROM members WHERE task = ? AND instr(value, ?) LIMIT 1", id,
                  kSecret)
            .Step()) {
      database_.MarkErasure();
    }
    database_.Run("DELETE FROM members WHERE task = ?", id);
    database_.Run("DELETE FROM tasks WHERE id = ?", id);
  });
}

std::int64_t TaskStore::Version() { return database_.Number("PRAGMA data_version"); }

void TaskStore::AddToIndex(const std::string& path) {
  database_.Run("INSERT OR REPLACE INTO file_index VALUES (?, ?)", path, std::time(nullptr));
}

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
  database_.Run("INSERT INTO notifications VALUES (?, ?, ?, ?, ?, ?)", std::time(nullptr), row.app,
                row.task, row.title, row.message, ToText(JsonArray(row.arguments)));
}

std::map<std::int64_t, Json::Value> TaskStore::NotificationsAfter(std::int64_t number) {
  std::map<std::int64_t, Json::Value> found;
  Statement select(database_,
                   "SELECT rowid, json_object('time', time, 'taskid', task, 'title', title, "
                   "'message', message, 'arguments', json(arguments)) FROM notifications "
                   "WHERE rowid > ?",
                   number);
  while (select.Step()) {
    found.emplace(select.Number(0), ParseJson(select.Text(1)));
  }
  return found;
}

std::int64_t TaskStore::LastNotification() {
  return database_.Number("SELECT max(rowid) FROM notifications");
}

namespace {
std::map<std::string, TaskStore>& Stores() {
  static std::map<std::string, TaskStore> stores;
  return stores;
}
}  // namespace

TaskStore& StoreOf(const std::string& user) {
  return Stores().try_emplace(user, user).first->second;
}

void CloseStores() { Stores().clear(); }

}  // namespace Device
