#pragma once
// Polling without haste: pauses that grow, up to a bound on the whole.

#include <ctime>

namespace nas {

class GrowingPause {
 public:
  // `tenths` of a second is the most that all pauses together take.
  explicit GrowingPause(int tenths);
  // Pauses. False, at once, when the bound has passed.
  bool Wait();

 private:
  long long deadline_;  // monotonic, in nanoseconds
  long long pause_;
};

}  // namespace nas
