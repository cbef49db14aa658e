#pragma once
// Locks on single bytes of files, as open file descriptions own them: they last until the last
// descriptor of the opening is closed, in whichever process that is.

#include <fcntl.h>

namespace nas {

// What fcntl(2) with F_OFD_SETLK and F_OFD_GETLK takes for a write lock on that byte alone.
inline struct flock WriteLockOn(off_t byte) {
  struct flock lock = {};
  lock.l_type = F_WRLCK;
  lock.l_whence = SEEK_SET;
  lock.l_start = byte;
  lock.l_len = 1;
  return lock;
}

}  // namespace nas
