#pragma once
// Values as people write them on a command line. Each throws UsageError with a sentence that names
// the text and the forms that are understood.

#include <cstdint>
#include <ctime>
#include <string>
#include <string_view>

#include "nas/system/config.h"

namespace arbory {

// Bytes, or a number with k, M, G, T or P of either case (1024-based, "B" or "iB" may follow).
std::int64_t ParseSize(const std::string& text);

enum class Bound { kFrom, kTo };
// Seconds since the epoch; a date or a date with a time, both local; or an age before `now` in s, m
// (minutes), h, d or w. A date without a time is its first second as a lower bound and its last as
// an upper one. Refuses what a search cannot compare, before 1901-12-13 or after 2038-01-19.
std::int64_t ParseTime(const std::string& text, Bound bound, std::time_t now);

// NAME=DIR, the directory made absolute.
nas::ShareSetting ParseShare(const std::string& text);

}  // namespace arbory
