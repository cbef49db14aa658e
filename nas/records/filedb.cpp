#include "platform/filedb.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <functional>
#include <optional>

#include "nas/base/error.h"
#include "nas/base/json_text.h"
#include "nas/base/sqlite.h"
#include "nas/base/unique_fd.h"
#include "nas/system/identity.h"

namespace NUVA::WEBFM {
namespace {

// The file: one SQLite table, a row per record, the highest position the newest. A history holds
// ten or so, hence no column but the body is ever searched: whoever looks for records reads them
// all, and SQLite is there for what happens when the power goes. Bodies are JSON texts, kept as
// blobs so that bytes that are not UTF-8 come back as they were. A file with another application
// id, another schema or a newer version is not one of ours and is left alone.
constexpr char kCreate[] =
    "CREATE TABLE records(position INTEGER PRIMARY KEY AUTOINCREMENT, body BLOB NOT NULL);"
    "PRAGMA application_id=1095909955;"
    "PRAGMA user_version=1;";
constexpr std::int64_t kApplicationId = 1095909955;  // "ARBC"
constexpr std::int64_t kVersion = 1;

constexpr off_t kSmallestDatabaseBytes = 512;

// Others hold the lock for one small transaction; longer means they are stopped.
constexpr int kBusyMilliseconds = 5000;

// The text that values are compared by: strings as they are, others as JSON. False when absent.
bool TextOf(const Json::Value& record, const std::string& key, std::string* text) {
  if (!record.isObject() || !record.isMember(key)) return false;
  const Json::Value& value = record[key];
  *text = value.isString() ? value.asString() : nas::JsonText(value, nas::JsonBytes::kRaw);
  return true;
}

bool Matches(const Json::Value& record, const FileDB::Condition& condition) {
  std::string text;
  for (const auto& [key, wanted] : condition.equal) {
    if (!TextOf(record, key, &text) || text != wanted) return false;
  }
  return true;
}

// SQLite would make the file readable by whom the umask lets; a history is its owner's alone.
bool CreatePrivately(const std::string& path) {
  const nas::UniqueFd fd(
      open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, S_IRUSR | S_IWUSR));
  return fd || errno == EEXIST;
}

// The journal stays, so that a commit writes over blocks that files have and no folder has to reach
// the disk but with the first one, which brings the names of both files there. A commit ends with
// the clearing of the journal's head, synced. It is kept short, whatever it once had to hold.
constexpr char kDurable[] =
    "PRAGMA journal_mode=PERSIST;"
    "PRAGMA journal_size_limit=65536;"
    "PRAGMA synchronous=FULL";

// From here on what a commit removes is in no file: not in the journal either, which it empties.
constexpr char kLeaveNothing[] =
    "PRAGMA journal_size_limit=0;"
    "PRAGMA secure_delete=ON";

std::int64_t Number(const nas::Database& db, const char* sql) {
  nas::Statement statement(db, sql);
  return statement.Step() ? statement.Integer(0) : 0;
}

bool IsEmpty(const nas::Database& db) {
  return Number(db, "SELECT count(*) FROM sqlite_schema") == 0;
}

// Makes the table in an empty file; otherwise tells whether the file is ours and whole. Nothing is
// asked of any other that would change it.
bool IsStore(nas::Database& db) {
  if (IsEmpty(db)) {
    db.Execute(kDurable);
    nas::Transaction transaction(db, nas::Transaction::Kind::kWrite);
    if (IsEmpty(db)) db.Execute(kCreate);
    transaction.Commit();
  }
  if (Number(db, "PRAGMA application_id") != kApplicationId ||
      Number(db, "PRAGMA user_version") != kVersion) {
    return false;
  }
  db.Execute(kDurable);
  nas::Statement check(db, "PRAGMA quick_check(1)");
  return check.Step() && check.Bytes(0) == "ok";
}

struct Row {
  std::int64_t position;
  Json::Value record;
};

bool ReadRecord(std::string_view body, Json::Value* record) {
  return nas::ParseJson(body, record) && record->isObject();
}

// The matching records, newest first. A body that is not readable is passed over: one bad record
// must not hide the others.
std::vector<Row> Matching(const nas::Database& db, const FileDB::Condition& condition) {
  std::vector<Row> found;
  nas::Statement rows(db, "SELECT position, body FROM records ORDER BY position DESC");
  while (rows.Step()) {
    Row row{rows.Integer(0), {}};
    if (ReadRecord(rows.Bytes(1), &row.record) && Matches(row.record, condition)) {
      found.push_back(std::move(row));
    }
  }
  return found;
}

void DeleteMatching(nas::Database& db, const FileDB::Condition& condition) {
  // Whatever cannot be read goes with the others.
  if (condition.equal.empty()) {
    db.Execute(kLeaveNothing);
    return db.Execute("DELETE FROM records");
  }
  nas::Statement remove(db, "DELETE FROM records WHERE position=?1");
  for (const Row& row : Matching(db, condition)) remove.Bind(1, row.position).Run();
}

// Nor may one take a place among those that are kept.
void DeleteUnreadable(nas::Database& db) {
  nas::Statement rows(db, "SELECT position, body FROM records");
  std::vector<std::int64_t> unreadable;
  Json::Value record;
  while (rows.Step()) {
    if (!ReadRecord(rows.Bytes(1), &record)) unreadable.push_back(rows.Integer(0));
  }
  nas::Statement remove(db, "DELETE FROM records WHERE position=?1");
  for (const std::int64_t position : unreadable) remove.Bind(1, position).Run();
}

}  // namespace

