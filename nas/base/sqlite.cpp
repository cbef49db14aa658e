#include "nas/base/sqlite.h"

#include <algorithm>
#include <cerrno>
#include <limits>
#include <utility>

namespace nas {

namespace {

constexpr int kPrimaryCode = 0xFF;  // the rest of an extended result code is detail

int NearestErrno(sqlite3* db) {
  switch (sqlite3_errcode(db) & kPrimaryCode) {
    case SQLITE_NOTADB:
    case SQLITE_CORRUPT:
      return EBADMSG;
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
      return EBUSY;
    case SQLITE_FULL:
      return ENOSPC;
    case SQLITE_READONLY:
    case SQLITE_PERM:
      return EACCES;
    case SQLITE_NOMEM:
      return ENOMEM;
    default:
      return sqlite3_system_errno(db) != 0 ? sqlite3_system_errno(db) : EIO;
  }
}

// SQLite gives no handle only where there is no memory for one.
Error ErrorOf(sqlite3* db, const std::string& what) {
  const int error_number = db != nullptr ? NearestErrno(db) : ENOMEM;
  return {error_number == ENOSPC ? kErrorNoSpace : kErrorDatabase, error_number, what};
}

// What a file that a user can write may make SQLite do. The bounds are far above what our own files
// and statements need: a block of results is some megabytes, a statement some hundred bytes.
void Harden(sqlite3* db) {
  constexpr std::pair<int, int> kSettings[] = {{SQLITE_DBCONFIG_DEFENSIVE, 1},
                                               {SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0},
                                               {SQLITE_DBCONFIG_ENABLE_TRIGGER, 0},
                                               {SQLITE_DBCONFIG_ENABLE_VIEW, 0}};
  for (const auto& [setting, value] : kSettings) sqlite3_db_config(db, setting, value, nullptr);
  constexpr int kValueBytes = 64 << 20;
  constexpr std::pair<int, int> kLimits[] = {{SQLITE_LIMIT_LENGTH, kValueBytes},
                                             {SQLITE_LIMIT_SQL_LENGTH, 10'000},
                                             {SQLITE_LIMIT_COLUMN, 100},
                                             {SQLITE_LIMIT_EXPR_DEPTH, 20},
                                             {SQLITE_LIMIT_COMPOUND_SELECT, 3},
                                             {SQLITE_LIMIT_VDBE_OP, 25'000},
                                             {SQLITE_LIMIT_FUNCTION_ARG, 8},
                                             {SQLITE_LIMIT_ATTACHED, 0},
                                             {SQLITE_LIMIT_LIKE_PATTERN_LENGTH, 50},
                                             {SQLITE_LIMIT_VARIABLE_NUMBER, 10},
                                             {SQLITE_LIMIT_TRIGGER_DEPTH, 1}};
  for (const auto& [limit, value] : kLimits) sqlite3_limit(db, limit, value);
}

}  // namespace

SqliteError::SqliteError(sqlite3* db, const std::string& what)
    : std::runtime_error(what + ": " + (db != nullptr ? sqlite3_errmsg(db) : "out of memory")),
      error_(ErrorOf(db, what)) {}

Database::Database(const std::string& path, int flags, int busy_milliseconds) {
  if (sqlite3_open_v2(path.c_str(), &db_, flags | SQLITE_OPEN_NOMUTEX, nullptr) != SQLITE_OK) {
    SqliteError error(db_, path);
    sqlite3_close(db_);
    throw error;
  }
  sqlite3_busy_timeout(db_, busy_milliseconds);
  Harden(db_);
}

Database::~Database() { sqlite3_close(db_); }

void Database::Execute(const char* sql) {
  if (sqlite3_exec(db_, sql, nullptr, nullptr, nullptr) != SQLITE_OK) throw SqliteError(db_, sql);
}

void Database::EmptyLog() {
  sqlite3_wal_checkpoint_v2(db_, nullptr, SQLITE_CHECKPOINT_PASSIVE, nullptr, nullptr);
}

void Database::BoundValues(std::uint64_t bytes) {
  constexpr std::uint64_t kMost = std::numeric_limits<int>::max();
  sqlite3_limit(db_, SQLITE_LIMIT_LENGTH, static_cast<int>(std::min(bytes, kMost)));
}

void Database::SetReadOnly(bool read_only) {
  Execute(read_only ? "PRAGMA query_only=1" : "PRAGMA query_only=0");
}

Statement::Statement(const Database& db, const char* sql) : db_(db.handle()) {
  if (sqlite3_prepare_v2(db_, sql, -1, &statement_, nullptr) != SQLITE_OK) {
    throw SqliteError(db_, sql);
  }
}

Statement& Statement::Bind(int index, std::int64_t value) {
  sqlite3_bind_int64(statement_, index, value);
  return *this;
}

Statement& Statement::BindBlob(int index, std::string_view bytes) {
  sqlite3_bind_blob64(statement_, index, bytes.data(), bytes.size(), SQLITE_STATIC);
  return *this;
}

bool Statement::Step() {
  const int result = sqlite3_step(statement_);
  if (result == SQLITE_ROW) return true;
  if (result == SQLITE_DONE) return false;
  const SqliteError error(db_, sqlite3_sql(statement_));
  Reset();
  throw error;
}

void Statement::Run() {
  while (Step()) {
  }
  Reset();
}

void Statement::Reset() {
  sqlite3_reset(statement_);
  sqlite3_clear_bindings(statement_);
}

std::string_view Statement::Bytes(int column) const {
  // The order matters: asking for the blob first settles its form, so the count is of that form.
  const void* bytes = sqlite3_column_blob(statement_, column);
  const int count = sqlite3_column_bytes(statement_, column);
  return {static_cast<const char*>(bytes), static_cast<size_t>(count)};
}

Blob::Blob(const Database& db, const char* table, const char* column, std::int64_t row)
    : db_(db.handle()) {
  constexpr int kReadOnly = 0;
  if (sqlite3_blob_open(db_, "main", table, column, row, kReadOnly, &blob_) != SQLITE_OK) {
    throw SqliteError(db_, table);
  }
}

void Blob::MoveTo(std::int64_t row) {
  if (sqlite3_blob_reopen(blob_, row) != SQLITE_OK) throw SqliteError(db_, "a row's blob");
}

void Blob::Read(size_t offset, size_t count, void* out) const {
  const int result =
      sqlite3_blob_read(blob_, out, static_cast<int>(count), static_cast<int>(offset));
  if (result != SQLITE_OK) throw SqliteError(db_, "a blob");
}

void LoadSqlite() {
  // No memory in advance for what a connection may want: a call opens one, reads a few pages and
  // ends, and pays for each page of memory that it touches.
  sqlite3_config(SQLITE_CONFIG_LOOKASIDE, 0, 0);
  sqlite3_config(SQLITE_CONFIG_PAGECACHE, nullptr, 0, 0);
  sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0);
  sqlite3_initialize();
}

Transaction::Transaction(Database& db, Kind kind) : db_(db), kind_(kind) {
  db_.Execute(kind == Kind::kWrite ? "BEGIN IMMEDIATE" : "PRAGMA query_only=1;BEGIN");
}

Transaction::~Transaction() {
  if (open_) sqlite3_exec(db_.handle(), "ROLLBACK", nullptr, nullptr, nullptr);
  if (kind_ == Kind::kRead) {
    sqlite3_exec(db_.handle(), "PRAGMA query_only=0", nullptr, nullptr, nullptr);
  }
}

void Transaction::Commit() {
  db_.Execute("COMMIT");
  open_ = false;
}

}  // namespace nas
