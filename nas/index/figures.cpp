#include "nas/index/figures.h"

#include <algorithm>
#include <cstring>

#include "nas/index/client.h"

namespace nas {

std::string StateWords(const Figures& figures) {
  // Never "100 %" of something that is not done, as what is expected is an estimate.
  constexpr std::uint64_t kWhole = 100;
  switch (figures.state.load()) {
    case IndexState::kStarting:
      return "starting";
    case IndexState::kBuilding: {
      const std::uint64_t expected = figures.expected;
      if (expected == 0) return "building";
      const std::uint64_t percent =
          std::min(figures.progress.entries * kWhole / expected, kWhole - 1);
      return "building " + std::to_string(percent) + " %";
    }
    case IndexState::kNames:
    case IndexState::kCurrent:
      return std::string(kIndexCurrent);
    case IndexState::kBehind:
      return "behind";
    case IndexState::kUnavailable:
      break;
  }
  return std::string("not indexed: ") + std::strerror(figures.error);
}

}  // namespace nas
