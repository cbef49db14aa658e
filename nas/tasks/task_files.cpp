#include "nas/tasks/task_files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <ctime>
#include <stdexcept>
#include <string_view>

#include "nas/base/error.h"
#include "nas/base/file_io.h"
#include "nas/base/json_text.h"
#include "nas/base/paths.h"
#include "nas/base/pause.h"
#include "nas/base/random_name.h"
#include "nas/system/accounts.h"
#include "nas/system/config.h"
#include "nas/system/user_state.h"

namespace nas {
namespace {

constexpr off_t kLifeByte = 0;
constexpr off_t kWriteByte = 1;
constexpr off_t kFolderByte = 0;
constexpr char kFolderLock[] = "lock";
constexpr std::string_view kRecordSuffix = ".json";
constexpr std::string_view kLockSuffix = ".lock";
constexpr int kRecordVersion = 1;
constexpr mode_t kPrivateMode = S_IRUSR | S_IWUSR;
// A record holds a request's parameters and little more.
constexpr size_t kMaxRecordBytes = size_t{16} << 20;
// Kept in the lock file for the day the disk is full: a search that ends for want of space must
// still be able to say so. Two blocks, as a directory may need one besides the record.
constexpr off_t kReserveBytes = 8 * 1024;
// A lock is held for the time of one small write; a holder that is stopped must not stop others.
constexpr int kLockTenths = 50;

std::string RecordName(const std::string& id) { return id + std::string(kRecordSuffix); }
std::string LockName(const std::string& id) { return id + std::string(kLockSuffix); }

// The id in a file name with that suffix; empty for any other name.
std::string IdOf(std::string_view name, std::string_view suffix) {
  if (!name.ends_with(suffix)) return {};
  name.remove_suffix(suffix.size());
  std::string id(name);
  return IsRandomName(id) ? id : std::string();
}

struct flock WriteLockOn(off_t byte) {
  struct flock lock = {};
  lock.l_type = F_WRLCK;
  lock.l_whence = SEEK_SET;
  lock.l_start = byte;
  lock.l_len = 1;
  return lock;
}

bool TakeLock(int fd, off_t byte) {
  GrowingPause pause(kLockTenths);
  for (;;) {
    struct flock lock = WriteLockOn(byte);
    if (fcntl(fd, F_OFD_SETLK, &lock) == 0) return true;
    if (errno != EAGAIN && errno != EACCES && errno != EINTR) return false;
    if (!pause.Wait()) {
      errno = EBUSY;
      return false;
    }
  }
}

[[noreturn]] void Throw(const std::string& what, int error_number) {
  SetLastError(ErrorFromErrno(error_number));
  throw std::runtime_error(what + ": " + std::strerror(error_number));
}

}  // namespace

TaskFiles::TaskFiles(const char* owner) {
  if (owner == nullptr || !IsUserName(owner)) Throw("no such task owner", EINVAL);
  folder_ =
      UniqueFd(open(TaskFolder(owner).c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!folder_) Throw("the task folder cannot be opened", errno);
}

std::string TaskFiles::Create(UniqueFd* life) const {
  const int flags = O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC;
  const UniqueFd guard(openat(folder_.get(), kFolderLock, flags, kPrivateMode));
  if (!guard || !TakeLock(guard.get(), kFolderByte)) Throw("the task folder is locked", errno);
  if (CountRunningAndSweep() >= CurrentConfig().searches_per_user)
    Throw("too many running tasks", EAGAIN);

  std::string id = RandomName();
  UniqueFd fd(openat(folder_.get(), LockName(id).c_str(), flags | O_EXCL, kPrivateMode));
  if (!fd) Throw("a task cannot be made", errno);
  if (!TakeLock(fd.get(), kLifeByte) || !Store(id, TaskState())) {
    const int cause = errno;
    unlinkat(folder_.get(), LockName(id).c_str(), 0);
    Throw("a task cannot be stored", cause);
  }
  // Without it the task is no worse than with it used up.
  if (fallocate(fd.get(), 0, 0, kReserveBytes) != 0) errno = 0;
  *life = std::move(fd);
  return id;
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
  const UniqueFd fd(openat(folder_.get(), LockName(id).c_str(), O_RDWR | O_NOFOLLOW | O_CLOEXEC));
  if (!fd) return false;
  struct flock lock = WriteLockOn(kLifeByte);
  return fcntl(fd.get(), F_OFD_GETLK, &lock) == 0 && lock.l_type != F_UNLCK;
}

bool TaskFiles::Load(const std::string& id, TaskState* state) const {
  std::string text;
  if (!ReadWholeFile(folder_.get(), RecordName(id).c_str(), kMaxRecordBytes, &text)) return false;
  Json::Value record;
  if (!ParseJson(text, &record) || !record.isObject() || record["version"] != kRecordVersion ||
      !record["finished"].isBool() || !record["properties"].isObject()) {
    errno = EBADMSG;
    return false;
  }
  state->finished = record["finished"].asBool();
  state->properties.swap(record["properties"]);
  return true;
}

UniqueFd TaskFiles::LockForWriting(const std::string& id) const {
  UniqueFd fd(openat(folder_.get(), LockName(id).c_str(), O_RDWR | O_NOFOLLOW | O_CLOEXEC));
  if (fd && !TakeLock(fd.get(), kWriteByte)) return {};
  return fd;
}

bool TaskFiles::Store(const std::string& id, const TaskState& state) const {
  Json::Value record(Json::objectValue);
  record["version"] = kRecordVersion;
  record["finished"] = state.finished;
  record["properties"] = state.properties;
  const std::string text = JsonText(record, JsonBytes::kRaw);
  if (text.size() > kMaxRecordBytes) {
    errno = EFBIG;
    return false;
  }
  const auto replace = [&] {
    return ReplaceFile(folder_.get(), RecordName(id).c_str(), text, kPrivateMode,
                       /*durable=*/false);
  };
  if (replace()) return true;
  return (errno == ENOSPC || errno == EDQUOT) && FreeReserve(id) && replace();
}

bool TaskFiles::FreeReserve(const std::string& id) const {
  const UniqueFd fd(openat(folder_.get(), LockName(id).c_str(), O_RDWR | O_NOFOLLOW | O_CLOEXEC));
  return fd && ftruncate(fd.get(), 0) == 0;
}

// The record goes first: a writer that gets the lock of a file already gone finds no record.
bool TaskFiles::Remove(const std::string& id) const {
  const UniqueFd lock = LockForWriting(id);
  if (!lock) return false;
  const bool removed = unlinkat(folder_.get(), RecordName(id).c_str(), 0) == 0;
  const int cause = errno;
  if (removed || cause == ENOENT) unlinkat(folder_.get(), LockName(id).c_str(), 0);
  errno = cause;
  return removed;
}

bool TaskFiles::IsUntouched(const std::string& name, time_t now) const {
  struct stat info;
  return fstatat(folder_.get(), name.c_str(), &info, AT_SYMLINK_NOFOLLOW) == 0 &&
         now - info.st_mtime > kKeepSeconds;
}

int TaskFiles::CountRunningAndSweep() const {
  int running = 0;
  const time_t now = time(nullptr);
  for (const std::string& name : NamesIn(folder_.get(), ".").value_or({})) {
    // Each task has a lock file from its first moment to its last.
    const std::string id = IdOf(name, kLockSuffix);
    if (id.empty()) {
      const bool ours = name.starts_with(kTemporaryPrefix) || !IdOf(name, kRecordSuffix).empty();
      if (ours && IsUntouched(name, now) && !IsAlive(IdOf(name, kRecordSuffix))) {
        unlinkat(folder_.get(), name.c_str(), 0);
      }
      continue;
    }
    TaskState state;
    if (IsAlive(id)) {
      if (Load(id, &state) && !state.finished) ++running;
    } else if (IsUntouched(name, now) && (IsUntouched(RecordName(id), now) || !Load(id, &state))) {
      Remove(id);
    }
  }
  return running;
}

}  // namespace nas
