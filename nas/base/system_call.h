#pragma once
// System calls that a signal may interrupt.

#include <cerrno>

namespace nas {

// Makes the system call again until no signal interrupts it, and returns its result. For signals
// that tell nothing to the caller; a wait that a signal is meant to end looks at EINTR itself.
template <typename Call>
auto Uninterrupted(const Call& call) {
  for (;;) {
    const auto result = call();
    if (result >= 0 || errno != EINTR) return result;
  }
}

}  // namespace nas
