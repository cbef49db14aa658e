#pragma once
// Task records on disk. The one owner of their names and locks.
//
// In the owner's task folder (0700, user_state.h), for a task ID
// (random_name.h):
//
//   ID.json   {"version":1,"finished":BOOL,"properties":{...}}, replaced as a whole by rename
//   ID.lock   for locks on two of its bytes, and as a reserve of space that is given up when the
//   disk
//             is full:
//             byte 0, life: held by the process that made the task and by what it forked, as they
//                     share one open file description. Nobody holds it: nobody works on the task.
//             byte 1, write: held for each read-merge-write of ID.json
//   lock      byte 0 is held while tasks are counted and one is made
//
// Who wins: the last writer of a property, property by property; the finished mark and the removal
// always. A record that is not of this form or version reads as no record: it is not overwritten,
// and goes when it is a day old. A process killed while it writes leaves the old record and a
// temporary file, which goes likewise. Nothing is synced: tasks need not survive a power cut.
// Locks are open-file-description locks, so a thread or object that closes another descriptor of
// the same file does not drop them.

#include <json/value.h>

#include <string>
#include <vector>

#include "nas/base/unique_fd.h"

namespace nas {

struct TaskState {
  bool finished = false;
  Json::Value properties{Json::objectValue};
};

class TaskFiles {
 public:
  // Throws std::runtime_error when the owner cannot be one or has no task folder.
  explicit TaskFiles(const char* owner);

  // Makes a task with an empty record. `life` receives the descriptor that keeps it alive. Throws
  // std::runtime_error when the owner has as many running tasks as the
  // configuration allows or it cannot be stored.
  std::string Create(UniqueFd* life) const;

  // Of the owner's tasks, running and finished, in no order; none where the folder cannot be read.
  std::vector<std::string> Ids() const;

  // Whether some process still works on the task.
  bool IsAlive(const std::string& id) const;
  // False, with errno set and `state` untouched, when there is no readable record.
  bool Load(const std::string& id, TaskState* state) const;

  // The write lock; empty, with errno set, when the task is gone or the lock stays taken.
  UniqueFd LockForWriting(const std::string& id) const;
  // To be called with the write lock held. False with errno set; the old record is then whole.
  bool Store(const std::string& id, const TaskState& state) const;
  // Gives the task's reserve of space back to the disk.
  bool FreeReserve(const std::string& id) const;
  // Takes the write lock itself. False when there was no task or it could not be deleted.
  bool Remove(const std::string& id) const;

 private:
  int CountRunningAndSweep() const;
  bool IsUntouched(const std::string& name, time_t now) const;

  UniqueFd folder_;
};

// Tasks of clients that never cleaned up go after this long.
inline constexpr long kKeepSeconds = 24L * 60 * 60;

}  // namespace nas
