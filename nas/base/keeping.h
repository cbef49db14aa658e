#pragma once
// How long what a client left behind is kept.

#include <ctime>

namespace nas {

// A search's record and its result file live equally long: one without the other is of no use.
inline constexpr std::time_t kKeepSeconds = std::time_t{24} * 60 * 60;

}  // namespace nas
