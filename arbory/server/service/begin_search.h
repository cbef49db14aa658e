#pragma once
// A search in one request: what was typed is read, the search begun, and what it has found by then
// listed, as clients on slow lines wait for every answer before they can ask the next.

#include "nas/webapi/runner.h"

namespace arbory {

// Reads the call's parameters as StartReadQuery does, and begins and lists the search by the rows
// `start` and `list` of the module, each in a child of its own as the user. Replies with the JSON
// of an HTTP answer:
//
//   {"wrong"}                     as StartReadQuery has it, and no search was begun
//   {"code":N}                    of a start that failed
//   {"taskid","params","spans"[,"page"]}  "page" as `list` gives it, where it could be
//
// The parameter "list" holds those of the listing but for the task. The first rows are waited for
// for a moment. The pid is -1, with errno set, when nothing can be forked. Of the loop's thread
// alone; the rows must outlive the call.
nas::Child StartBegin(const nas::ApiCall& call, const NUVA::APIMethod& start,
                      const NUVA::APIMethod& list);

}  // namespace arbory
