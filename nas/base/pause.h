#pragma once
// Polling without haste: pauses that grow from half a millisecond to twenty, up to a bound on the
// whole. For what nobody announces, such as a change of a file by another process.

#include <chrono>
#include <functional>

namespace nas {

// For one wait of one thread.
class GrowingPause {
 public:
  // The bound begins now and counts what the caller does between pauses too. 0 or less: no pause at
  // all.
  explicit GrowingPause(std::chrono::milliseconds most);
  // The same, as the platform's waits are bounded.
  explicit GrowingPause(int tenths) : GrowingPause(std::chrono::milliseconds(100) * tenths) {}
  // Sleeps, less long where a signal comes. False, at once, when the bound has passed; the caller
  // has then looked for the last time.
  bool Wait();
  // The same, and at once when `over` says so, which is to cost next to nothing: it is asked every
  // half a millisecond.
  bool Wait(const std::function<bool()>& over);

 private:
  long long deadline_;  // monotonic, in nanoseconds
  long long pause_;     // the next one, in nanoseconds
};

}  // namespace nas
