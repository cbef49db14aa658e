#pragma once
// The small keyed record store behind the search histories: one file, a few JSON records, the
// newest first. Each object is for one operation of one process: open it, use it, destroy it. Any
// number of processes may have the same file open; each write is one transaction, which survives a
// power cut once it has returned. Only a Delete of some records is one with the operation that
// follows it, or with the object's end. What fails is false with errno and the last error
// (system.h) set, and leaves the store as it was; a write waits up to five seconds for another
// process's.

#include <json/value.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

namespace NUVA::WEBFM {

class FileDB {
 public:
  struct Condition {
    // Both skip and keep records after matching. A limit of 0 or below means all of them; an
    // offset below 0 means 0.
    int offset = 0;
    int limit = 0;
    // Reserved names of a sort key and of a text filter; ignored while empty.
    std::string sort_key;
    std::string filter;
    std::map<std::string, std::string> equal;

    // Requires a record's value under `key`, as text, to equal `value`. Returns this condition.
    Condition& SetCondition(const std::string& key, const std::string& value);
  };

  // Opens the store at `path`, creating it where the directory exists. A file that cannot be
  // opened, or is not a store, is left as it is and makes IsGood false.
  explicit FileDB(const std::string& path);
  ~FileDB();
  FileDB(const FileDB&) = delete;
  FileDB& operator=(const FileDB&) = delete;

  // Whether the store is open and usable. When not, errno says why.
  bool IsGood() const;

  // From the next write on at most `count` records are kept; the oldest go first. 0: no bound.
  void SetMaxRecordNum(int count);
  // Records are unique by their text value under `key`.
  void SetPrimaryKey(const std::string& key);

  // Adds `record` as the newest, replacing the record with the same primary key. False for what
  // could not be read again: no object, or one nested too deep. Records that were damaged go.
  bool Insert(const Json::Value& record);
  // As Insert. `slots` is how many of the newest records a store that sorts by time need look at;
  // this one keeps its order by itself.
  bool UpdateLastByTime(const Json::Value& record, long slots);
  // Removes every record that matches; true also when none did. Of what a Delete of all removes
  // nothing stays in a file.
  bool Delete(const Condition& condition);
  // Appends the matching records to `out`, newest first. One that cannot be read is passed over.
  bool Select(const Condition& condition, std::vector<Json::Value>& out) const;

 private:
  class Store;
  std::unique_ptr<Store> store_;
};

}  // namespace NUVA::WEBFM
