#include "device/bodies/task_store.h"

#include <ctime>
#include <stdexcept>

#include "device/bodies/device.h"
#include "device/bodies/json_text.h"

namespace Device {

namespace {

constexpr int kBusyTimeoutMs = 30000;  // longer than any transaction of another process

constexpr char kSchema[] = R"(
PRAGMA journal_mode = WAL;
PRAGMA synchronous = NORMAL;
CREATE TABLE IF NOT EXISTS tasks (
  id TEXT PRIMARY KEY, finished INTEGER NOT NULL, updated INTEGER NOT NULL) WITHOUT ROWID;
CREATE TABLE IF NOT EXISTS properties (
  task TEXT NOT NULL, name TEXT NOT NULL, value TEXT NOT NULL,
  PRIMARY KEY (task, name)) WITHOUT ROWID;
CREATE TABLE IF NOT EXISTS workers (pid INTEGER PRIMARY KEY, start_time INTEGER NOT NULL);
CREATE TABLE IF NOT EXISTS notifications (
  time INTEGER NOT NULL, app TEXT NOT NULL, task TEXT NOT NULL, title TEXT NOT NULL,
  message TEXT NOT NULL, arguments TEXT NOT NULL);
CREATE TABLE IF NOT EXISTS file_index (path TEXT PRIMARY KEY, time INTEGER NOT NULL) WITHOUT ROWID;
)";

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

void TaskStore::InTransaction(const std::function<void()>& body) {
  Statement(database_.get(), "BEGIN IMMEDIATE").Step();
  try {
    body();
    Statement(database_.get(), "COMMIT").Step();
  } catch (...) {
    sqlite3_exec(database_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
    throw;
  }
}

void TaskStore::AddTask(const std::string& id,
                        const std::map<std::string, std::string>& properties) {
  InTransaction([&] {
    Statement(database_.get(), "INSERT INTO tasks VALUES (?, 0, ?)")
        .Bind(id)
        .Bind(std::time(nullptr))
        .Step();
    WriteProperties(id, properties);
  });
}

void TaskStore::WriteProperties(const std::string& id,
                                const std::map<std::string, std::string>& properties) {
  for (const auto& [name, value] : properties) {
    Statement(database_.get(), "INSERT OR REPLACE INTO properties VALUES (?, ?, ?)")
        .Bind(id)
        .Bind(name)
        .Bind(value)
        .Step();
  }
}

void TaskStore::ReadProperties(TaskRow& row) {
  Statement select(database_.get(), "SELECT name, value FROM properties WHERE task = ?");
  select.Bind(row.id);
  while (select.Step()) {
    row.properties[select.Text(0)] = select.Text(1);
  }
}

std::optional<TaskRow> TaskStore::FindTask(const std::string& id) {
  TaskRow row;
  row.id = id;
  bool is_found = false;
  // One transaction, so that the properties are those of one moment.
  Statement(database_.get(), "BEGIN").Step();
  try {
    Statement select(database_.get(), "SELECT finished, updated FROM tasks WHERE id = ?");
    is_found = select.Bind(id).Step();
    if (is_found) {
      row.finished = select.Number(0) != 0;
      row.updated = select.Number(1);
      ReadProperties(row);
    }
  } catch (...) {
    sqlite3_exec(database_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
    throw;
  }
  Statement(database_.get(), "COMMIT").Step();
  return is_found ? std::optional<TaskRow>(std::move(row)) : std::nullopt;
}

std::vector<TaskRow> TaskStore::AllTasks() {
  std::vector<std::string> ids;
  {
    Statement select(database_.get(), "SELECT id FROM tasks ORDER BY updated, id");
    while (select.Step()) {
      ids.push_back(select.Text(0));
    }
  }
  std::vector<TaskRow> rows;
  for (const std::string& id : ids) {
    if (std::optional<TaskRow> row = FindTask(id)) {
      rows.push_back(std::move(*row));
    }
  }
  return rows;
}

bool TaskStore::UpdateTask(const std::string& id,
                           const std::map<std::string, std::string>& properties, bool finished) {
  bool is_found = false;
  InTransaction([&] {
    Statement(database_.get(),
              "UPDATE tasks SET finished = max(finished, ?), updated = ? WHERE id = ?")
        .Bind(finished ? 1 : 0)
        .Bind(std::time(nullptr))
        .Bind(id)
        .Step();
    is_found = sqlite3_changes(database_.get()) == 1;
    if (is_found) {
      WriteProperties(id, properties);
    }
  });
  return is_found;
}

void TaskStore::RemoveTask(const std::string& id) {
  InTransaction([&] {
    Statement(database_.get(), "DELETE FROM properties WHERE task = ?").Bind(id).Step();
    Statement(database_.get(), "DELETE FROM tasks WHERE id = ?").Bind(id).Step();
  });
}

void TaskStore::AddWorker(pid_t pid, std::uint64_t start_time) {
  Statement(database_.get(), "INSERT OR REPLACE INTO workers VALUES (?, ?)")
      .Bind(std::int64_t{pid})
      .Bind(static_cast<std::int64_t>(start_time))
      .Step();
}

std::optional<std::uint64_t> TaskStore::FindWorker(pid_t pid) {
  Statement select(database_.get(), "SELECT start_time FROM workers WHERE pid = ?");
  if (!select.Bind(std::int64_t{pid}).Step()) {
    return std::nullopt;
  }
  return static_cast<std::uint64_t>(select.Number(0));
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
