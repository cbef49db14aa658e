#pragma once
// The parameters of a search's start, from what was typed: on a command line, or in the page's
// form.

#include <json/value.h>

#include <ctime>
#include <string>
#include <vector>

#include "arbory/caller.h"
#include "arbory/options.h"

namespace arbory {

// `now` is what ages count back from. Throws CriterionError for a value that cannot be understood
// and for what a search would otherwise leave out silently or refuse without saying which part was
// wrong: an unknown owner or group, an illegal pattern, extension or file type, bounds that nothing
// can lie between. Asks the engine for all of that.
Json::Value SearchRequest(const SearchQuery& query, const std::vector<std::string>& locations,
                          std::time_t now);

// The same for the folders as they were given: finds the share that each lies in, and offers a new
// one through the caller where it lies in none. A folder that begins with a box of the caller's
// fleet is the box's. Throws UsageError for a folder that cannot be searched too.
Json::Value PrepareSearch(const SearchQuery& query, Caller* caller);

}  // namespace arbory
