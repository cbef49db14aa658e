#pragma once
// What the server itself looks up for a user, as rows like the module's: they run in a request
// child under the user's identity, and their reply is the JSON of an HTTP answer (EncodeOwnReply),
// whose status is the reply's code: 503 when the server cannot act as the user. The pid is -1, with
// errno set, when nothing can be forked. Of the loop's thread alone.

#include <string>

#include "nas/webapi/runner.h"

namespace arbory {

// {"shares":[{"name","indexed"}],"homes":BOOL}: the shares the user can enter and list.
nas::Child StartListShares(const std::string& user);

// {"taskid","finished","progress","errno","location","walk"} of the user's search; 404 when there
// is none of that id.
nas::Child StartReadSearch(const std::string& user, const std::string& task_id);

// Stops the user's running searches by the module's own method "stop". {"stopped":N}.
nas::Child StartStopSearches(const std::string& user, const NUVA::APIMethod& stop);

// Has the call's parameters read and gives `reply` where they are well-formed.
nas::Child StartReply(const nas::ApiCall& call, const nas::Reply& reply);

}  // namespace arbory
