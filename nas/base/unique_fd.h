#pragma once
// Owner of one file descriptor, and opening below a folder. Both are as thin as the system calls
// they stand for: a descriptor that could not be had is an invalid UniqueFd, with errno set.

#include <unistd.h>

#include <utility>

namespace nas {

// Closes its descriptor when it goes. Invalid, with -1 for a descriptor, when it owns none.
class UniqueFd {
 public:
  UniqueFd() = default;
  explicit UniqueFd(int fd) : fd_(fd) {}
  ~UniqueFd() { Reset(); }
  UniqueFd(UniqueFd&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  UniqueFd& operator=(UniqueFd&& other) noexcept {
    if (this != &other) Reset(std::exchange(other.fd_, -1));
    return *this;
  }

  int get() const { return fd_; }
  explicit operator bool() const { return fd_ >= 0; }
  // The descriptor is the caller's from here on.
  int Release() { return std::exchange(fd_, -1); }
  // Closes what it held; errno stays as it was.
  void Reset(int fd = -1);

 private:
  int fd_ = -1;
};

// openat2 with O_CLOEXEC; `resolve` is of the RESOLVE_* flags of <linux/openat2.h>. Tried again
// after a pause where a folder was moved on the way, or where somebody who holds a lease on the
// file has been told to let go, which the kernel enforces in the end.
UniqueFd OpenAt2(int dir_fd, const char* path, int flags, unsigned long long resolve);

}  // namespace nas