class FileDB::Store {
 public:
  explicit Store(std::string path) : path_(std::move(path)), opened_(Open()) {}

  int max_records = 0;
  std::string primary_key;

  bool IsGood() const { return Succeeded(opened_); }

  ~Store() { Settle(); }

  bool Read(const std::function<void(nas::Database&)>& work) {
    return Settle() && Succeeded(db_ ? Guard([&] { work(*db_); }) : opened_);
  }

  bool Change(const std::function<void(nas::Database&)>& work) {
    return BeginChange(work) && Settle();
  }

  // The change takes effect with the next one, or at the end.
  bool BeginChange(const std::function<void(nas::Database&)>& work) {
    if (!db_) return Succeeded(opened_);
    const nas::Status done = Guard([&] {
      if (!change_) change_.emplace(*db_, nas::Transaction::Kind::kWrite);
      work(*db_);
    });
    if (!done) change_.reset();
    return Succeeded(done);
  }

 private:
  bool Settle() {
    if (!change_) return true;
    const nas::Status done = Guard([this] { change_->Commit(); });
    change_.reset();
    return Succeeded(done);
  }

  // The end of an operation: a failure becomes the platform's last error.
  static bool Succeeded(const nas::Status& status) {
    if (!status) nas::Report(status.error());
    return status.ok();
  }

  nas::Error Failure(int error_number) const { return {nas::kErrorDatabase, error_number, path_}; }

  nas::Status Open() {
    // SQLite is not to read a user's file in a process that could be root again.
    nas::GiveUpRoot();
    struct stat info;
    if (stat(path_.c_str(), &info) != 0 && (errno != ENOENT || !CreatePrivately(path_))) {
      return Failure(errno);
    }
    if (stat(path_.c_str(), &info) != 0) return Failure(errno);
    if (S_ISDIR(info.st_mode)) return Failure(EISDIR);
    if (!S_ISREG(info.st_mode)) return Failure(EINVAL);
    // SQLite would take so short a file as empty and write over it.
    if (info.st_size > 0 && info.st_size < kSmallestDatabaseBytes) return Failure(EBADMSG);
    bool is_store = false;
    const nas::Status status = Guard([&] {
      db_ = std::make_unique<nas::Database>(path_, SQLITE_OPEN_READWRITE, kBusyMilliseconds);
      is_store = IsStore(*db_);
    });
    if (status && is_store) return status;
    db_.reset();
    return status ? Failure(EBADMSG) : status;
  }

  // Here SQLite's exceptions end.
  nas::Status Guard(const std::function<void()>& work) {
    try {
      work();
      return {};
    } catch (const nas::SqliteError& error) {
      return error.error();
    }
  }

  const std::string path_;
  std::unique_ptr<nas::Database> db_;  // none where `opened_` is a failure
  std::optional<nas::Transaction> change_;
  const nas::Status opened_;
};

FileDB::Condition& FileDB::Condition::SetCondition(const std::string& key,
                                                   const std::string& value) {
  equal[key] = value;
  return *this;
}

FileDB::FileDB(const std::string& path) : store_(std::make_unique<Store>(path)) { IsGood(); }
FileDB::~FileDB() = default;

bool FileDB::IsGood() const { return store_->IsGood(); }
void FileDB::SetMaxRecordNum(int count) { store_->max_records = count; }
void FileDB::SetPrimaryKey(const std::string& key) { store_->primary_key = key; }

bool FileDB::Insert(const Json::Value& record) {
  const std::string body = nas::JsonText(record, nas::JsonBytes::kRaw);
  Json::Value again;
  if (!ReadRecord(body, &again)) {  // no object, or too deep
    errno = EINVAL;
    return false;
  }
  return store_->Change([&](nas::Database& db) {
    const std::string& key = store_->primary_key;
    std::string value;
    if (!key.empty() && TextOf(record, key, &value)) {
      DeleteMatching(db, Condition().SetCondition(key, value));
    }
    DeleteUnreadable(db);
    nas::Statement(db, "INSERT INTO records(body) VALUES(?1)").BindBlob(1, body).Run();
    if (store_->max_records <= 0) return;
    nas::Statement(db,
                   "DELETE FROM records WHERE position NOT IN"
                   " (SELECT position FROM records ORDER BY position DESC LIMIT ?1)")
        .Bind(1, store_->max_records)
        .Run();
  });
}

bool FileDB::UpdateLastByTime(const Json::Value& record, long /*slots*/) { return Insert(record); }

bool FileDB::Delete(const Condition& condition) {
  const auto work = [&](nas::Database& db) { DeleteMatching(db, condition); };
  // What removes some is about to write one in their place: both reach the disk at once.
  return condition.equal.empty() ? store_->Change(work) : store_->BeginChange(work);
}

bool FileDB::Select(const Condition& condition, std::vector<Json::Value>& out) const {
  return store_->Read([&](nas::Database& db) {
    int skip = std::max(condition.offset, 0);
    int left = condition.limit > 0 ? condition.limit : INT_MAX;
    const nas::Transaction reading(db, nas::Transaction::Kind::kRead);
    for (Row& row : Matching(db, condition)) {
      if (skip-- <= 0 && left-- > 0) out.push_back(std::move(row.record));
    }
  });
}

}  // namespace NUVA::WEBFM
