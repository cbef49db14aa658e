// Sizes, times and shares as people write them.

#include <array>
#include <charconv>
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

// Days from 1970 to a date of the proleptic calendar, counted one month after the other.
std::int64_t DaysTo(int year, int month, int day) {
  const auto leap = [](int y) { return (y % 4 == 0 && y % 100 != 0) || y % 400 == 0; };
  std::int64_t days = day - 1;
  for (int y = 1970; y < year; ++y) days += leap(y) ? 366 : 365;
  for (int y = year; y < 1970; ++y) days -= leap(y) ? 366 : 365;
  constexpr std::array kDays = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  for (int m = 1; m < month; ++m) days += kDays[m - 1] + (m == 2 && leap(year) ? 1 : 0);
  return days;
}

void CheckDate(const std::string& text, std::int64_t from, std::int64_t to) {
  constexpr std::int64_t kDay = 24 * 60 * 60;
  int year = 0;
  int month = 0;
  int day = 0;
  int end = 0;
  if (text.size() != 10 ||
      std::sscanf(text.c_str(), "%4d-%2d-%2d%n", &year, &month, &day, &end) != 3 || end != 10) {
    DEMAND(from == to);
    return;
  }
  DEMAND(from == DaysTo(year, month, day) * kDay);
  DEMAND(to == from + kDay - 1);
}

void CheckTime(const std::string& text) {
  const auto from = Parsed(text, [&] { return arbory::ParseTime(text, Bound::kFrom, kNow); });
  const auto to = Parsed(text, [&] { return arbory::ParseTime(text, Bound::kTo, kNow); });
  if (!from || !to) return;
  DEMAND(*from >= INT32_MIN && *from <= INT32_MAX && *to >= *from && *to <= INT32_MAX);
  if (text.find('-') != std::string::npos && text.find('T') == std::string::npos) {
    CheckDate(text, *from, *to);
  } else {
    DEMAND(*from == *to);
  }
}

void CheckSize(const std::string& text) {
  const auto bytes = Parsed(text, [&] { return arbory::ParseSize(text); });
  if (!bytes) return;
  std::int64_t number = 0;
  const char* end = std::from_chars(text.data(), text.data() + text.size(), number).ptr;
  DEMAND(end != text.data() && number >= 0 && *bytes >= number);
  // Dividing by the unit gives the number back.
  const char unit = end == text.data() + text.size() ? 'b' : *end;
  const size_t power = std::string_view("bkmgtp").find(static_cast<char>(std::tolower(unit)));
  DEMAND(power != std::string_view::npos && *bytes >> (10 * power) == number);
  DEMAND(arbory::ParseSize(std::to_string(*bytes)) == *bytes);
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

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const int utc = [] {
    setenv("TZ", "UTC", 1);
    return 0;
  }();
  (void)utc;
  const std::string text(fuzz::Text(data, size));
  // Arguments end at a NUL.
  if (text.find('\0') != std::string::npos) return fuzz::kUseless;
  CheckSize(text);
  CheckTime(text);
  CheckShare(text);
  return fuzz::kUsed;
}
