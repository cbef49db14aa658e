#pragma once
// The search engine: criteria, the walker that a search worker runs, and the result database that
// listings read.

#include <json/value.h>
#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/task.h"

using BOOL = int;

enum _tag_dir_entry_type_ { DIR_ENTRY_DIR = 0, DIR_ENTRY_FILE = 1, DIR_ENTRY_ALL = 2 };

namespace FileSearch {

// What a criterion asks, as the engine judges it; the engine's own.
struct Criterion;

// One criterion: a file is a result when every criterion matches it. Comparators are immutable.
class FindComp {
 public:
  virtual ~FindComp() = default;
  virtual Criterion criterion() const = 0;
};

// Size in bytes; both bounds are inclusive ("greater": at least, "less": at most). Folders never
// match.
class FindSizeComp : public FindComp {
 public:
  FindSizeComp(const char* op, long long bytes);
  Criterion criterion() const override;

 private:
  bool at_least_;
  long long bytes_;
};

// Times in seconds since the epoch; both bounds are inclusive ("after": not before the second
// given, "before": not after it). A file without a recorded creation time matches no creation
// criterion.
class FindTimeComp : public FindComp {
 protected:
  FindTimeComp(const char* op, long seconds);
  bool after() const { return after_; }
  std::int64_t seconds() const { return seconds_; }

 private:
  bool after_;
  std::int64_t seconds_;
};
class FindMTimeComp : public FindTimeComp {
 public:
  FindMTimeComp(const char* op, long seconds) : FindTimeComp(op, seconds) {}
  Criterion criterion() const override;
};
class FindCRTimeComp : public FindTimeComp {
 public:
  FindCRTimeComp(const char* op, long seconds) : FindTimeComp(op, seconds) {}
  Criterion criterion() const override;
};
class FindATimeComp : public FindTimeComp {
 public:
  FindATimeComp(const char* op, long seconds) : FindTimeComp(op, seconds) {}
  Criterion criterion() const override;
};

class FindFactory {
 public:
  enum _tag_FIND_FIELD_ {
    FIND_PATTERN = 0,
    FIND_FILETYPE = 1,
    FIND_EXTENSION = 2,
    FIND_OWNER = 3,
    FIND_GROUP = 4,
  };
  // Appends the comparator of a textual field. The file type is read from `arg1`, every other field
  // from `arg2`. Returns non-zero on success; zero leaves the reason in WfmLibGetErr and
  // NLIBCErrGet (errors.h: kIllegal for a text that is no pattern or type, kNoSuchUser,
  // kNoSuchGroup).
  static int createFindOp(_tag_FIND_FIELD_ field, const char* arg1, const char* arg2,
                          std::vector<FindComp*>& comps);
};

// Walks the locations and stores what matches in a result database of its own. One object, one
// search. Walk may use threads; all of them have ended when it returns.
class WfmSearchWalker {
 public:
  // `task` (borrowed) receives "result_ready" and "walk", what they are at the end in a batch that
  // the caller's next write of the task takes along; a non-zero `*stop_flag` ends the walk within
  // 100 ms.
  WfmSearchWalker(const char* user, const char* session, OKT::Task* task, int* stop_flag);
  ~WfmSearchWalker();
  WfmSearchWalker(const WfmSearchWalker&) = delete;
  WfmSearchWalker& operator=(const WfmSearchWalker&) = delete;

  // Opens the locations ("/SHARE/below") under the process's identity and makes the result
  // database. Goes on with the locations that can be opened; false, with NLIBCErrGet of the first
  // one, when none can. `comps` is borrowed until the walker ends.
  bool init(const std::vector<std::string>& locations, const std::vector<FindComp*>& comps);
  // True: only the entries of the locations themselves.
  void setSearchCurrentDir(bool current_only);

  // Name of the result database and of the volume that holds it; valid after init.
  const char* getDBTaskId();
  const char* getDBVol();

  // Runs the search. `options` is the criteria object with "recursive" and "search_content"; the
  // latter asks also for files whose contents hold the pattern. `atime_comps` are the access-time
  // criteria once more, to be judged before a file is read. True when the walk completed; false
  // when it was stopped or failed (NLIBCErrGet).
  bool Walk(const std::vector<FindATimeComp*>& atime_comps, const Json::Value& options);

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

// One row of a result database, lent to a callback for the time of the call.
struct __tag_FILE_INFO_DATA {
  char* share_root;  // absolute directory of the share
  char* share_name;
  char* name;
  char* relative_path;  // below the share's root, no leading "/"
  char* extension;      // without the dot; empty when there is none
  std::uint32_t mode;
  char* owner_name;
  char* group_name;
  std::uint32_t uid;
  std::uint32_t gid;
  bool is_dir;
  std::uint64_t size;
  std::int64_t atime;  // seconds since the epoch, as are the others
  std::int64_t mtime;
  std::int64_t ctime;
  std::int64_t crtime;
};

using SelectCallback = BOOL (*)(__tag_FILE_INFO_DATA*, void*);

// A result database as listings see it. Open in one process at a time; a search worker may be
// appending to it meanwhile.
class WfmSearchDBTask {
 public:
  ~WfmSearchDBTask();
  WfmSearchDBTask(const WfmSearchDBTask&) = delete;
  WfmSearchDBTask& operator=(const WfmSearchDBTask&) = delete;

  // Calls `callback` for the rows [offset, offset + limit) of those that pass `type` and the name
  // filter `pattern` (null or empty: all), in the order of `sort_by` (null: the order found). A
  // callback that returns 0 ends the selection. `*total` receives how many rows pass. False for a
  // database error, an unknown column or an illegal pattern.
  bool queryResult(unsigned long offset, unsigned long limit, const char* sort_by,
                   const bool* ascending, const _tag_dir_entry_type_* type, const char* pattern,
                   SelectCallback callback, void* context, unsigned long long* total) const;
  // Deletes the rows of that file; false when there was none or they could not be deleted.
  //
  // May be called from within a queryResult callback for the row lent to it, where it does not
  // disturb the running selection. It then deletes nothing for a file that is still there (a
  // dangling symbolic link, a folder closed meanwhile), and tells of the page so far: true when it
  // holds a file that is gone, so that the page has to be asked for again. This object's selections
  // leave such a file out from then on, also where its rows could not be deleted (a full disk).
  bool delRecs(std::string share_name, std::string real_path);
  // Deletes the database.
  bool remove();

 private:
  friend class WfmSearchDBTaskMgr;
  class Impl;
  explicit WfmSearchDBTask(std::unique_ptr<Impl> impl);
  std::unique_ptr<Impl> impl_;
};

class WfmSearchDBTaskMgr {
 public:
  explicit WfmSearchDBTaskMgr(const char* user);
  // The result database, owned by the caller, or null when there is none by that name. One that
  // cannot be read fails its queries, and can be removed.
  WfmSearchDBTask* getDBTask(const char* volume, const char* id) const;

 private:
  std::string user_;
};

}  // namespace FileSearch
