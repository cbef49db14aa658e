#include "nas/match/query_values.h"

#include <algorithm>
#include <charconv>
#include <string>
#include <vector>

#include "nas/match/folded_name.h"

namespace nas {
namespace {

constexpr std::int64_t kMinute = 60;
constexpr std::int64_t kHour = 60 * kMinute;
constexpr std::int64_t kDay = 24 * kHour;
constexpr int kDaysOfWeek = 7;
constexpr int kMonthsOfYear = 12;
constexpr int kFirstYearOfTm = 1900;
constexpr int kBase = 10;
constexpr size_t kMostDigits = 19;  // of a size or a second
constexpr size_t kMostCountDigits = 9;
constexpr size_t kMostFraction = 6;
// Longer ages are refused: no file system knows them.
constexpr std::int64_t kMostMonths = std::int64_t{2000} * kMonthsOfYear;

bool IsDigits(std::string_view text, size_t most) {
  return !text.empty() && text.size() <= most &&
         text.find_first_not_of("0123456789") == std::string_view::npos;
}

// -1 where they are more than 64 bits hold.
std::int64_t NumberOf(std::string_view digits) {
  std::int64_t number = 0;
  const auto read = std::from_chars(digits.data(), digits.data() + digits.size(), number);
  return read.ec == std::errc::result_out_of_range ? -1 : number;
}

// The number of bits that a size's unit stands for.
std::optional<int> UnitShift(std::string_view unit) {
  if (unit.empty() || unit == "b" || unit == "byte" || unit == "bytes") return 0;
  constexpr std::string_view kUnits = "kmgtp";
  constexpr int kBitsPerUnit = 10;
  const size_t at = kUnits.find(unit.front());
  const std::string_view rest = unit.substr(1);
  if (at == std::string_view::npos || !(rest.empty() || rest == "b" || rest == "ib")) return {};
  return static_cast<int>(at + 1) * kBitsPerUnit;
}

WrittenValue Exactly(std::int64_t value) { return {{value, value}, {value, value}}; }
// A moment alone asks for what came since.
WrittenValue Since(std::int64_t moment) { return {{moment, moment}, {moment, Bounds::kMost}}; }

// A day of the calendar; months and days beyond their ends run on into the next.
struct Date {
  int year = 0;
  int month = 1;
  int day = 1;
  std::int64_t Start() const {
    std::tm local = {};
    local.tm_year = year - kFirstYearOfTm;
    local.tm_mon = month - 1;
    local.tm_mday = day;
    local.tm_isdst = -1;
    return std::mktime(&local);
  }
  Date DaysOn(int days) const { return {year, month, day + days}; }
  // The same day of another month, or that month's last.
  Date MonthsBack(std::int64_t months) const {
    const auto all = static_cast<int>(year * kMonthsOfYear + (month - 1) - months);
    Date moved{all / kMonthsOfYear, all % kMonthsOfYear + 1, day};
    while (moved.day > 1 && !moved.Exists()) --moved.day;
    return moved;
  }
  bool Exists() const {
    std::tm local = {};
    local.tm_year = year - kFirstYearOfTm;
    local.tm_mon = month - 1;
    local.tm_mday = day;
    constexpr int kNoon = 12;  // no change of clocks leads to another day
    local.tm_hour = kNoon;
    local.tm_isdst = -1;
    std::mktime(&local);
    return local.tm_mon == month - 1 && local.tm_mday == day;
  }
};

// From the first day to the last before `end`.
WrittenValue Days(const Date& first, const Date& end) {
  const Bounds bounds{first.Start(), end.Start() - 1};
  return {bounds, bounds};
}
WrittenValue Day(const Date& date) { return Days(date, date.DaysOn(1)); }
// Days up to the present one; alone also what a clock that is ahead has written.
WrittenValue UntilNow(const Date& first, const Date& today) {
  WrittenValue value = Days(first, today.DaysOn(1));
  value.alone.to = Bounds::kMost;
  return value;
}

struct Now {
  std::int64_t second;
  Date today;
  int weekday;  // Monday is 0
};

Now NowOf(std::time_t now) {
  std::tm local = {};
  localtime_r(&now, &local);
  return {now,
          {local.tm_year + kFirstYearOfTm, local.tm_mon + 1, local.tm_mday},
          (local.tm_wday + kDaysOfWeek - 1) % kDaysOfWeek};
}

enum class Unit { kSeconds, kMinutes, kHours, kDays, kWeeks, kMonths, kYears };

std::optional<Unit> UnitOf(std::string_view word) {
  static constexpr struct {
    Unit unit;
    std::string_view words[5];
  } kUnits[] = {
      {Unit::kSeconds, {"s", "sec", "secs", "second", "seconds"}},
      {Unit::kMinutes, {"m", "min", "mins", "minute", "minutes"}},
      {Unit::kHours, {"h", "hr", "hrs", "hour", "hours"}},
      {Unit::kDays, {"d", "day", "days"}},
      {Unit::kWeeks, {"w", "wk", "wks", "week", "weeks"}},
      {Unit::kMonths, {"mo", "mon", "month", "months"}},
      {Unit::kYears, {"y", "yr", "yrs", "year", "years"}},
  };
  if (word.empty()) return {};
  for (const auto& unit : kUnits) {
    if (std::ranges::find(unit.words, word) != std::end(unit.words)) return unit.unit;
  }
  return {};
}

// So many units before now: a second, and the day that it lies in.
struct Before {
  std::int64_t second;
  Date day;
};

std::optional<Before> Ago(std::int64_t count, Unit unit, const Now& now) {
  const auto seconds = [&](std::int64_t each) -> std::optional<Before> {
    if (count > kMostMonths * 31 * kDay / each) return {};
    const std::int64_t second = now.second - count * each;
    return Before{second, NowOf(second).today};
  };
  const auto days = [&](std::int64_t each) -> std::optional<Before> {
    if (count > kMostMonths * 31 / each) return {};
    return Before{now.second - count * each * kDay,
                  now.today.DaysOn(-static_cast<int>(count * each))};
  };
  const auto months = [&](std::int64_t each) -> std::optional<Before> {
    if (count > kMostMonths / each) return {};
    const Date day = now.today.MonthsBack(count * each);
    return Before{day.Start() + (now.second - now.today.Start()), day};
  };
  switch (unit) {
    case Unit::kSeconds:
      return seconds(1);
    case Unit::kMinutes:
      return seconds(kMinute);
    case Unit::kHours:
      return seconds(kHour);
    case Unit::kDays:
      return days(1);
    case Unit::kWeeks:
      return days(kDaysOfWeek);
    case Unit::kMonths:
      return months(1);
    case Unit::kYears:
      return months(kMonthsOfYear);
  }
  return {};
}

std::optional<WrittenValue> NamedTime(std::string_view words, const Now& now) {
  const Date& today = now.today;
  const Date month{today.year, today.month, 1};
  const Date week = today.DaysOn(-now.weekday);
  if (words == "now") return Since(now.second);
  if (words == "today") return UntilNow(today, today);
  if (words == "yesterday") return Day(today.DaysOn(-1));
  if (words == "this-week") return UntilNow(week, today);
  if (words == "this-month") return UntilNow(month, today);
  if (words == "this-year") return UntilNow({today.year, 1, 1}, today);
  if (words == "last-week") return Days(week.DaysOn(-kDaysOfWeek), week);
  if (words == "last-month") return Days(month.MonthsBack(1), month);
  if (words == "last-year") return Days({today.year - 1, 1, 1}, {today.year, 1, 1});
  if (words == "before-last-year") {
    const Bounds bounds{Bounds::kLeast, Date{today.year - 1, 1, 1}.Start() - 1};
    return WrittenValue{bounds, bounds};
  }
  return {};
}

// "last-7-days", "2-weeks-ago", "7-days", "7d", "7d-ago".
std::optional<WrittenValue> RelativeTime(std::string_view words, const Now& now) {
  const bool last = words.starts_with("last-");
  if (last) words.remove_prefix(std::string_view("last-").size());
  const bool ago = !last && words.ends_with("-ago");
  if (ago) words.remove_suffix(std::string_view("-ago").size());
  const size_t digits = std::min(words.find_first_not_of("0123456789"), words.size());
  if (!IsDigits(words.substr(0, digits), kMostCountDigits)) return {};
  const std::int64_t count = NumberOf(words.substr(0, digits));
  words.remove_prefix(digits);
  if (words.starts_with('-')) words.remove_prefix(1);
  const std::optional<Unit> unit = UnitOf(words);
  if (!unit || (last && count == 0)) return {};
  const std::optional<Before> before = Ago(count, *unit, now);
  if (!before) return {};
  if (*unit < Unit::kDays || !(last || ago)) return Since(before->second);
  if (ago) return Day(before->day);
  // The days that end with the present one.
  return UntilNow(*unit <= Unit::kWeeks ? before->day.DaysOn(1) : before->day, now.today);
}

// A year, a month, a day, or a second of one.
std::optional<WrittenValue> CalendarTime(std::string_view text) {
  constexpr size_t kYearDigits = 4;
  constexpr size_t kOthers = 2;
  std::vector<int> numbers;
  const std::string_view separators = "--t::";
  size_t at = 0;
  for (;;) {
    const size_t digits = numbers.empty() ? kYearDigits : kOthers;
    if (at + digits > text.size() || !IsDigits(text.substr(at, digits), digits)) return {};
    numbers.push_back(static_cast<int>(NumberOf(text.substr(at, digits))));
    at += digits;
    if (at == text.size()) break;
    if (numbers.size() > separators.size() || text[at++] != separators[numbers.size() - 1]) {
      return {};
    }
  }
  const auto number = [&](size_t i, int otherwise) {
    return i < numbers.size() ? numbers[i] : otherwise;
  };
  const Date date{number(0, 0), number(1, 1), number(2, 1)};
  enum { kYear = 1, kMonth, kDate, kHourAlone, kToMinute, kToSecond };
  if (date.year < 1 || !date.Exists() || numbers.size() == kHourAlone) return {};
  if (numbers.size() == kYear) return Days(date, {date.year + 1, 1, 1});
  if (numbers.size() == kMonth) return Days(date, {date.year, date.month + 1, 1});
  if (numbers.size() == kDate) return Day(date);
  std::tm local = {};
  local.tm_year = date.year - kFirstYearOfTm;
  local.tm_mon = date.month - 1;
  local.tm_mday = date.day;
  local.tm_hour = number(3, 0);
  local.tm_min = number(4, 0);
  local.tm_sec = number(5, 0);
  local.tm_isdst = -1;
  if (local.tm_hour >= kDay / kHour || local.tm_min >= kMinute || local.tm_sec > kMinute) return {};
  const std::int64_t second = std::mktime(&local);
  const bool whole_minute = numbers.size() == kToMinute;
  return WrittenValue{{second, second}, {second, second + (whole_minute ? kMinute - 1 : 0)}};
}

// Words joined by one "-" each, in small letters.
std::string Joined(std::string_view text) {
  std::string joined;
  for (const char c : AsciiLower(text)) {
    const bool separates = c == ' ' || c == '_' || c == '-';
    if (!separates) {
      joined.push_back(c);
    } else if (!joined.empty() && joined.back() != '-') {
      joined.push_back('-');
    }
  }
  while (joined.ends_with('-')) joined.pop_back();
  return joined;
}

std::string_view Trimmed(std::string_view text) {
  const size_t from = std::min(text.find_first_not_of(' '), text.size());
  text.remove_prefix(from);
  return text.substr(0, text.find_last_not_of(' ') + 1);
}

}  // namespace

std::optional<WrittenValue> ReadSize(std::string_view text) {
  const std::string lowered = AsciiLower(Trimmed(text));
  const std::string_view all = lowered;
  const size_t number_end = std::min(all.find_first_not_of("0123456789.,"), all.size());
  const std::string_view number = all.substr(0, number_end);
  const size_t point = std::min(number.find_first_of(".,"), number.size());
  const std::string_view whole = number.substr(0, point);
  const std::string_view fraction = number.substr(std::min(point + 1, number.size()));
  const std::optional<int> shift = UnitShift(Trimmed(all.substr(number_end)));
  const bool has_fraction = point < number.size();
  if (!shift || !(whole.empty() ? has_fraction : IsDigits(whole, kMostDigits))) return {};
  if (has_fraction && (*shift == 0 || !IsDigits(fraction, kMostFraction))) return {};
  if (NumberOf(whole) < 0 || NumberOf(whole) > Bounds::kMost >> *shift) return {};
  using Wide = unsigned __int128;  // 63 bits and six digits more
  Wide scale = 1;
  for (size_t i = 0; i < fraction.size(); ++i) scale *= kBase;
  const Wide unit = Wide{1} << *shift;
  const Wide written = static_cast<Wide>(NumberOf(whole)) * scale +
                       static_cast<Wide>(has_fraction ? NumberOf(fraction) : 0);
  const Wide bytes = (written * unit + scale / 2) / scale;
  const Wide half = unit / (2 * scale);  // of its last digit
  constexpr Wide kMost = Bounds::kMost;
  if (bytes > kMost) return {};
  WrittenValue value = Exactly(static_cast<std::int64_t>(bytes));
  if (half == 0) return value;
  value.alone.from -= static_cast<std::int64_t>(std::min(bytes, half));
  value.alone.to = static_cast<std::int64_t>(std::min(bytes + half - 1, kMost));
  return value;
}

std::optional<WrittenValue> ReadTime(std::string_view text, std::time_t now) {
  constexpr size_t kYearDigits = 4;
  const std::string words = Joined(Trimmed(text));
  if (const auto calendar = CalendarTime(words); calendar) return calendar;
  if (IsDigits(words, kMostDigits)) {
    // Four digits are a year.
    const std::int64_t second = NumberOf(words);
    if (words.size() == kYearDigits || second < 0) return {};
    return Exactly(second);
  }
  const Now present = NowOf(now);
  const auto named = NamedTime(words, present);
  return named ? named : RelativeTime(words, present);
}

std::optional<WrittenValue> ReadNumber(std::string_view text) {
  if (!IsDigits(text, kMostCountDigits)) return {};
  return Exactly(NumberOf(text));
}

std::optional<Bounds> ReadBounds(std::string_view text, const ValueReader& reader) {
  Bounds bounds;
  const auto read = [&](std::string_view part) { return reader(Trimmed(part)); };
  if (text.starts_with('>') || text.starts_with('<')) {
    const bool above = text.starts_with('>');
    const bool inclusive = text.substr(1).starts_with('=');
    const auto value = read(text.substr(inclusive ? 2 : 1));
    if (!value) return {};
    if (above) {
      if (!inclusive && value->span.to == Bounds::kMost) return {};
      bounds.from = inclusive ? value->span.from : value->span.to + 1;
    } else {
      if (!inclusive && value->span.from == Bounds::kLeast) return {};
      bounds.to = inclusive ? value->span.to : value->span.from - 1;
    }
    return bounds;
  }
  const size_t dots = text.find("..");
  if (dots == std::string_view::npos) {
    const auto value = read(text);
    return value ? std::optional(value->alone) : std::nullopt;
  }
  const std::string_view first = text.substr(0, dots);
  const std::string_view last = text.substr(dots + 2);
  if (first.empty() && last.empty()) return {};
  const auto from = first.empty() ? WrittenValue() : read(first);
  const auto to = last.empty() ? WrittenValue() : read(last);
  if (!from || !to) return {};
  bounds = {from->span.from, to->span.to};
  return bounds.from <= bounds.to ? std::optional(bounds) : std::nullopt;
}

}  // namespace nas
