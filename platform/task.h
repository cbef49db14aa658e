#pragma once
// Task records shared between processes: one record per task, named by a random id, kept under its
// owner. A record holds named JSON properties and a finished mark.
//
// Every write is a read-merge-write under the task's write lock: only the properties set are
// replaced, a finished mark is never lost, and a task that was removed is not brought back. A task
// object made new marks its process, and every process forked from it while the object lives, as
// working on the task; when the last of them is gone the task counts as finished, whatever ended
// them. A task object may be used by several threads of a process.

#include <json/value.h>

#include <memory>
#include <string>

namespace OKT {

class Task {
 public:
  // With a null `id`: a new task of `owner`, stored at once. Otherwise the stored task of that id.
  // Throws std::runtime_error when the owner has as many running tasks as allowed, when there is
  // no such task, when the id is not of the task manager's own form, or when storing fails.
  Task(const char* owner, const char* id);
  ~Task();
  Task(const Task&) = delete;
  Task& operator=(const Task&) = delete;

  std::string getTaskId() const;

  // Between the two, setProperty only collects; endUpdate makes the batch visible at once.
  void beginUpdate();
  bool endUpdate();
  // Outside a batch writes through. False when the task is gone or cannot be written; inside a
  // batch always true.
  bool setProperty(const char* name, const Json::Value& value);

  // Re-reads the record; false when the task is gone or unreadable (the old state then stays).
  bool reload();
  // The property as of the last reading or writing by this object; null when absent.
  Json::Value getProperty(const char* name) const;

  // Writes what a batch collected together with the finished mark. `keep_running` true writes
  // the batch without the mark.
  bool finish(bool keep_running);
  // Whether the task had finished when this object last read the record: opened it, reloaded it or
  // waited on it. So what a caller reads after that and before asking is complete if this is true.
  bool isFinished() const;
  // Whether no process worked on the task any more then. One that is told to stop is marked as
  // finished first and ends later; until it has, the record may still change.
  bool isAbandoned() const;

  // For the worker of a new task, a few times a second: whether it was removed, or was made with a
  // lease and nobody has opened it for so long that nobody will.
  bool isForsaken();

  // Deletes the record. Objects that still hold the task cannot write it any more.
  bool remove();

 private:
  class Record;
  std::unique_ptr<Record> record_;
};

class TaskMgr {
 public:
  explicit TaskMgr(const char* owner);

  // The owner's task with that id; the caller deletes it. Throws std::runtime_error when there is
  // none or the id is not of the task manager's own form.
  Task* getTaskWithThrow(const char* id) const;

 private:
  std::string owner_;
};

}  // namespace OKT

// Wait until the task shows property `name` (or member `member` of the object property `name`), at
// most `bound` tenths of a second. Return 1 when it is there and 0 when the wait gave up: the bound
// passed, the last process that worked on the task ended without it, or the task is gone. The task
// object is reloaded.
int WaitForTaskDataReady(OKT::Task* task, const char* name, int bound);
int WaitForTaskDataKeyReady(OKT::Task* task, const char* name, const char* member, int bound);
