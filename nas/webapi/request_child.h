#pragma once
// The life of a request child, from the fork to its end.

#include "nas/webapi/runner.h"

namespace nas {

// Serves the call in the process that was just forked for it and ends that process. `pipe_fd` is
// the writable end of the pipe.
[[noreturn]] void ServeInChild(const NUVA::APIMethod& row, const ApiCall& call,
                               const ReplyEncoder& encode, int pipe_fd);

}  // namespace nas
