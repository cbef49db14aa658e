#include "arbory/parse.h"

#include <algorithm>
#include <filesystem>

#include "arbory/options.h"
#include "nas/match/query_prefix.h"

namespace arbory {
namespace {

// Searches compare times of 32 bits; a later one would silently become a time long past.
[[noreturn]] void ThrowBeyond(const std::string& text) {
  throw UsageError("'" + text + "' lies outside 1901-12-13 to 2038-01-19, which is what a " +
                   "search can compare");
}

}  // namespace

std::int64_t ParseSize(const std::string& text) {
  const auto size = nas::ReadSize(text);
  if (!size) throw UsageError("'" + text + "' is not a size; give bytes, or 10k, 5M, 1.5G");
  return size->span.from;
}

std::int64_t ParseTime(const std::string& text, Bound bound, std::time_t now) {
  const auto time = nas::ReadTime(text, now);
  if (!time) {
    throw UsageError("'" + text +
                     "' is not a time; give 2026-01-31, 2026-01-31T12:00, yesterday, last-7-days, "
                     "an age like 30m, 12h or 7d, or seconds since 1970");
  }
  const bool from = bound == Bound::kFrom;
  const std::int64_t seconds = from ? time->span.from : time->span.to;
  if (from && seconds == nas::Bounds::kLeast) return INT32_MIN;
  if (seconds > INT32_MAX || seconds < INT32_MIN) ThrowBeyond(text);
  return seconds;
}

nas::Bounds ParseTimeBounds(const std::string& text, std::time_t now) {
  const auto node = nas::PrefixNode(*nas::FindPrefix("modified:"), text, now);
  if (!node) throw UsageError("'" + text + "': " + node.error().path);
  if (node->bounds.size() != 1) {
    throw UsageError("'" + text + "' are several times; write them as one, as in A..B");
  }
  nas::Bounds bounds = node->bounds.front();
  if (bounds.from > INT32_MAX || bounds.to < INT32_MIN) ThrowBeyond(text);
  if (bounds.from != nas::Bounds::kLeast) {
    bounds.from = std::max(bounds.from, std::int64_t{INT32_MIN});
  }
  if (bounds.to != nas::Bounds::kMost) bounds.to = std::min(bounds.to, std::int64_t{INT32_MAX});
  return bounds;
}

nas::ShareSetting ParseShare(const std::string& text) {
  const size_t equals = text.find('=');
  if (equals == std::string::npos || equals == 0 || equals + 1 == text.size()) {
    throw UsageError("'" + text + "' is not a share; give NAME=DIR");
  }
  return {text.substr(0, equals), std::filesystem::absolute(text.substr(equals + 1)).string()};
}

}  // namespace arbory
