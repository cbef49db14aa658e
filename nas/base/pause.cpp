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

}  // namespace

GrowingPause::GrowingPause(std::chrono::milliseconds most)
    : deadline_(Now() + std::max<long long>(most.count(), 0) * kNanosecondsPerMillisecond),
      pause_(kFirstPause) {}

bool GrowingPause::Wait() {
  const long long left = deadline_ - Now();
  if (left <= 0) return false;
  const long long pause = std::min(pause_, left);
  const timespec length = {static_cast<time_t>(pause / kNanosecondsPerSecond),
                           static_cast<long>(pause % kNanosecondsPerSecond)};
  // A signal may end it early: the caller then looks once more than needed.
  nanosleep(&length, nullptr);
  pause_ = std::min(pause_ + pause_ / kGrowth, kLongestPause);
  return true;
}

}  // namespace nas
