#include "platform/filedb.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <functional>

#include "nas/base/error.h"
#include "nas/base/json_text.h"
#include "nas/base/sqlite.h"
#include "nas/base/unique_fd.h"

namespace NUVA::WEBFM {
namespace {

// The file: one SQLite table, a row per record, the highest position the newest. Bodies are JSON
// texts, kept as blobs so that bytes that are not UTF-8 come back as they were. A file with another
// application id, another schema or a newer version is not one of ours and is left alone.
constexpr char kCreate[] =
    "CREATE TABLE records(position INTEGER PRIMARY KEY AUTOINCREMENT, body BLOB NOT NULL);"
    "PRAGMA application_id=1095909955;"
    "PRAGMA user_version=1;";
constexpr std::int64_t kApplicationId = 1095909955;  // "ARBC"
constexpr std::int64_t kVersion = 1;

constexpr off_t kSmallestDatabaseBytes = 512;

// Others hold the lock for one small transaction; longer means they are stopped.
constexpr int kBusyMilliseconds = 5000;

std::int64_t Number(const nas::Database& db, const char* sql) {
  nas::Statement statement(db, sql);
  return statement.Step() ? statement.Integer(0) : 0;
}

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

}  // namespace

class FileDB::Store {
 public:
  explicit Store(const std::string& path) { Open(path); }

  int error() const { return error_; }
  void set_max_records(int count) { max_records_ = count; }
  void set_primary_key(const std::string& key) { primary_key_ = key; }

  bool Insert(const Json::Value& record) {
    if (!record.isObject()) {
      errno = EINVAL;
      return false;
    }
    return Change([&] {
      std::string key;
      if (!primary_key_.empty() && TextOf(record, primary_key_, &key)) {
        DeleteMatching(Condition().SetCondition(primary_key_, key));
      }
      const std::string body = nas::JsonText(record, nas::JsonBytes::kRaw);
      nas::Statement(*db_, "INSERT INTO records(body) VALUES(?1)").BindBlob(1, body).Run();
      if (max_records_ > 0) {
        nas::Statement(*db_,
                       "DELETE FROM records WHERE position NOT IN"
                       " (SELECT position FROM records ORDER BY position DESC LIMIT ?1)")
            .Bind(1, max_records_)
            .Run();
      }
    });
  }

  bool Delete(const Condition& condition) {
    return Change([&] { DeleteMatching(condition); });
  }

  bool Select(const Condition& condition, std::vector<Json::Value>& out) {
    std::vector<Json::Value> found;
    const bool done = Use([&] {
      int skip = std::max(condition.offset, 0);
      ForEachNewestFirst([&](std::int64_t, Json::Value& record) {
        if (!Matches(record, condition) || skip-- > 0) return true;
        found.push_back(std::move(record));
        return condition.limit <= 0 || found.size() < static_cast<size_t>(condition.limit);
      });
    });
    if (done) std::move(found.begin(), found.end(), std::back_inserter(out));
    return done;
  }

 private:
  void Open(const std::string& path) {
    struct stat info;
    if (stat(path.c_str(), &info) != 0 && (errno != ENOENT || !CreatePrivately(path))) {
      return Fail(errno);
    }
    if (stat(path.c_str(), &info) != 0) return Fail(errno);
    if (S_ISDIR(info.st_mode)) return Fail(EISDIR);
    if (!S_ISREG(info.st_mode)) return Fail(EINVAL);
    // SQLite would take so short a file as empty and write over it.
    if (info.st_size > 0 && info.st_size < kSmallestDatabaseBytes) return Fail(EBADMSG);
    Run([&] {
      db_ = std::make_unique<nas::Database>(path, SQLITE_OPEN_READWRITE, kBusyMilliseconds);
      Verify();
    });
    if (error_ != 0) db_.reset();
  }

  void Fail(int error_number) {
    error_ = error_number;
    nas::SetLastError(nas::kErrorDatabase);
  }

  // Runs `work`, turning SQLite's errors into error_.
  void Run(const std::function<void()>& work) {
    try {
      work();
    } catch (const nas::SqliteError& error) {
      Fail(error.error().error_number);
    }
  }

  bool Use(const std::function<void()>& work) {
    if (!db_) {
      errno = error_;
      return false;
    }
    error_ = 0;
    Run(work);
    const int error = std::exchange(error_, 0);
    if (error != 0) errno = error;
    return error == 0;
  }

  bool Change(const std::function<void()>& work) {
    return Use([&] {
      nas::Transaction transaction(*db_, nas::Transaction::Kind::kWrite);
      work();
      transaction.Commit();
    });
  }

  bool IsEmpty() { return Number(*db_, "SELECT count(*) FROM sqlite_schema") == 0; }

  // Makes the table in an empty file; otherwise sees that the file is ours and whole.
  void Verify() {
    if (IsEmpty()) {
      nas::Transaction transaction(*db_, nas::Transaction::Kind::kWrite);
      if (IsEmpty()) db_->Execute(kCreate);
      transaction.Commit();
    }
    if (Number(*db_, "PRAGMA application_id") != kApplicationId ||
        Number(*db_, "PRAGMA user_version") != kVersion) {
      return Fail(EBADMSG);
    }
    nas::Statement check(*db_, "PRAGMA quick_check(1)");
    if (!check.Step() || check.Bytes(0) != "ok") return Fail(EBADMSG);
  }

  // A body that is not readable is passed over: one bad record must not hide the others.
  void ForEachNewestFirst(const std::function<bool(std::int64_t, Json::Value&)>& visit) {
    nas::Statement rows(*db_, "SELECT position, body FROM records ORDER BY position DESC");
    while (rows.Step()) {
      Json::Value record;
      if (nas::ParseJson(rows.Bytes(1), &record) && !visit(rows.Integer(0), record)) return;
    }
  }

  void DeleteMatching(const Condition& condition) {
    if (condition.equal.empty()) return db_->Execute("DELETE FROM records");
    std::vector<std::int64_t> positions;
    ForEachNewestFirst([&](std::int64_t position, Json::Value& record) {
      if (Matches(record, condition)) positions.push_back(position);
      return true;
    });
    nas::Statement remove(*db_, "DELETE FROM records WHERE position=?1");
    for (const std::int64_t position : positions) remove.Bind(1, position).Run();
  }

  std::unique_ptr<nas::Database> db_;
  int error_ = 0;
  int max_records_ = 0;
  std::string primary_key_;
};

FileDB::Condition& FileDB::Condition::SetCondition(const std::string& key,
                                                   const std::string& value) {
  equal[key] = value;
  return *this;
}

FileDB::FileDB(const std::string& path) : store_(std::make_unique<Store>(path)) {}
FileDB::~FileDB() = default;

bool FileDB::IsGood() const {
  if (store_->error() == 0) return true;
  errno = store_->error();
  return false;
}

void FileDB::SetMaxRecordNum(int count) { store_->set_max_records(count); }
void FileDB::SetPrimaryKey(const std::string& key) { store_->set_primary_key(key); }

bool FileDB::Insert(const Json::Value& record) { return store_->Insert(record); }

bool FileDB::UpdateLastByTime(const Json::Value& record, long /*slots*/) {
  return store_->Insert(record);
}

bool FileDB::Delete(const Condition& condition) { return store_->Delete(condition); }

bool FileDB::Select(const Condition& condition, std::vector<Json::Value>& out) const {
  return store_->Select(condition, out);
}

}  // namespace NUVA::WEBFM
