#pragma once
// Owners of SQLite handles and statements, and errors as exceptions. A handle belongs to the
// process that opened it: never keep one across a fork.

#include <sqlite3.h>

#include <cstdint>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>

namespace nas {

class SqliteError : public std::runtime_error {
 public:
  SqliteError(sqlite3* db, const std::string& what);
  // SQLite's primary result code, and errno of the system call that failed (0 when none did).
  int code() const { return code_; }
  int system_errno() const { return system_errno_; }

 private:
  int code_;
  int system_errno_;
};

class Database {
 public:
  // Opens `path`; `flags` are those of sqlite3_open_v2. A write that finds the file locked waits up
  // to `busy_milliseconds`. Throws SqliteError.
  Database(const std::string& path, int flags, int busy_milliseconds);
  ~Database();
  Database(Database&& other) noexcept : db_(std::exchange(other.db_, nullptr)) {}
  Database& operator=(Database&&) = delete;

  // Runs statements that yield no rows and take no values. Throws SqliteError.
  void Execute(const char* sql);
  // Of a file in WAL mode, for whoever has written much and is about to close it: closing would
  // empty the log as well, but keep everybody else from opening the file meanwhile. What cannot be
  // moved now, such as on a full disk, stays in the log, where it is as readable.
  void EmptyLog();
  sqlite3* handle() const { return db_; }

 private:
  sqlite3* db_ = nullptr;
};

// A prepared statement. Bound texts and blobs must stay alive until the next Step or Reset.
class Statement {
 public:
  Statement(const Database& db, const char* sql);
  ~Statement() { sqlite3_finalize(statement_); }
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;

  Statement& Bind(int index, std::int64_t value);
  Statement& BindBlob(int index, std::string_view bytes);
  Statement& BindText(int index, std::string_view text);
  // True while there is a row. Throws SqliteError; the statement is then reset.
  bool Step();
  // Runs to the end and makes ready for the next values.
  void Run();
  void Reset();

  std::int64_t Integer(int column) const { return sqlite3_column_int64(statement_, column); }
  // Valid until the next Step or Reset.
  std::string_view Bytes(int column) const;

 private:
  sqlite3* db_;
  sqlite3_stmt* statement_ = nullptr;
};

// Rolls back on destruction unless committed.
class Transaction {
 public:
  enum class Kind { kRead, kWrite };
  Transaction(Database& db, Kind kind);
  ~Transaction();
  Transaction(const Transaction&) = delete;
  Transaction& operator=(const Transaction&) = delete;
  void Commit();

 private:
  Database& db_;
  bool open_ = true;
};

}  // namespace nas
