#pragma once
// Owners of SQLite handles and statements. Failures are exceptions here, as a database can fail at
// every row; whoever runs the work catches SqliteError once and goes on with its error(). A handle
// belongs to the process that opened it: never keep one across a fork. None may be used by two
// threads at once.

#include <sqlite3.h>

#include <cstdint>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>

#include "nas/base/error.h"

namespace nas {

// What these classes throw. what() is for logs: the statement or path, and SQLite's own words.
class SqliteError : public std::runtime_error {
 public:
  SqliteError(sqlite3* db, const std::string& what);
  // For whoever catches it: kErrorNoSpace or kErrorDatabase, and the errno that is nearest, such as
  // EBADMSG for a file that is no database and EBUSY for one that stays locked.
  const Error& error() const { return error_; }

 private:
  Error error_;
};

class Database {
 public:
  // Opens `path`; `flags` are those of sqlite3_open_v2. A write that finds the file locked waits up
  // to `busy_milliseconds`. The file may be of anybody's making: its schema runs no views, triggers
  // or functions with effects, and what one value, statement or table may take is bounded. Throws
  // SqliteError.
  Database(const std::string& path, int flags, int busy_milliseconds);
  ~Database();
  Database(Database&& other) noexcept : db_(std::exchange(other.db_, nullptr)) {}
  Database& operator=(Database&&) = delete;

  // Runs statements, separated by ";", that yield no rows and take no values. Throws SqliteError.
  void Execute(const char* sql);
  // Of a file in WAL mode, for whoever has written much and is about to close it: closing would
  // empty the log as well, but keep everybody else from opening the file meanwhile. What cannot be
  // moved now, such as on a full disk, stays in the log, where it is as readable.
  void EmptyLog();
  // No value longer than this is read or written from now on, whatever a damaged file claims to
  // hold: asking for one fails with a SqliteError.
  void BoundValues(std::uint64_t bytes);
  // Whether statements that write fail from now on, in the middle of a transaction too.
  void SetReadOnly(bool read_only);
  sqlite3* handle() const { return db_; }

 private:
  sqlite3* db_ = nullptr;
};

// A prepared statement of a database that outlives it. Values and columns are numbered as SQLite
// does: values from 1, columns from 0. A bound blob must stay alive until Reset.
class Statement {
 public:
  // Throws SqliteError.
  Statement(const Database& db, const char* sql);
  ~Statement() { sqlite3_finalize(statement_); }
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;

  Statement& Bind(int index, std::int64_t value);
  Statement& BindBlob(int index, std::string_view bytes);
  // True while there is a row. Throws SqliteError; the statement is then reset.
  bool Step();
  // Runs to the end and makes ready for the next values. Throws SqliteError.
  void Run();
  // Forgets rows and values.
  void Reset();

  std::int64_t Integer(int column) const { return sqlite3_column_int64(statement_, column); }
  // Valid until the next Step or Reset.
  std::string_view Bytes(int column) const;

 private:
  sqlite3* db_;
  sqlite3_stmt* statement_ = nullptr;
};

// A blob in a row of a table with an integer key, read in pieces: of a long one, only what is asked
// for is fetched. While open it keeps the transaction open that it was opened in. Throws
// SqliteError. The database must outlive it.
class Blob {
 public:
  Blob(const Database& db, const char* table, const char* column, std::int64_t row);
  ~Blob() { sqlite3_blob_close(blob_); }
  Blob(const Blob&) = delete;
  Blob& operator=(const Blob&) = delete;

  // Goes on to the same column of another row.
  void MoveTo(std::int64_t row);
  size_t size() const { return static_cast<size_t>(sqlite3_blob_bytes(blob_)); }
  // The part must lie within the blob.
  void Read(size_t offset, size_t count, void* out) const;

 private:
  sqlite3* db_;
  sqlite3_blob* blob_ = nullptr;
};

// For a process that forks others which use databases: what SQLite sets up once, they inherit. No
// database is opened.
void LoadSqlite();

// Rolls back on destruction unless committed. The database must outlive it.
class Transaction {
 public:
  // A writer takes the database's one write lock at once, so that it cannot fail half-way for
  // another writer; a reader sees the database as it is at its first row, and nothing is written
  // through it meanwhile.
  enum class Kind { kRead, kWrite };
  // Both throw SqliteError.
  Transaction(Database& db, Kind kind);
  ~Transaction();
  Transaction(const Transaction&) = delete;
  Transaction& operator=(const Transaction&) = delete;
  void Commit();

 private:
  Database& db_;
  const Kind kind_;
  bool open_ = true;
};

}  // namespace nas
