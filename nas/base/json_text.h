#pragma once
// JSON as text, both ways. JsonCpp's own writer is too slow for replies of a million file objects
// and has no way to clean what it writes; its reader needs limits to be safe on what others wrote.
// Any thread may call; nothing is kept.

#include <json/value.h>

#include <functional>
#include <string>
#include <string_view>

namespace nas {

enum class JsonBytes {
  kRaw,    // strings keep their bytes, so that what is stored comes back as it was
  kClean,  // strings are made valid UTF-8, for clients
};

// Appends `value` in one line without spaces, members in the order of their names. Numbers that
// JSON cannot hold (NaN, infinities) are written as null. Recurses for each level of `value`, so it
// is for values that are not deeper than what ParseJson reads.
// With `spill`, calls it with `out` after each element of an array or object, so that what has
// come together can be taken from there; it may empty `out` or leave it.
using JsonSpill = std::function<void(std::string* out)>;
void AppendJson(const Json::Value& value, JsonBytes bytes, std::string* out,
                const JsonSpill& spill = {});
std::string JsonText(const Json::Value& value, JsonBytes bytes);
// Appends the text as a JSON string.
void AppendJsonString(std::string_view text, JsonBytes bytes, std::string* out);

// Far above any request or record, and low enough for the recursion to fit every stack.
inline constexpr int kJsonMaxDepth = 200;
// Of a request, so that a record that holds parts of it can be read again.
inline constexpr int kRequestMaxDepth = 100;

// Of one document: far above what a request or record holds, the longest list of locations among
// it. An empty array takes three bytes of text and a hundred of memory, so a bound on bytes alone
// would not do.
inline constexpr size_t kJsonMaxValues = 200'000;

// Reads one JSON document of any type: no comments, nothing after it, at most `max_depth` levels
// deep and at most kJsonMaxValues values, which are counted before any is made. False, with `out`
// untouched, for anything else: there is no more to tell, as the texts come from programs. Strings
// may hold bytes that are not UTF-8. Of members of one name the last counts. Throws std::bad_alloc
// where there is no memory for it, which says nothing of the text.
bool ParseJson(std::string_view text, Json::Value* out, int max_depth = kJsonMaxDepth);

}  // namespace nas
