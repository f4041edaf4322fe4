#include "device/bodies/task_store.h"

#include <algorithm>
#include <ctime>
#include <stdexcept>
#include <utility>

#include "device/bodies/device.h"
#include "device/bodies/json_text.h"

namespace Device {

namespace {

constexpr int kBusyTimeoutMs = 30000;  // longer than any transaction of another process

constexpr char kSchema[] = R"(
PRAGMA journal_mode = WAL;
PRAGMA synchronous = NORMAL;
CREATE TABLE IF NOT EXISTS tasks (
  id TEXT PRIMARY KEY, finished INTEGER NOT NULL, updated INTEGER NOT NULL,
  version INTEGER NOT NULL) WITHOUT ROWID;
-- Of each property a row without a member: its value, or "{}" for an object. Of each member of an
-- object a row, whose value is null when it is gone. So a change of one member costs that member.
CREATE TABLE IF NOT EXISTS members (
  task TEXT NOT NULL, name TEXT NOT NULL, member TEXT NOT NULL, value TEXT,
  version INTEGER NOT NULL, PRIMARY KEY (task, name, member));
CREATE TABLE IF NOT EXISTS workers (
  pid INTEGER PRIMARY KEY, start_time INTEGER NOT NULL, stopped INTEGER NOT NULL);
CREATE TABLE IF NOT EXISTS notifications (
  time INTEGER NOT NULL, app TEXT NOT NULL, task TEXT NOT NULL, title TEXT NOT NULL,
  message TEXT NOT NULL, arguments TEXT NOT NULL);
CREATE TABLE IF NOT EXISTS file_index (path TEXT PRIMARY KEY, time INTEGER NOT NULL) WITHOUT ROWID;
)";

constexpr char kForReading[] = "BEGIN";
constexpr char kForWriting[] = "BEGIN IMMEDIATE";
constexpr char kWhole[] = "";      // in place of a member's name
constexpr char kMemberMark = '.';  // before it

}  // namespace

// One prepared statement, run to its end or reset when it goes out of scope.
class TaskStore::Statement {
 public:
  Statement(sqlite3* database, const char* sql)
      : database_(database), statement_(nullptr, nullptr) {
    sqlite3_stmt* statement = nullptr;
    Check(sqlite3_prepare_v2(database, sql, -1, &statement, nullptr));
    statement_ = {statement, sqlite3_finalize};
  }

  Statement& Bind(const std::string& text) {
    Check(sqlite3_bind_text(statement_.get(), ++bound_, text.data(), static_cast<int>(text.size()),
                            SQLITE_TRANSIENT));
    return *this;
  }
  Statement& Bind(std::int64_t number) {
    Check(sqlite3_bind_int64(statement_.get(), ++bound_, number));
    return *this;
  }
  Statement& BindNull() {
    Check(sqlite3_bind_null(statement_.get(), ++bound_));
    return *this;
  }
  // True when there is a row.
  bool Step() {
    const int result = sqlite3_step(statement_.get());
    if (result != SQLITE_ROW && result != SQLITE_DONE) {
      Check(result);
    }
    return result == SQLITE_ROW;
  }
  std::string Text(int column) const {
    const auto* const text =
        reinterpret_cast<const char*>(sqlite3_column_text(statement_.get(), column));
    return {text, static_cast<std::size_t>(sqlite3_column_bytes(statement_.get(), column))};
  }
  bool IsNull(int column) const {
    return sqlite3_column_type(statement_.get(), column) == SQLITE_NULL;
  }
  std::int64_t Number(int column) const { return sqlite3_column_int64(statement_.get(), column); }

 private:
  void Check(int result) const {
    if (result != SQLITE_OK) {
      throw std::runtime_error(std::string("task store: ") + sqlite3_errmsg(database_));
    }
  }

  sqlite3* database_;
  std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> statement_;
  int bound_ = 0;
};

TaskStore::TaskStore(const std::string& user) : database_(nullptr, sqlite3_close) {
  const std::string path = TheDevice().StateFolder(user) + "/store.db";
  sqlite3* database = nullptr;
  const int result =
      sqlite3_open_v2(path.c_str(), &database, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, nullptr);
  database_.reset(database);
  if (result != SQLITE_OK) {
    throw std::runtime_error("task store '" + path + "': " + sqlite3_errmsg(database));
  }
  sqlite3_busy_timeout(database, kBusyTimeoutMs);
  if (sqlite3_exec(database, kSchema, nullptr, nullptr, nullptr) != SQLITE_OK) {
    throw std::runtime_error("task store '" + path + "': " + sqlite3_errmsg(database));
  }
}

