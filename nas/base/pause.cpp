#include "nas/base/pause.h"

#include <algorithm>
#include <ctime>

namespace nas {
namespace {

constexpr long long kNanosecondsPerSecond = 1'000'000'000;
constexpr long long kNanosecondsPerMillisecond = kNanosecondsPerSecond / 1000;
// The first is about what a write takes; the last is below what a person notices.
constexpr long long kFirstPause = 500'000;
constexpr long long kLongestPause = 20'000'000;
// Each pause is longer than the one before by a fourth of that: what has taken a while is seen
// after a fifth more at most.
constexpr long long kGrowth = 4;

long long Now() {
  timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  return now.tv_sec * kNanosecondsPerSecond + now.tv_nsec;
}

// A signal may end it early: the caller then looks once more than needed.
void Sleep(long long nanoseconds) {
  const timespec length = {static_cast<time_t>(nanoseconds / kNanosecondsPerSecond),
                           static_cast<long>(nanoseconds % kNanosecondsPerSecond)};
  nanosleep(&length, nullptr);
}

}  // namespace

GrowingPause::GrowingPause(std::chrono::milliseconds most)
    : deadline_(Now() + std::max<long long>(most.count(), 0) * kNanosecondsPerMillisecond),
      pause_(kFirstPause) {}

bool GrowingPause::Wait() {
  const long long left = deadline_ - Now();
  if (left <= 0) return false;
  Sleep(std::min(pause_, left));
  pause_ = std::min(pause_ + pause_ / kGrowth, kLongestPause);
  return true;
}

bool GrowingPause::Wait(const std::function<bool()>& over) {
  const long long begun = Now();
  if (begun >= deadline_) return false;
  const long long end = std::min(begun + pause_, deadline_);
  do {
    Sleep(kFirstPause);
  } while (!over() && Now() < end);
  pause_ = std::min(pause_ + pause_ / kGrowth, kLongestPause);
  return true;
}

}  // namespace nas
