#pragma once
// Sizes, times and numbers as people write them: the one grammar for what stands behind a prefix of
// a query, for the options of a terminal and for the fields of a form. Letter case is ignored. None
// of this fails otherwise than by an empty optional; any thread may call.
//
//   size    500, 20k, 20 KB, 1.5GB, 3MiB: units are 1024-based
//   day     2026-07-15, 2026-07 (the month), 2026 (the year), today, yesterday, 3 days ago,
//           this-week, last-month, last-year, ... , before-last-year
//   since   last-7-days (today is one of them), last 3 months; an age: 30m, 12h, 7d, 2 weeks
//   second  2026-07-15T12:30[:15], now, 5 minutes ago, seconds since 1970 (four digits are a year)
//   bounds  VALUE, >VALUE, >=VALUE, <VALUE, <=VALUE, VALUE..VALUE, VALUE.., ..VALUE
//
// Words of a time may be joined by "-" or by spaces. Days are those of the process's time zone.

#include <cstdint>
#include <ctime>
#include <functional>
#include <limits>
#include <optional>
#include <string_view>

namespace nas {

// Both inclusive.
struct Bounds {
  static constexpr std::int64_t kLeast = std::numeric_limits<std::int64_t>::min();
  static constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();
  std::int64_t from = kLeast;
  std::int64_t to = kMost;
  bool Hold(std::int64_t value) const { return from <= value && value <= to; }
  friend bool operator==(const Bounds&, const Bounds&) = default;
};

struct WrittenValue {
  Bounds span;   // what it is as an end of bounds: a day from its first second to its last
  Bounds alone;  // what it asks for by itself: "1.5GB" what is shown as that, "7d" what came since
};

std::optional<WrittenValue> ReadSize(std::string_view text);
std::optional<WrittenValue> ReadTime(std::string_view text, std::time_t now);
// Nine digits at most.
std::optional<WrittenValue> ReadNumber(std::string_view text);

using ValueReader = std::function<std::optional<WrittenValue>(std::string_view)>;
// Bounds of values that `reader` reads; empty ones (5..3) are none.
std::optional<Bounds> ReadBounds(std::string_view text, const ValueReader& reader);

}  // namespace nas
