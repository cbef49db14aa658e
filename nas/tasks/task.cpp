#include "platform/task.h"

#include <unistd.h>

#include <map>
#include <mutex>
#include <optional>
#include <stdexcept>

#include "nas/base/file_io.h"
#include "nas/base/pause.h"
#include "nas/base/random_name.h"
#include "nas/system/config.h"
#include "nas/system/identity.h"
#include "nas/system/lease.h"
#include "nas/system/user_state.h"
#include "nas/system/volumes.h"
#include "nas/tasks/task_files.h"

namespace OKT {
namespace {

// Where failures become the exceptions that this interface has.
template <typename T>
T OrThrow(nas::Result<T> result) {
  if (result) return std::move(*result);
  nas::Report(result.error());
  throw std::runtime_error(result.error().Text());
}

// A new task is a search that begins: making the folders for its results is the last that needs
// root. The worker, which inherits what the process is, reads what the user can write: histories,
// settings, the task's own record.
void LeaveRoot(const std::string& owner) {
  if (geteuid() == 0 || !nas::CanBeRoot()) return;
  nas::MakeResultFolders(owner);
  nas::GiveUpRoot();
}

}  // namespace

// Guard: every member below `mutex` is used with it held.
class Task::Record {
 public:
  Record(const char* owner, const char* id) : files_(OrThrow(nas::TaskFiles::Open(owner))) {
    if (id == nullptr) {
      auto task = OrThrow(files_.Create());
      id_ = std::move(task.id);
      life_ = std::move(task.life);
      if (nas::NewTasksAreLeased()) lease_.emplace(nas::CurrentConfig().lease_seconds);
      LeaveRoot(owner);
      nas::SweepTemporaryFiles(nas::PreferenceFolder(owner));
      return;
    }
    if (!nas::IsRandomName(id)) throw std::runtime_error("not a task id");
    id_ = id;
    if (!Read()) throw std::runtime_error("no such task: " + id_);
    files_.Touch(id_);
  }

  const std::string& id() const { return id_; }

  // Life first: a task found dead can no longer change, so what is read after that is complete.
  bool Read() {
    const bool alive = files_.IsAlive(id_);
    auto text = files_.Read(id_);
    if (!text) return false;
    if (text_ != *text) {
      auto state = nas::TaskFiles::Parse(*text);
      if (!state) return false;
      Take(std::move(*state));
      text_ = std::move(*text);
    }
    abandoned_ = abandoned_ || !alive;
    return true;
  }

  bool Write(bool finish) {
    std::map<std::string, Json::Value> changes;
    changes.swap(pending);
    in_batch = false;
    const auto lock = files_.LockForWriting(id_);
    if (!lock) return false;
    auto state = files_.Load(id_);
    if (!state) return false;
    for (auto& [name, value] : changes) state->properties[name].swap(value);
    state->finished = state->finished || finish;
    if (!files_.Store(id_, *state)) return false;
    Take(std::move(*state));
    text_.reset();
    return true;
  }

  Json::Value Property(const std::string& name) const {
    const auto collected = pending.find(name);
    return collected != pending.end() ? collected->second : properties_.get(name, Json::Value());
  }

  bool finished() const { return finished_ || abandoned_; }
  bool abandoned() const { return abandoned_; }
  bool IsForsaken() { return nas::IsRemoved(life_) || (lease_ && lease_->IsOver(life_.get())); }
  bool Remove() { return files_.Remove(id_).ok(); }

  mutable std::mutex mutex;
  bool in_batch = false;
  std::map<std::string, Json::Value> pending;

 private:
  void Take(nas::TaskState&& state) {
    properties_.swap(state.properties);
    finished_ = finished_ || state.finished;
  }

  const nas::TaskFiles files_;
  nas::UniqueFd life_;  // inherited by forks; the task lives while one of them has it open
  std::optional<nas::LeaseWatch> lease_;
  std::string id_;
  Json::Value properties_{Json::objectValue};
  std::optional<std::string> text_;  // what they were read from, where they were
  // Neither is taken back, as neither a mark nor a death is.
  bool finished_ = false;
  bool abandoned_ = false;
};

Task::Task(const char* owner, const char* id) : record_(std::make_unique<Record>(owner, id)) {}
Task::~Task() = default;

std::string Task::getTaskId() const { return record_->id(); }

void Task::beginUpdate() {
  const std::lock_guard guard(record_->mutex);
  record_->in_batch = true;
}

bool Task::endUpdate() {
  const std::lock_guard guard(record_->mutex);
  return record_->Write(/*finish=*/false);
}

bool Task::setProperty(const char* name, const Json::Value& value) {
  const std::lock_guard guard(record_->mutex);
  if (name == nullptr) return false;
  const bool collect = record_->in_batch;
  Json::Value copy = value;  // made first: without memory for it, no empty one may be collected
  record_->pending[name].swap(copy);
  return collect || record_->Write(/*finish=*/false);
}

bool Task::reload() {
  const std::lock_guard guard(record_->mutex);
  return record_->Read();
}

Json::Value Task::getProperty(const char* name) const {
  const std::lock_guard guard(record_->mutex);
  return name == nullptr ? Json::Value() : record_->Property(name);
}

bool Task::finish(bool keep_running) {
  const std::lock_guard guard(record_->mutex);
  return record_->Write(!keep_running);
}

bool Task::isFinished() const {
  const std::lock_guard guard(record_->mutex);
  return record_->finished();
}

bool Task::isAbandoned() const {
  const std::lock_guard guard(record_->mutex);
  return record_->abandoned();
}

bool Task::isForsaken() {
  const std::lock_guard guard(record_->mutex);
  return record_->IsForsaken();
}

bool Task::remove() {
  const std::lock_guard guard(record_->mutex);
  return record_->Remove();
}

TaskMgr::TaskMgr(const char* owner) : owner_(owner == nullptr ? "" : owner) {}

Task* TaskMgr::getTaskWithThrow(const char* id) const {
  if (id == nullptr) throw std::runtime_error("not a task id");
  return new Task(owner_.c_str(), id);
}

}  // namespace OKT

namespace {

// A finished mark ends no wait: whoever stops a task sets it while the worker still has to write
// down what others must know to list and clean it.
template <typename Shown>
int WaitFor(OKT::Task* task, int bound, Shown shown) {
  if (task == nullptr) return 0;
  nas::GrowingPause pause(bound);
  for (;;) {
    if (!task->reload()) return 0;
    if (shown()) return 1;
    if (task->isAbandoned() || !pause.Wait()) return 0;
  }
}

}  // namespace

int WaitForTaskDataReady(OKT::Task* task, const char* name, int bound) {
  return WaitFor(task, bound, [=] { return !task->getProperty(name).isNull(); });
}

int WaitForTaskDataKeyReady(OKT::Task* task, const char* name, const char* member, int bound) {
  if (member == nullptr) return 0;
  return WaitFor(task, bound, [=] {
    const Json::Value value = task->getProperty(name);
    return value.isObject() && value.isMember(member);
  });
}
