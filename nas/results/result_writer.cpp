#include "nas/results/result_writer.h"

#include "nas/results/foreign_accounts.h"

namespace nas {
namespace {

// Large pages, because a block's columns are some tens of kilobytes each. The log is emptied into
// the file now and then, so that it does not grow as large as the results. Nobody knows of the file
// before it has one, so that its tables are made without any journal beside it. The first look at
// a table makes the log: one made with the first row could come after the file's removal, and stay.
constexpr char kMakeFile[] =
    "PRAGMA synchronous=OFF;"
    "PRAGMA page_size=16384;"
    "PRAGMA journal_mode=MEMORY;"
    "BEGIN;"
    "CREATE TABLE location(id INTEGER PRIMARY KEY, share_name BLOB, share_root BLOB);"
    "CREATE TABLE names(first INTEGER PRIMARY KEY, count INTEGER, folders BLOB, names BLOB);"
    "CREATE TABLE attributes(first INTEGER PRIMARY KEY, data BLOB);"
    "CREATE TABLE purged(row INTEGER PRIMARY KEY);"
    "CREATE TABLE complete(rows INTEGER);"
    "CREATE TABLE ordering(id INTEGER PRIMARY KEY, data BLOB);"
    "PRAGMA user_version=1;"
    "COMMIT;"
    "PRAGMA journal_mode=WAL;"
    "PRAGMA wal_autocheckpoint=1024;"
    "SELECT 1 FROM complete;";
static_assert(kResultVersion == 1, "the version is written above");

Database MakeResultFile(const std::string& path) {
  Database db(path, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_EXRESCODE,
              kResultBusyMilliseconds);
  db.Execute(kMakeFile);
  return db;
}

}  // namespace

ResultWriter::ResultWriter(const std::string& path)
    : db_(MakeResultFile(path)),
      insert_location_(db_, "INSERT INTO location VALUES(?,?,?)"),
      insert_names_(db_, "INSERT INTO names VALUES(?,?,?,?)"),
      insert_attributes_(db_, "INSERT INTO attributes VALUES(?,?)") {}

void ResultWriter::AddLocation(std::uint16_t id, const std::string& share_name,
                               const std::string& share_root) {
  const std::lock_guard lock(mutex_);
  locations_.push_back({id, share_name, share_root});
}

// In a transaction. A thousand of them one by one would take as many.
void ResultWriter::WriteLocations() {
  for (const Location& location : locations_) {
    insert_location_.Bind(1, location.id)
        .BindBlob(2, location.share_name)
        .BindBlob(3, location.share_root)
        .Run();
  }
}

void ResultWriter::AddAccount(std::uint32_t id, const std::string& name) {
  const std::lock_guard lock(mutex_);
  AddForeignAccount(db_, id, name);
}

void ResultWriter::Append(RowBlock& block) {
  if (block.size() == 0) return;
  const std::lock_guard lock(mutex_);
  const auto first = static_cast<std::int64_t>(rows_);
  Transaction transaction(db_, Transaction::Kind::kWrite);
  WriteLocations();
  insert_names_.Bind(1, first)
      .Bind(2, static_cast<std::int64_t>(block.size()))
      .BindBlob(3, block.folders())
      .BindBlob(4, block.names())
      .Run();
  insert_attributes_.Bind(1, first).BindBlob(2, block.attributes()).Run();
  transaction.Commit();
  locations_.clear();
  rows_ += block.size();
  block.Clear();
}

void ResultWriter::Complete() {
  const std::lock_guard lock(mutex_);
  Statement(db_, "INSERT INTO complete VALUES(?)").Bind(1, static_cast<std::int64_t>(rows_)).Run();
}

void ResultWriter::EmptyLog() {
  const std::lock_guard lock(mutex_);
  db_.EmptyLog();
}

std::uint64_t ResultWriter::rows() {
  const std::lock_guard lock(mutex_);
  return rows_;
}

}  // namespace nas
