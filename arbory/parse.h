#pragma once
// Values as people write them on a command line or in a form. Each throws UsageError with a
// sentence that names the text and the forms that are understood.

#include <cstdint>
#include <ctime>
#include <string>
#include <string_view>

#include "nas/match/query_values.h"
#include "nas/system/config.h"

namespace arbory {

// A size of nas/match/query_values.h.
std::int64_t ParseSize(const std::string& text);

enum class Bound { kFrom, kTo };
// A time of nas/match/query_values.h, as seconds since the epoch: what has a length, as a day, is
// its first second as a lower bound and its last as an upper one. Refuses what a search cannot
// compare, before 1901-12-13 or after 2038-01-19.
std::int64_t ParseTime(const std::string& text, Bound bound, std::time_t now);
// One pair of bounds as they stand behind "modified:" in a query. What a search cannot compare is
// refused where nothing could lie between them.
nas::Bounds ParseTimeBounds(const std::string& text, std::time_t now);

// NAME=DIR, the directory made absolute.
nas::ShareSetting ParseShare(const std::string& text);

}  // namespace arbory
