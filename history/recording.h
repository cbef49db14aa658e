#pragma once
// How a search is remembered for its user when it starts: in the history, and in the count of
// searches among the user's personal settings. Called in the search's worker, under the user's
// identity. Remembering is a courtesy: whatever goes wrong, these return and nothing is thrown.

#include <json/value.h>

#include "platform/webapi.h"

// Replaces the record of the request's pattern by `criteria` with the request's folders. Nothing is
// written for a search without a pattern, or where the store cannot be used.
void RecordSearch(const NUVA::APIRequest& request, const Json::Value& criteria);

// Adds one. Settings that are missing or no JSON stay so, which is logged; settings of another
// shape than ours are left as they are. Two searches started at once may count as one: a lock on
// the desktop's own file would not be worth that.
void CountSearch(const NUVA::APIRequest& request);
