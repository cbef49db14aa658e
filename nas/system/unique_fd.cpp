#include "nas/system/unique_fd.h"

#include <cerrno>

namespace nas {

void UniqueFd::Reset(int fd) {
  if (fd_ >= 0) {
    const int saved = errno;
    close(fd_);
    errno = saved;
  }
  fd_ = fd;
}

}  // namespace nas
