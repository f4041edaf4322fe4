#include "device/tasks/database.h"

#include <sys/stat.h>
#include <syslog.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <stdexcept>
#include <utility>

#include "device/base/shortage.h"

namespace Device {

namespace {

constexpr int kEraseTimeoutMs = 100;
// The number in the file's header that is an application's own. Each erasure that is asked for
// makes it greater by one; when it is done, the number is negative.
constexpr char kMark[] = "PRAGMA application_id";
std::chrono::milliseconds the_patience = Database::kLongPatience;

ino_t FileOf(const std::string& path) {
  struct stat status {};
  return stat(path.c_str(), &status) == 0 ? status.st_ino : 0;
}

}  // namespace

void Database::SetPatience(std::chrono::milliseconds patience) { the_patience = patience; }

Database::Database(std::string path, const char* schema, int version)
    : path_(std::move(path)), database_(nullptr, sqlite3_close) {
  Open();
  try {
    MakeSchema(schema, version);
  } catch (const std::runtime_error&) {
    if (FileOf(path_) == file_) {
      throw;
    }
    // It was set aside.
    Open();
    MakeSchema(schema, version);
  }
}

void Database::Open() {
  sqlite3* database = nullptr;
  const int result = sqlite3_open_v2(path_.c_str(), &database,
                                     SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, nullptr);
  database_.reset(database);
  Check(result);
  sqlite3_busy_timeout(database, static_cast<int>(the_patience.count()));
  // Requests come and go: each one that is alone for a moment would write everything back and wait
  // for the disk. The log is written back when it has grown to so many pages that reading it again,
  // which the next request that is alone does, begins to cost.
  sqlite3_db_config(database, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
  file_ = FileOf(path_);
}

void Database::Execute(const std::string& sql) {
  Check(sqlite3_exec(database_.get(), sql.c_str(), nullptr, nullptr, nullptr));
}

std::int64_t Database::Number(const char* sql) {
  Statement query(*this, sql);
  return query.Step() ? query.Number(0) : 0;
}

void Database::MakeSchema(const char* schema, int version) {
  constexpr char kVersion[] = "PRAGMA user_version";
  Execute(
      "PRAGMA synchronous = NORMAL; PRAGMA wal_autocheckpoint = 200;"
      "PRAGMA temp_store = MEMORY; PRAGMA journal_size_limit = 1048576");
  if (Number(kVersion) == version) {
    return;
  }
  Execute("PRAGMA auto_vacuum = FULL; PRAGMA journal_mode = WAL");
  InTransaction(true, [&] {
    if (Number(kVersion) == version) {
      return;  // another process was faster
    }
    if (Number("SELECT count(*) FROM sqlite_master") != 0) {
      SetAside("it has another schema");
      throw std::runtime_error("task store '" + path_ + "' has another schema");
    }
    Execute(schema);
    Execute(kVersion + (" = " + std::to_string(version)));
  });
}

void Database::Check(int result) {
  if (result == SQLITE_OK) {
    return;
  }
  if (result == SQLITE_NOMEM) {
    ThrowMemoryShortage();
  }
  if (result == SQLITE_BUSY) {
    TheShortage() = Shortage::kStore;
  }
  const std::string reason = sqlite3_errmsg(database_.get());
  if (result == SQLITE_CORRUPT || result == SQLITE_NOTADB) {
    SetAside(reason);
  }
  throw std::runtime_error("task store '" + path_ + "': " + reason);
}

void Database::SetAside(const std::string& reason) {
  // Another process may have done so already, and begun anew.
  if (file_ == 0 || FileOf(path_) != file_) {
    return;
  }
  const std::string aside = path_ + ".damaged-" + std::to_string(std::time(nullptr));
  for (const char* part : {"-wal", "-shm", ""}) {
    const std::string from = path_ + part;
    if (std::rename(from.c_str(), (aside + part).c_str()) != 0 && errno != ENOENT) {
      syslog(LOG_ERR, "task store '%s' cannot be set aside: %m", from.c_str());
      return;
    }
  }
  syslog(LOG_ERR, "task store '%s' is set aside as '%s': %s", path_.c_str(), aside.c_str(),
         reason.c_str());
}

void Database::InTransaction(bool for_writing, const std::function<void()>& body) {
  Run(for_writing ? "BEGIN IMMEDIATE" : "BEGIN");
  try {
    body();
    Run("COMMIT");
  } catch (...) {
    is_marked_ = false;
    sqlite3_exec(database_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
    throw;
  }
  if (std::exchange(is_marked_, false)) {
    EraseMarked();
  }
}

void Database::MarkErasure() {
  Execute(kMark + (" = " + std::to_string(std::abs(Number(kMark)) + 1)));
  is_marked_ = true;
}

bool Database::EmptyLog() {
  sqlite3_busy_timeout(database_.get(), kEraseTimeoutMs);
  const int result = sqlite3_wal_checkpoint_v2(database_.get(), nullptr, SQLITE_CHECKPOINT_TRUNCATE,
                                               nullptr, nullptr);
  sqlite3_busy_timeout(database_.get(), static_cast<int>(the_patience.count()));
  if (result != SQLITE_BUSY) {
    Check(result);
  }
  return result == SQLITE_OK;
}

void Database::EraseMarked() {
  const Shortage shortage = TheShortage();
  try {
    const std::int64_t mark = Number(kMark);
    if (mark <= 0 || !EmptyLog()) {
      return;
    }
    // Pages have copies of rows that were moved within them, also with "secure_delete".
    // Rows of a table without a key of its own may get other numbers, if some were ever removed.
    Execute("VACUUM");
    if (EmptyLog()) {
      InTransaction(true, [&] {
        if (Number(kMark) == mark) {  // else another process has marked more meanwhile
          Execute(kMark + (" = " + std::to_string(-mark)));
        }
      });
    }
  } catch (const std::exception& error) {
    // A process that has less memory than the file leaves it to the next one.
    TheShortage() = shortage;
    syslog(LOG_ERR, "erase what was removed: %s", error.what());
  }
}

sqlite3_stmt* Database::Prepare(const char* sql) {
  sqlite3_stmt* statement = nullptr;
  const int result = sqlite3_prepare_v2(database_.get(), sql, -1, &statement, nullptr);
  if (result == SQLITE_ERROR) {  // the statements are right: the schema's own text is damaged
    SetAside(sqlite3_errmsg(database_.get()));
  }
  Check(result);
  return statement;
}

void Database::Statement::Bind(const std::string* text) {
  ++bound_;
  database_.Check(text == nullptr
                      ? sqlite3_bind_null(statement_.get(), bound_)
                      : sqlite3_bind_text(statement_.get(), bound_, text->data(),
                                          static_cast<int>(text->size()), SQLITE_STATIC));
}

void Database::Statement::Bind(std::int64_t number) {
  database_.Check(sqlite3_bind_int64(statement_.get(), ++bound_, number));
}

bool Database::Statement::Step() {
  const int result = sqlite3_step(statement_.get());
  if (result != SQLITE_ROW && result != SQLITE_DONE) {
    database_.Check(result);
  }
  return result == SQLITE_ROW;
}

std::string Database::Statement::Text(int column) const {
  const auto* const text =
      reinterpret_cast<const char*>(sqlite3_column_text(statement_.get(), column));
  return {text, static_cast<std::size_t>(sqlite3_column_bytes(statement_.get(), column))};
}

}  // namespace Device
