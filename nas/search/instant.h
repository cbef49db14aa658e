#pragma once
// Results while somebody types: the best that the index knows, all of them looked up under the
// process's identity, without a task, a history entry or a count. Contents are not looked into.

#include <json/value.h>

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "nas/files/attributes.h"
#include "nas/index/client.h"
#include "nas/match/query.h"
#include "nas/search/location.h"

namespace nas {

struct InstantReply {
  struct Row {
    size_t location = 0;  // among those given
    std::string folder;   // below the root of the location's share
    std::string name;
    FileAttributes attributes;
  };
  // kIndexCurrent, or why there is no answer for the first location that has none. What others
  // answer is there all the same.
  std::string state;
  std::vector<Row> rows;    // the best first
  std::uint64_t found = 0;  // matches looked up, at least as many as rows
  bool more = false;        // there may be more than that
};

// The process must have the user's identity. Waits for each location's answer a fraction of a
// second at most; `cancelled` is asked meanwhile, every few milliseconds. `most` is at most
// kMostBest (index_question.h). `ask` is for tests. Fails with kErrorIllegal for a query that asks
// for contents.
Result<InstantReply> AskInstantly(
    const std::vector<Location>& locations, const QueryNode& query, bool recursive, size_t most,
    const std::function<bool()>& cancelled = {},
    const std::function<IndexAnswer(int location, bool asks_times)>& ask = AskIndex);

// {"index": state, "found": n, "more": bool, "rows": [{"path": "/SHARE/...", "name", "is_dir",
// "size", "mtime"}]}
Json::Value InstantJson(const InstantReply& reply, const std::vector<Location>& locations);

}  // namespace nas
