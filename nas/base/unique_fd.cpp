#include "nas/base/unique_fd.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>

#include <cerrno>
#include <chrono>
#include <thread>

#include "nas/base/system_call.h"

namespace nas {
namespace {

// Far longer than a rename on the way takes, and far shorter than a person waits.
constexpr std::chrono::milliseconds kRetryPause(5);

}  // namespace

void UniqueFd::Reset(int fd) {
  if (fd_ >= 0) {
    const int saved = errno;
    close(fd_);
    errno = saved;
  }
  fd_ = fd;
}

UniqueFd OpenAt2(int dir_fd, const char* path, int flags, unsigned long long resolve) {
  open_how how{};
  how.flags = static_cast<unsigned long long>(flags | O_CLOEXEC);
  how.resolve = resolve;
  for (;;) {
    UniqueFd fd(static_cast<int>(
        Uninterrupted([&] { return syscall(SYS_openat2, dir_fd, path, &how, sizeof how); })));
    if (fd || errno != EAGAIN) return fd;
    std::this_thread::sleep_for(kRetryPause);
  }
}

}  // namespace nas
