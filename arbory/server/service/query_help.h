#pragma once
// What the page tells of a query while it is typed, as JSON (docs/http.md, "What was typed").
// Places are counted in UTF-16 code units, as scripts of browsers do; a sequence of bytes that is
// no UTF-8 is one, since U+FFFD stands for it there.

#include <json/value.h>

#include <ctime>
#include <string>

namespace arbory {

// [{"kind","begin","end", ...}] (nas/match/query_spans.h).
Json::Value SpansJson(const std::string& query, std::time_t now);
// {"of","begin","end","items":[{"text","about"}]}, or null where there is nothing to offer.
Json::Value CompletionJson(const std::string& query, Json::UInt64 place, std::time_t now);

}  // namespace arbory
