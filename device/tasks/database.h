// An SQLite database in WAL mode, which processes share. A connection belongs to one process: none
// may cross a fork.
#pragma once

#include <sqlite3.h>
#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

namespace Device {

// Every operation throws std::runtime_error, with the database's own reason, when it fails. A file
// that turns out to be none, damaged, or of another schema is set aside beside itself, said in one
// line of the log; the next to open it begins anew.
class Database {
 public:
  // Longer than any transaction of another process takes.
  static constexpr std::chrono::seconds kLongPatience{30};
  // How long this process's next connections wait for such a transaction, at first so long. When
  // that is not enough, TheShortage tells.
  static void SetPatience(std::chrono::milliseconds patience);

  // `version` is the schema's, above 0.
  Database(std::string path, const char* schema, int version);

  // One prepared statement, run to its end or reset when it goes out of scope.
  class Statement;
  // Runs a statement that returns nothing.
  template <typename... Values>
  void Run(const char* sql, const Values&... values);
  // The first column of a statement's first row; 0 when there is none.
  std::int64_t Number(const char* sql);

  // Runs the body between BEGIN, or BEGIN IMMEDIATE when it is going to write, and COMMIT. What it
  // throws undoes its changes and passes on.
  void InTransaction(bool for_writing, const std::function<void()>& body);

  // Within a transaction: what it removes or overwrites is to leave the files too. That is tried
  // when the transaction is done, and cannot be while another process reads what was before.
  void MarkErasure();
  // Tries again, whichever process has marked it. Does nothing when nothing is marked. A failure is
  // logged, and the mark stays.
  void EraseMarked();

 private:
  void Open();
  void Execute(const std::string& sql);
  sqlite3_stmt* Prepare(const char* sql);
  // False while another process uses the log.
  bool EmptyLog();
  void MakeSchema(const char* schema, int version);
  void Check(int result);
  void SetAside(const std::string& reason);

  const std::string path_;
  ino_t file_ = 0;
  bool is_marked_ = false;  // in the transaction that runs
  std::unique_ptr<sqlite3, int (*)(sqlite3*)> database_;
};

class Database::Statement {
 public:
  // With the values in the place of its question marks: numbers, texts, and texts by pointer, which
  // may be null. A text, which can be large, stays the caller's until the last step.
  template <typename... Values>
  Statement(Database& database, const char* sql, const Values&... values)
      : database_(database), statement_(database.Prepare(sql), sqlite3_finalize) {
    (Bind(values), ...);
  }

  // True when there is a row.
  bool Step();
  std::string Text(int column) const;
  std::int64_t Number(int column) const { return sqlite3_column_int64(statement_.get(), column); }
  bool IsNull(int column) const {
    return sqlite3_column_type(statement_.get(), column) == SQLITE_NULL;
  }

 private:
  void Bind(const std::string& text) { Bind(&text); }
  void Bind(const std::string* text);
  void Bind(const char* text) = delete;  // a copy of it would be gone before the step
  void Bind(std::int64_t number);

  Database& database_;
  std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> statement_;
  int bound_ = 0;
};

template <typename... Values>
void Database::Run(const char* sql, const Values&... values) {
  Statement(*this, sql, values...).Step();
}

}  // namespace Device
