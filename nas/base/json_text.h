#pragma once
// JSON as text, both ways. JsonCpp's own writer is too slow for replies of a million file objects
// and has no way to clean what it writes; its reader needs limits to be safe on what others wrote.

#include <json/value.h>

#include <string>
#include <string_view>

namespace nas {

enum class JsonBytes {
  kRaw,    // strings keep their bytes, so that what is stored comes back as it was
  kClean,  // strings are made valid UTF-8, for clients
};

// Appends `value` in one line without spaces. Numbers that JSON cannot hold (NaN, infinities) are
// written as null.
void AppendJson(const Json::Value& value, JsonBytes bytes, std::string* out);
std::string JsonText(const Json::Value& value, JsonBytes bytes);

// Far above any request or record, and low enough for the recursion to fit every stack.
inline constexpr int kJsonMaxDepth = 200;
// Of a request, so that a record that holds parts of it can be read again.
inline constexpr int kRequestMaxDepth = 100;

// Reads one JSON document of any type: no comments, nothing after it, at most `max_depth` levels
// deep. False, with `out` untouched, for anything else. Strings may hold bytes that are not UTF-8.
bool ParseJson(std::string_view text, Json::Value* out, int max_depth = kJsonMaxDepth);

}  // namespace nas
