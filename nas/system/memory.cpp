#include "nas/system/memory.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <cerrno>
#include <utility>

#include "nas/base/file_lock.h"
#include "nas/base/pause.h"
#include "nas/base/unique_fd.h"
#include "nas/system/config.h"
#include "nas/system/user_state.h"

namespace nas {
namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kCanLimit = false;
#else
constexpr bool kCanLimit = true;
#endif
constexpr char kPermits[] = "/large";

// Guard: of a process with one thread, as request children are.
UniqueFd g_permit;

bool IsLimited() {
  rlimit limit;
  return getrlimit(RLIMIT_DATA, &limit) == 0 && limit.rlim_cur != limit.rlim_max;
}

}  // namespace

void LimitMemory(std::uint64_t bytes) {
  rlimit limit;
  if (!kCanLimit || getrlimit(RLIMIT_DATA, &limit) != 0) return;
  if (bytes < limit.rlim_max) limit.rlim_cur = bytes;
  setrlimit(RLIMIT_DATA, &limit);
}

void LiftMemoryLimit() {
  rlimit limit;
  if (getrlimit(RLIMIT_DATA, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_DATA, &limit);
}

Status TakeLargePermit(const std::string& user) {
  if (g_permit || !IsLimited()) return {};
  const std::string path = TaskFolder(user) + kPermits;
  UniqueFd permit(open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
  if (!permit) return ErrnoError(path);
  GrowingPause pause(kPermitTenths);
  do {
    for (int byte = 0; byte < CurrentConfig().large_calls_per_user; ++byte) {
      struct flock lock = WriteLockOn(byte);
      if (fcntl(permit.get(), F_OFD_SETLK, &lock) != 0) continue;
      LimitMemory(CurrentConfig().large_call_memory_bytes());
      g_permit = std::move(permit);
      return {};
    }
  } while (pause.Wait());
  return ErrnoError(EBUSY, path);
}

}  // namespace nas
