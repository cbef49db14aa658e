#include "nas/tasks/task_files.h"

#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <string_view>

#include "nas/base/accounts.h"
#include "nas/base/file_io.h"
#include "nas/base/file_lock.h"
#include "nas/base/json_text.h"
#include "nas/base/keeping.h"
#include "nas/base/paths.h"
#include "nas/base/pause.h"
#include "nas/base/random_name.h"
#include "nas/system/config.h"
#include "nas/system/user_state.h"

namespace nas {
namespace {

constexpr off_t kLifeByte = 0;
constexpr off_t kWriteByte = 1;
constexpr off_t kAskerByte = 2;
constexpr off_t kFolderByte = 0;
constexpr char kFolderLock[] = "lock";
constexpr std::string_view kRecordSuffix = ".json";
constexpr std::string_view kLockSuffix = ".lock";
constexpr mode_t kPrivateMode = S_IRUSR | S_IWUSR;
// A record holds the locations of a request, which is a megabyte, and little more; the location of
// a home is longer in the record than in the request.
constexpr size_t kMaxRecordBytes = size_t{4} << 20;
// Names in a task folder that one new task looks at, and records of living tasks that it reads: the
// folder is the user's, who may fill it. What is over is looked at when these have been swept, and
// counts as running.
constexpr int kMostNames = 10'000;
constexpr int kMostRecords = 100;
// Kept in the lock file for the day the disk is full: a search that ends for want of space must
// still be able to say so. Two blocks, as a directory may need one besides the record.
constexpr off_t kReserveBytes = off_t{8} * 1024;

constexpr int kRecordVersion = 1;
constexpr char kVersion[] = "version";
constexpr char kFinished[] = "finished";
constexpr char kProperties[] = "properties";

std::string RecordName(const std::string& id) { return id + std::string(kRecordSuffix); }
std::string LockName(const std::string& id) { return id + std::string(kLockSuffix); }

// The id in a file name with that suffix; empty for any other name.
std::string IdOf(std::string_view name, std::string_view suffix) {
  if (!name.ends_with(suffix)) return {};
  name.remove_suffix(suffix.size());
  return IsRandomName(name) ? std::string(name) : std::string();
}

Status TakeLock(int fd, off_t byte) {
  GrowingPause pause(kLockTenths);
  for (;;) {
    struct flock lock = WriteLockOn(byte);
    if (fcntl(fd, F_OFD_SETLK, &lock) == 0) return {};
    if (errno != EAGAIN && errno != EACCES && errno != EINTR) return ErrnoError();
    if (!pause.Wait()) return ErrnoError(EBUSY);
  }
}

std::string TextOf(const TaskState& state) {
  Json::Value record(Json::objectValue);
  record[kVersion] = kRecordVersion;
  record[kFinished] = state.finished;
  record[kProperties] = state.properties;
  return JsonText(record, JsonBytes::kRaw);
}

}  // namespace

Result<TaskFiles> TaskFiles::Open(const char* owner) {
  if (owner == nullptr || !IsUserName(owner)) return ErrnoError(EINVAL, "no such task owner");
  const std::string path = TaskFolder(owner);
  UniqueFd folder(open(path.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!folder) return ErrnoError(path);
  return TaskFiles(std::move(folder));
}

UniqueFd TaskFiles::OpenLock(const std::string& id, int flags) const {
  return UniqueFd(openat(folder_.get(), LockName(id).c_str(),
                         O_RDWR | O_NOFOLLOW | O_CLOEXEC | flags, kPrivateMode));
}

Result<TaskFiles::NewTask> TaskFiles::Create() const {
  constexpr int kFlags = O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC;
  const UniqueFd guard(openat(folder_.get(), kFolderLock, kFlags, kPrivateMode));
  if (!guard) return ErrnoError(kFolderLock);
  if (const Status locked = TakeLock(guard.get(), kFolderByte); !locked) {
    return locked.error().Of(kFolderLock);
  }
  if (CountRunningAndSweep() >= CurrentConfig().searches_per_user) {
    return ErrnoError(EAGAIN, "too many running tasks");
  }
  NewTask task{RandomName(), {}};
  task.life = OpenLock(task.id, O_CREAT | O_EXCL);
  if (!task.life) return ErrnoError(LockName(task.id));
  Status stored = TakeLock(task.life.get(), kLifeByte);
  if (stored) stored = Store(task.id, TaskState());
  if (!stored) {
    unlinkat(folder_.get(), LockName(task.id).c_str(), 0);
    return stored.error();
  }
  // A task without a reserve is no worse than one that has used it up.
  (void)fallocate(task.life.get(), 0, 0, kReserveBytes);
  return task;
}

std::vector<std::string> TaskFiles::Ids() const {
  std::vector<std::string> ids;
  for (const std::string& name : NamesIn(folder_.get(), ".").value_or({})) {
    std::string id = IdOf(name, kRecordSuffix);
    if (!id.empty()) ids.push_back(std::move(id));
  }
  return ids;
}

bool TaskFiles::IsAlive(const std::string& id) const {
  const UniqueFd fd = OpenLock(id, 0);
  if (!fd) return errno != ENOENT;
  struct flock lock = WriteLockOn(kLifeByte);
  return fcntl(fd.get(), F_OFD_GETLK, &lock) != 0 || lock.l_type != F_UNLCK;
}

Result<TaskState> TaskFiles::Load(const std::string& id) const {
  const auto text = Read(id);
  if (!text) return text.error();
  auto state = Parse(*text);
  if (!state) return state.error().Of(RecordName(id));
  return state;
}

Result<std::string> TaskFiles::Read(const std::string& id) const {
  return ReadWholeFile(folder_.get(), RecordName(id), kMaxRecordBytes);
}

Result<TaskState> TaskFiles::Parse(const std::string& text) {
  Json::Value record;
  if (!ParseJson(text, &record) || !record.isObject() || record[kVersion] != kRecordVersion ||
      !record[kFinished].isBool() || !record[kProperties].isObject()) {
    return ErrnoError(EBADMSG);
  }
  TaskState state;
  state.finished = record[kFinished].asBool();
  state.properties.swap(record[kProperties]);
  return state;
}

Result<UniqueFd> TaskFiles::LockForWriting(const std::string& id) const {
  UniqueFd fd = OpenLock(id, 0);
  if (!fd) return ErrnoError(LockName(id));
  // Each who has the lock replaces the record.
  struct timespec before = RecordChange(id);
  for (;;) {
    const Status locked = TakeLock(fd.get(), kWriteByte);
    if (locked) return fd;
    const struct timespec now = RecordChange(id);
    const bool stuck = now.tv_sec == before.tv_sec && now.tv_nsec == before.tv_nsec;
    if (locked.error().error_number != EBUSY || stuck) return locked.error().Of(LockName(id));
    before = now;
  }
}

struct timespec TaskFiles::RecordChange(const std::string& id) const {
  struct stat info = {};
  (void)fstatat(folder_.get(), RecordName(id).c_str(), &info, AT_SYMLINK_NOFOLLOW);
  return info.st_ctim;
}

Status TaskFiles::Store(const std::string& id, const TaskState& state) const {
  const std::string text = TextOf(state);
  if (text.size() > kMaxRecordBytes) return ErrnoError(EFBIG, RecordName(id));
  const auto replace = [&] {
    return ReplaceFile(folder_.get(), RecordName(id), text, kPrivateMode, Durability::kNone);
  };
  const Status stored = replace();
  const bool full = !stored && stored.error().kind == kErrorNoSpace;
  return full && FreeReserve(id) ? replace() : stored;
}

void TaskFiles::Touch(const std::string& id) const {
  // Where it cannot be set the task's own end comes sooner, which is no failure of the asker's.
  (void)utimensat(folder_.get(), LockName(id).c_str(), nullptr, AT_SYMLINK_NOFOLLOW);
}

// Several may ask: the lock is a shared one.
UniqueFd TaskFiles::Ask(const std::string& id) const {
  UniqueFd fd = OpenLock(id, 0);
  struct flock lock = WriteLockOn(kAskerByte);
  lock.l_type = F_RDLCK;
  if (fd && fcntl(fd.get(), F_OFD_SETLK, &lock) != 0) fd.Reset();
  return fd;
}

bool IsRemoved(const UniqueFd& life) {
  struct stat info;
  return life && fstat(life.get(), &info) == 0 && info.st_nlink == 0;
}

bool LeaseWatch::IsOver(int lock_fd) {
  const auto now = std::chrono::steady_clock::now();
  struct flock lock = WriteLockOn(kAskerByte);
  struct stat info;
  if (fstat(lock_fd, &info) != 0 || fcntl(lock_fd, F_OFD_GETLK, &lock) != 0) return false;
  const Stamp stamp = {info.st_ctim.tv_sec, info.st_ctim.tv_nsec};
  if (stamp != seen_ || lock.l_type != F_UNLCK) asked_ = now;
  seen_ = stamp;
  return now - asked_ > std::chrono::seconds(seconds_);
}

RecordWatch::RecordWatch(const std::string& owner)
    : events_(inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
  const std::string folder = TaskFolder(owner);
  if (events_ && inotify_add_watch(events_.get(), folder.c_str(), IN_MOVED_TO | IN_ONLYDIR) < 0) {
    events_.Reset();
  }
}

void RecordWatch::Take() const {
  constexpr size_t kBufferBytes = 4096;
  std::array<char, kBufferBytes> events;
  while (events_ && read(events_.get(), events.data(), events.size()) > 0) {
  }
}

bool TaskFiles::FreeReserve(const std::string& id) const {
  const UniqueFd fd = OpenLock(id, 0);
  return fd && ftruncate(fd.get(), 0) == 0;
}

// The record goes first: a writer that gets the lock of a file already gone finds no record.
Status TaskFiles::Remove(const std::string& id) const {
  const auto lock = LockForWriting(id);
  if (!lock) return lock.error();
  Status removed;
  if (unlinkat(folder_.get(), RecordName(id).c_str(), 0) != 0) removed = ErrnoError(RecordName(id));
  if (removed || removed.error().error_number == ENOENT) {
    unlinkat(folder_.get(), LockName(id).c_str(), 0);
  }
  return removed;
}

bool TaskFiles::IsUntouched(const std::string& name, time_t now) const {
  struct stat info;
  return fstatat(folder_.get(), name.c_str(), &info, AT_SYMLINK_NOFOLLOW) == 0 &&
         now - info.st_mtime > kKeepSeconds;
}

// Of what has no lock file: a record whose task was never removed, or a temporary file.
void TaskFiles::SweepRecord(const std::string& name, time_t now) const {
  const std::string id = IdOf(name, kRecordSuffix);
  const bool ours = name.starts_with(kTemporaryPrefix) || !id.empty();
  if (ours && IsUntouched(name, now) && !IsAlive(id)) unlinkat(folder_.get(), name.c_str(), 0);
}

int TaskFiles::CountRunningAndSweep() const {
  int running = 0;
  int read = 0;
  int looked = 0;
  const time_t now = time(nullptr);
  for (const std::string& name : NamesIn(folder_.get(), ".").value_or({})) {
    if (++looked > kMostNames) break;
    // Each task has a lock file from its first moment to its last.
    const std::string id = IdOf(name, kLockSuffix);
    if (id.empty()) {
      SweepRecord(name, now);
    } else if (IsAlive(id)) {
      if (++read > kMostRecords) return INT_MAX;
      const auto state = Load(id);
      if (state && !state->finished) ++running;
    } else if (IsUntouched(name, now) && (IsUntouched(RecordName(id), now) || !Load(id))) {
      (void)Remove(id);
    }
  }
  return running;
}

}  // namespace nas
