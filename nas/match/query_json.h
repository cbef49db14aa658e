#pragma once
// A query's tree as JSON, for a process that is asked by another: [KIND, child or value ...]. Times
// are seconds and accounts numbers, so that both ends mean the same.

#include <json/value.h>

#include "nas/match/query.h"

namespace nas {

// What the tree came of (QueryNode::written) is left out.
Json::Value QueryToJson(const QueryNode& query);
// Fails with kErrorIllegal for what is no tree of a query, or one that is deeper or larger than any
// text makes; regular expressions are compiled.
Result<QueryNode> QueryFromJson(const Json::Value& json);

}  // namespace nas
