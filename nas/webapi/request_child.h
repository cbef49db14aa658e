#pragma once
// What a request child does for its call.

#include "nas/webapi/runner.h"

namespace nas {

// Becomes the call's user for the rest of the process and calls the row's entry function. The code
// of a failure to become the user, with null data, where that fails; kCodeBadRequest where a
// parameter lists too much; kCodeUnknownFailure where the entry function throws or gives no reply.
// Throws what `encode` does. A worker that the entry function forked may come back from here too.
Reply ServeCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode);

// Where the text of a reply goes that is too long to be held, once the process is its user's: a
// folder of theirs. Empty before.
const std::string& SpoolFolder();

}  // namespace nas
