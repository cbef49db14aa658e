#pragma once
// Task records on disk. The one owner of their names and locks.
//
// In the owner's task folder (0700, user_state.h), for a task ID (random_name.h):
//
//   ID.json   {"version":1,"finished":BOOL,"properties":{...}}, replaced as a whole by rename
//   ID.lock   for locks on two of its bytes, and as a reserve of space that is given up when the
//             disk is full:
//             byte 0, life: held by the process that made the task and by what it forked, as they
//                     share one open file description. Nobody holds it: nobody works on the task.
//             byte 1, write: held for each read-merge-write of ID.json
//             byte 2, asker: held by a program for as long as it wants the task's results
//             and its time: set by whoever opens the task, so that a task with a lease can tell
//             when nobody does any more
//   lock      byte 0 is held while tasks are counted and one is made
//
// Who wins: the last writer of a property, property by property; the finished mark and the removal
// always. A record that is not of this form or version reads as no record: it is not overwritten,
// and goes when it is a day old. A process killed while it writes leaves the old record and a
// temporary file, which goes likewise. Nothing is synced: tasks need not survive a power cut.
// Locks are open-file-description locks, so a thread or object that closes another descriptor of
// the same file does not drop them.

#include <json/value.h>

#include <chrono>
#include <cstdint>
#include <ctime>
#include <string>
#include <vector>

#include "nas/base/error.h"
#include "nas/base/unique_fd.h"

namespace nas {

struct TaskState {
  bool finished = false;
  Json::Value properties{Json::objectValue};
};

// The tasks of one owner. Every operation works on the disk alone, so several processes and threads
// may use objects of the same owner at once. Ids must be of the form of random_name.h: they become
// parts of paths.
class TaskFiles {
 public:
  // EINVAL for an owner (null too) that cannot be one; ENOENT where there is no task folder.
  static Result<TaskFiles> Open(const char* owner);

  struct NewTask {
    std::string id;
    UniqueFd life;  // keeps the task alive while it, or what a fork inherited of it, is open
  };
  // Makes a task with an empty record, and removes those that are stale. EAGAIN when the owner has
  // as many running tasks as the configuration allows, EBUSY when another process holds the lock
  // for longer than kLockTenths.
  Result<NewTask> Create() const;

  // Of the owner's tasks, running and finished, in no order; none where the folder cannot be read.
  std::vector<std::string> Ids() const;

  // Whether some process still works on the task; also where its lock file is there and cannot be
  // asked, as a search that runs must not be taken for a finished one.
  bool IsAlive(const std::string& id) const;
  // ENOENT without a record, EBADMSG for one that is not readable.
  Result<TaskState> Load(const std::string& id) const;
  // The two halves of it, for who asks again and again: the same text is the same state.
  Result<std::string> Read(const std::string& id) const;
  static Result<TaskState> Parse(const std::string& text);

  // The write lock, held while the descriptor is open. ENOENT when the task is gone, EBUSY when the
  // lock is taken for longer than kLockTenths and nobody writes: many who take turns on a loaded
  // machine are no reason to give up.
  Result<UniqueFd> LockForWriting(const std::string& id) const;
  // To be called with the write lock held. After a failure the old record is whole. EFBIG beyond
  // what Load takes; where the disk is full, the task's reserve of space is used up first.
  Status Store(const std::string& id, const TaskState& state) const;
  // Says that somebody asks after the task: once, or for as long as the descriptor is open, which
  // is invalid where that cannot be had. A program that is stopped, or waits for its reader, still
  // asks.
  void Touch(const std::string& id) const;
  UniqueFd Ask(const std::string& id) const;

  // Takes the write lock itself. ENOENT when there was no task.
  Status Remove(const std::string& id) const;

 private:
  explicit TaskFiles(UniqueFd folder) : folder_(std::move(folder)) {}
  UniqueFd OpenLock(const std::string& id, int flags) const;
  bool FreeReserve(const std::string& id) const;
  int CountRunningAndSweep() const;
  void SweepRecord(const std::string& name, time_t now) const;
  bool IsUntouched(const std::string& name, time_t now) const;
  struct timespec RecordChange(const std::string& id) const;

  UniqueFd folder_;
};

// Whether the task that `life` keeps alive was removed, for the process that made it and its forks.
bool IsRemoved(const UniqueFd& life);

// Tells a leased task's worker when the lease is over. Goes by changes alone, not by what the clock
// of the day says of them.
class LeaseWatch {
 public:
  explicit LeaseWatch(int seconds) : seconds_(seconds) {}
  // `lock_fd` is the task's lock file. To be asked a few times in a lease.
  bool IsOver(int lock_fd);

 private:
  struct Stamp {
    std::int64_t seconds = 0;
    std::int64_t nanoseconds = 0;
    bool operator==(const Stamp&) const = default;
  };
  const int seconds_;
  Stamp seen_;
  std::chrono::steady_clock::time_point asked_ = std::chrono::steady_clock::now();
};

// Wakes whoever waits for an owner's tasks: without it, they look now and then.
class RecordWatch {
 public:
  explicit RecordWatch(const std::string& owner);
  // Readable once a record has been replaced, and until Take. Invalid where that cannot be had.
  int fd() const { return events_.get(); }
  // To be called before the record is read, so that what follows is noticed.
  void Take() const;

 private:
  UniqueFd events_;
};

// A lock is held for the time of one small write; a holder that is stopped must not stop others.
inline constexpr int kLockTenths = 50;

}  // namespace nas
