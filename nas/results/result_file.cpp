#include "nas/results/result_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <ctime>
#include <system_error>
#include <utility>
#include <vector>

#include "nas/base/file_lock.h"
#include "nas/base/keeping.h"
#include "nas/base/paths.h"
#include "nas/base/random_name.h"

namespace nas {
namespace {

constexpr std::string_view kSuffix = ".db";
constexpr char kLogSuffix[] = "-wal";
// Files once had a journal until they got their log; who was killed early left one.
constexpr std::array<const char*, 4> kCompanions = {"", kLogSuffix, "-shm", "-journal"};

// The file and what there may be beside it.
std::vector<std::string> PartsOf(const std::string& path) {
  std::vector<std::string> parts;
  for (const char* companion : kCompanions) parts.push_back(path + companion);
  return parts;
}

// When the result file or its log was last written; 0 when neither is there.
time_t LastWritten(const std::string& path) {
  time_t newest = 0;
  for (const std::string& part : PartsOf(path)) {
    struct stat status;
    if (stat(part.c_str(), &status) == 0) newest = std::max(newest, status.st_mtime);
  }
  return newest;
}

// Beyond every byte of a database, those that SQLite locks among them.
constexpr off_t kClaimByte = off_t{1} << 60;

// What cannot be asked counts as claimed.
bool IsClaimed(const std::string& path) {
  const UniqueFd file(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  if (!file) return errno != ENOENT;
  struct flock lock = WriteLockOn(kClaimByte);
  return fcntl(file.get(), F_OFD_GETLK, &lock) != 0 || lock.l_type != F_UNLCK;
}

}  // namespace

ResultClaim::ResultClaim(const std::string& path)
    : file_(open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                 S_IRUSR | S_IWUSR)) {
  struct flock lock = WriteLockOn(kClaimByte);
  if (!file_ || fcntl(file_.get(), F_OFD_SETLK, &lock) != 0) {
    throw std::system_error(errno, std::generic_category(), path);
  }
}

ResultWatch::ResultWatch(const std::string& path) : log_(path + kLogSuffix), seen_(Look()) {}

ResultWatch::Stamp ResultWatch::Look() const {
  struct stat status = {};
  if (stat(log_.c_str(), &status) != 0) return {};
  return {status.st_size, status.st_mtim.tv_sec, status.st_mtim.tv_nsec};
}

bool ResultWatch::Changed() {
  const Stamp before = std::exchange(seen_, Look());
  return before != seen_;
}

std::string NewResultId() { return RandomName(); }

bool IsResultId(std::string_view id) { return IsRandomName(id); }

std::string ResultPath(const std::string& folder, const std::string& id) {
  return folder + "/" + id + std::string(kSuffix);
}

std::uint64_t ResultFileBytes(const std::string& path) {
  std::uint64_t bytes = 0;
  for (const std::string& part : {path, path + kLogSuffix}) {
    struct stat status;
    if (stat(part.c_str(), &status) == 0) bytes += static_cast<std::uint64_t>(status.st_size);
  }
  return bytes;
}

bool IsResultFileThere(const std::string& path) {
  const auto there = [](const std::string& part) { return access(part.c_str(), F_OK) == 0; };
  return std::ranges::any_of(PartsOf(path), there);
}

bool RemoveResultFile(const std::string& path) {
  // Made first: who has no memory for the names removes none of them.
  const std::vector<std::string> parts = PartsOf(path);
  bool removed = false;
  bool left = false;
  for (const std::string& part : parts) {
    if (unlink(part.c_str()) == 0) {
      removed = true;
    } else if (errno != ENOENT) {
      left = true;
    }
  }
  return removed && !left;
}

void SweepResultFolder(const std::string& folder) {
  const time_t oldest_kept = time(nullptr) - kKeepSeconds;
  for (const std::string& entry : NamesIn(AT_FDCWD, folder).value_or({})) {
    std::string_view name = entry;
    // A companion can be all that is left: a reader makes one anew while the file is deleted.
    for (const std::string_view companion : kCompanions) {
      if (name.ends_with(companion)) name.remove_suffix(companion.size());
    }
    if (!name.ends_with(kSuffix) || !IsResultId(name.substr(0, name.size() - kSuffix.size()))) {
      continue;
    }
    const std::string path = folder + "/" + std::string(name);
    if (LastWritten(path) < oldest_kept && !IsClaimed(path)) RemoveResultFile(path);
  }
}

}  // namespace nas
