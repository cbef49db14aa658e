// Sizes, times and shares as people write them.

#include <chrono>
#include <cstdlib>

#include "arbory/options.h"
#include "arbory/parse.h"
#include "tests/fuzz/fuzz.h"

namespace {

using arbory::Bound;

constexpr std::time_t kNow = 1'700'000'000;

// What is no size is told in a sentence that names it.
template <typename Parse>
std::optional<std::int64_t> Parsed(const std::string& text, Parse parse) {
  try {
    return parse();
  } catch (const arbory::UsageError& error) {
    DEMAND(std::string(error.what()).find(text) != std::string::npos);
    return {};
  }
}

// The seconds of a day that there is, or one second.
void CheckTime(const std::string& text) {
  const auto from = Parsed(text, [&] { return arbory::ParseTime(text, Bound::kFrom, kNow); });
  const auto to = Parsed(text, [&] { return arbory::ParseTime(text, Bound::kTo, kNow); });
  if (!from || !to) return;
  DEMAND(*from >= INT32_MIN && *from <= INT32_MAX && *to >= *from && *to <= INT32_MAX);
  constexpr size_t kDateBytes = 10;
  int year = 0;
  unsigned month = 0, day = 0;
  if (text.size() != kDateBytes || sscanf(text.c_str(), "%4d-%2u-%2u", &year, &month, &day) != 3) {
    DEMAND(*from == *to);
    return;
  }
  const std::chrono::year_month_day date{std::chrono::year(year), std::chrono::month(month),
                                         std::chrono::day(day)};
  const std::chrono::sys_seconds begin = std::chrono::sys_days(date);
  DEMAND(date.ok() && *from == begin.time_since_epoch().count());
  DEMAND(*to == *from + 24 * 60 * 60 - 1);
}

void CheckSize(const std::string& text) {
  const auto bytes = Parsed(text, [&] { return arbory::ParseSize(text); });
  if (!bytes) return;
  // Dividing by the unit gives the number back.
  char* end = nullptr;
  const long long number = std::strtoll(text.c_str(), &end, 10);
  const size_t power = *end == '\0' ? 0 : std::string_view("bkmgtp").find(std::tolower(*end));
  DEMAND(number >= 0 && power != std::string_view::npos && *bytes >> (10 * power) == number);
}

void CheckShare(const std::string& text) {
  try {
    const nas::ShareSetting share = arbory::ParseShare(text);
    DEMAND(!share.name.empty() && share.directory.starts_with('/'));
    DEMAND(text.starts_with(share.name + "="));
  } catch (const arbory::UsageError&) {
    const size_t equals = text.find('=');
    DEMAND(equals == 0 || equals == std::string::npos || equals + 1 == text.size());
  }
}

}  // namespace

int fuzz::Target(std::string_view input) {
  static const int utc = setenv("TZ", "UTC", 1);
  (void)utc;
  const std::string text(input);
  // Arguments end at a NUL.
  if (text.find('\0') != std::string::npos) return fuzz::kUseless;
  CheckSize(text);
  CheckTime(text);
  CheckShare(text);
  return fuzz::kUsed;
}
