#pragma once
// A point in time by which something must be done.

#include <algorithm>
#include <chrono>

namespace nas {

class Deadline {
 public:
  // So many milliseconds from now; less than 0: never.
  explicit Deadline(int milliseconds)
      : never_(milliseconds < 0),
        end_(Clock::now() + std::chrono::milliseconds(std::max(milliseconds, 0))) {}

  // As poll(2) takes it: -1 for never, 0 once it has passed, never 0 before.
  int left_ms() const {
    if (never_) return -1;
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(end_ - Clock::now()).count();
    return static_cast<int>(std::max<decltype(left)>(left, 0));
  }
  bool passed() const { return left_ms() == 0; }

 private:
  using Clock = std::chrono::steady_clock;
  bool never_;
  Clock::time_point end_;
};

}  // namespace nas