void TaskStore::InTransaction(const char* begin, const std::function<void()>& body) {
  Statement(database_.get(), begin).Step();
  try {
    body();
    Statement(database_.get(), "COMMIT").Step();
  } catch (...) {
    sqlite3_exec(database_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
    throw;
  }
}

void TaskStore::AddTask(TaskRow& row) {
  const std::map<std::string, Json::Value> properties = std::exchange(row.properties, {});
  InTransaction(kForWriting, [&] {
    row.updated = std::time(nullptr);
    row.version = 1;
    Statement(database_.get(), "INSERT INTO tasks VALUES (?, 0, ?, ?)")
        .Bind(row.id)
        .Bind(row.updated)
        .Bind(row.version)
        .Step();
    for (const auto& [name, value] : properties) {
      WriteProperty(row, name, value);
    }
  });
}

void TaskStore::WriteMember(const TaskRow& row, const std::string& name, const std::string& member,
                            const Json::Value* value) {
  Statement insert(database_.get(), "INSERT OR REPLACE INTO members VALUES (?, ?, ?, ?, ?)");
  insert.Bind(row.id).Bind(name).Bind(member);
  if (value == nullptr) {
    insert.BindNull();
  } else {
    insert.Bind(ToText(*value));
  }
  insert.Bind(row.version).Step();
}

void TaskStore::WriteProperty(TaskRow& row, const std::string& name, const Json::Value& value) {
  const bool is_known = row.properties.count(name) != 0;
  Json::Value& known = row.properties[name];
  for (const std::string& member :
       known.isObject() ? known.getMemberNames() : Json::Value::Members()) {
    if (!value.isObject() || !value.isMember(member)) {
      WriteMember(row, name, kMemberMark + member, nullptr);
      known.removeMember(member);
    }
  }
  if (!value.isObject()) {
    if (!is_known || known != value) {
      WriteMember(row, name, kWhole, &value);
      known = value;
    }
    return;
  }
  if (!known.isObject()) {
    known = Json::Value(Json::objectValue);
    WriteMember(row, name, kWhole, &known);
  }
  for (auto member = value.begin(); member != value.end(); ++member) {
    const std::string key = member.name();
    if (!known.isMember(key) || known[key] != *member) {
      WriteMember(row, name, kMemberMark + key, &*member);
      known[key] = *member;
    }
  }
}

bool TaskStore::ReadChanges(TaskRow& row) {
  Statement task(database_.get(), "SELECT finished, updated, version FROM tasks WHERE id = ?");
  if (!task.Bind(row.id).Step()) {
    return false;
  }
  Statement changes(database_.get(),
                    "SELECT name, member, value FROM members WHERE task = ? AND version > ? "
                    "ORDER BY name, member");
  changes.Bind(row.id).Bind(row.version);
  while (changes.Step()) {
    Json::Value& property = row.properties[changes.Text(0)];
    const std::string member = changes.Text(1);
    if (member == kWhole) {
      const Json::Value value = ParseJson(changes.Text(2));
      property = value.isObject() && property.isObject() ? property : value;
    } else if (changes.IsNull(2)) {
      property.removeMember(member.substr(sizeof kMemberMark));
    } else {
      property[member.substr(sizeof kMemberMark)] = ParseJson(changes.Text(2));
    }
  }
  row.finished = task.Number(0) != 0;
  row.updated = task.Number(1);
  row.version = task.Number(2);
  return true;
}

bool TaskStore::RefreshTask(TaskRow& row) {
  bool is_found = false;
  InTransaction(kForReading, [&] { is_found = ReadChanges(row); });
  return is_found;
}

std::optional<TaskRow> TaskStore::FindTask(const std::string& id) {
  TaskRow row;
  row.id = id;
  return RefreshTask(row) ? std::optional<TaskRow>(std::move(row)) : std::nullopt;
}

void TaskStore::RefreshTasks(std::map<std::string, TaskRow>& rows) {
  InTransaction(kForReading, [&] {
    std::map<std::string, TaskRow> known = std::exchange(rows, {});
    Statement select(database_.get(), "SELECT id FROM tasks");
    while (select.Step()) {
      const std::string id = select.Text(0);
      TaskRow& row = rows[id];
      row = std::move(known[id]);
      row.id = id;
      ReadChanges(row);
    }
  });
}

std::vector<TaskRow> TaskStore::AllTasks() {
  std::map<std::string, TaskRow> rows;
  RefreshTasks(rows);
  std::vector<TaskRow> all;
  for (auto& [id, row] : rows) {
    all.push_back(std::move(row));
  }
  std::stable_sort(all.begin(), all.end(), [](const TaskRow& one, const TaskRow& other) {
    return one.updated < other.updated;
  });
  return all;
}

bool TaskStore::UpdateTask(TaskRow& row,
                           const std::map<std::string, const Json::Value*>& properties,
                           bool finished) {
  bool is_found = false;
  InTransaction(kForWriting, [&] {
    is_found = ReadChanges(row);
    if (!is_found) {
      return;
    }
    ++row.version;
    row.finished = row.finished || finished;
    row.updated = std::time(nullptr);
    Statement(database_.get(),
              "UPDATE tasks SET finished = ?, updated = ?, version = ? WHERE id = ?")
        .Bind(row.finished ? 1 : 0)
        .Bind(row.updated)
        .Bind(row.version)
        .Bind(row.id)
        .Step();
    for (const auto& [name, value] : properties) {
      WriteProperty(row, name, *value);
    }
  });
  return is_found;
}

void TaskStore::RemoveTask(const std::string& id) {
  InTransaction(kForWriting, [&] {
    Statement(database_.get(), "DELETE FROM members WHERE task = ?").Bind(id).Step();
    Statement(database_.get(), "DELETE FROM tasks WHERE id = ?").Bind(id).Step();
  });
}

void TaskStore::AddWorker(pid_t pid, std::uint64_t start_time) {
  Statement(database_.get(), "INSERT OR REPLACE INTO workers VALUES (?, ?, 0)")
      .Bind(std::int64_t{pid})
      .Bind(static_cast<std::int64_t>(start_time))
      .Step();
}

std::optional<WorkerRow> TaskStore::FindWorker(pid_t pid) {
  Statement select(database_.get(), "SELECT start_time, stopped FROM workers WHERE pid = ?");
  if (!select.Bind(std::int64_t{pid}).Step()) {
    return std::nullopt;
  }
  return WorkerRow{static_cast<std::uint64_t>(select.Number(0)), select.Number(1)};
}

void TaskStore::NoteStop(pid_t pid) {
  Statement(database_.get(), "UPDATE workers SET stopped = ? WHERE pid = ?")
      .Bind(std::time(nullptr))
      .Bind(std::int64_t{pid})
      .Step();
}

std::vector<pid_t> TaskStore::AllWorkers() {
  std::vector<pid_t> workers;
  Statement select(database_.get(), "SELECT pid FROM workers");
  while (select.Step()) {
    workers.push_back(static_cast<pid_t>(select.Number(0)));
  }
  return workers;
}

void TaskStore::RemoveWorker(pid_t pid) {
  Statement(database_.get(), "DELETE FROM workers WHERE pid = ?").Bind(std::int64_t{pid}).Step();
}

void TaskStore::AddNotification(const NotificationRow& row) {
  Json::Value arguments(Json::arrayValue);
  for (const std::string& argument : row.arguments) {
    arguments.append(argument);
  }
  Statement(database_.get(), "INSERT INTO notifications VALUES (?, ?, ?, ?, ?, ?)")
      .Bind(row.time)
      .Bind(row.app)
      .Bind(row.task)
      .Bind(row.title)
      .Bind(row.message)
      .Bind(ToText(arguments))
      .Step();
}

std::vector<NotificationRow> TaskStore::NotificationsAfter(std::int64_t number) {
  std::vector<NotificationRow> rows;
  Statement select(database_.get(),
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
  Statement select(database_.get(), "SELECT ifnull(max(rowid), 0) FROM notifications");
  return select.Step() ? select.Number(0) : 0;
}

std::int64_t TaskStore::Version() {
  Statement select(database_.get(), "PRAGMA data_version");
  return select.Step() ? select.Number(0) : 0;
}

void TaskStore::AddToIndex(const std::string& path) {
  Statement(database_.get(), "INSERT OR REPLACE INTO file_index VALUES (?, ?)")
      .Bind(path)
      .Bind(std::time(nullptr))
      .Step();
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
