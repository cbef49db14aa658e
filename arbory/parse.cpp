#include "arbory/parse.h"

#include <cctype>
#include <charconv>
#include <filesystem>
#include <optional>

#include "arbory/options.h"

namespace arbory {
namespace {

constexpr std::int64_t kMinute = 60;
constexpr std::int64_t kHour = 60 * kMinute;
constexpr std::int64_t kDay = 24 * kHour;
constexpr std::int64_t kWeek = 7 * kDay;

// The digits that `text` begins with, taken off it. Nothing when there are none or they overflow.
std::optional<std::int64_t> TakeNumber(std::string_view* text) {
  std::int64_t number = 0;
  if (text->empty() || !std::isdigit(static_cast<unsigned char>(text->front()))) return {};
  const auto [end, error] = std::from_chars(text->data(), text->data() + text->size(), number);
  if (error != std::errc()) return {};
  text->remove_prefix(end - text->data());
  return number;
}

// The number of bits that a size's unit stands for.
std::optional<int> UnitShift(std::string_view unit) {
  if (unit.empty() || unit == "B" || unit == "b") return 0;
  constexpr std::string_view kUnits = "kmgtp";
  constexpr int kBitsPerUnit = 10;
  const char letter = static_cast<char>(std::tolower(static_cast<unsigned char>(unit.front())));
  const size_t at = kUnits.find(letter);
  const std::string_view rest = unit.substr(1);
  if (at == std::string_view::npos || !(rest.empty() || rest == "B" || rest == "iB")) return {};
  return static_cast<int>(at + 1) * kBitsPerUnit;
}

std::optional<std::int64_t> UnitSeconds(std::string_view unit) {
  if (unit == "s") return 1;
  if (unit == "m") return kMinute;
  if (unit == "h") return kHour;
  if (unit == "d") return kDay;
  if (unit == "w") return kWeek;
  return {};
}

bool LooksLikeDate(std::string_view text) {
  constexpr std::string_view kForm = "dddd-dd-dd";
  if (text.size() < kForm.size()) return false;
  for (size_t at = 0; at < kForm.size(); ++at) {
    const bool digit = std::isdigit(static_cast<unsigned char>(text[at]));
    if (kForm[at] == 'd' ? !digit : text[at] != kForm[at]) return false;
  }
  return true;
}

// A local date with an optional time.
std::optional<std::int64_t> DateSeconds(const std::string& text, Bound bound) {
  constexpr const char* kDateAlone = "%Y-%m-%d";
  for (const char* form : {kDateAlone, "%Y-%m-%dT%H:%M", "%Y-%m-%dT%H:%M:%S"}) {
    std::tm local = {};
    const char* end = strptime(text.c_str(), form, &local);
    if (end == nullptr || *end != '\0') continue;
    local.tm_isdst = -1;
    // mktime takes a 31st of February and moves it to March.
    std::tm day = local;
    const std::time_t seconds = std::mktime(&day);
    if (day.tm_mday != local.tm_mday) return {};
    if (form != kDateAlone || bound == Bound::kFrom) return seconds;
    ++local.tm_mday;
    return std::mktime(&local) - 1;
  }
  return {};
}

std::optional<std::int64_t> TimeSeconds(const std::string& text, Bound bound, std::time_t now) {
  if (LooksLikeDate(text)) return DateSeconds(text, bound);
  std::string_view rest = text;
  const auto number = TakeNumber(&rest);
  if (!number) return {};
  if (rest.empty()) return number;
  const auto unit = UnitSeconds(rest);
  std::int64_t age = 0;
  if (!unit || __builtin_mul_overflow(*number, *unit, &age)) return {};
  return now - age;
}

}  // namespace

std::int64_t ParseSize(const std::string& text) {
  std::string_view rest = text;
  const auto number = TakeNumber(&rest);
  const auto shift = number ? UnitShift(rest) : std::nullopt;
  std::int64_t bytes = 0;
  if (!shift || __builtin_mul_overflow(*number, std::int64_t{1} << *shift, &bytes)) {
    throw UsageError("'" + text + "' is not a size; give bytes, or 10k, 5M, 1G");
  }
  return bytes;
}

std::int64_t ParseTime(const std::string& text, Bound bound, std::time_t now) {
  const auto seconds = TimeSeconds(text, bound, now);
  if (!seconds) {
    throw UsageError("'" + text +
                     "' is not a time; give 2026-01-31, 2026-01-31T12:00, an age like 30m, 12h or "
                     "7d, or seconds since 1970");
  }
  // Searches compare times of 32 bits; a later one would silently become a time long past.
  if (*seconds > INT32_MAX || *seconds < INT32_MIN) {
    throw UsageError("'" + text + "' lies outside 1901-12-13 to 2038-01-19, which is what a " +
                     "search can compare");
  }
  return *seconds;
}

nas::ShareSetting ParseShare(const std::string& text) {
  const size_t equals = text.find('=');
  if (equals == std::string::npos || equals == 0 || equals + 1 == text.size()) {
    throw UsageError("'" + text + "' is not a share; give NAME=DIR");
  }
  return {text.substr(0, equals), std::filesystem::absolute(text.substr(equals + 1)).string()};
}

}  // namespace arbory
