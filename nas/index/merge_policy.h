#pragma once
// When a table is made anew from what has changed. Each change costs every search a look-up, each
// new tree a walk; each making costs a second of a processor and a writing of the table for every
// million entries. So it is due when changes have come together, and paced by what the last one
// took.

#include <chrono>
#include <optional>

#include "nas/index/hints.h"

namespace nas {

class MergePolicy {
 public:
  using Clock = std::chrono::steady_clock;

  // A table was made, or the attempt failed, after `took`.
  void Made(Clock::time_point now, Clock::duration took);
  // When the table is due, with these changes; nothing where none is worth it.
  std::optional<Clock::time_point> Due(const Hints& hints, const NameTable& table,
                                       std::chrono::minutes at_most) const;

 private:
  Clock::time_point made_ = Clock::now();
  Clock::duration took_ = {};
};

}  // namespace nas
