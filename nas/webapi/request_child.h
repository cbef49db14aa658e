#pragma once
// The life of a request child, from the fork to its end.

#include "nas/webapi/runner.h"

namespace nas {

// Serves the call in the process that was just forked for it and ends that process. `pipe_fd` is
// the writable end of the pipe.
[[noreturn]] void ServeInChild(const NUVA::APIMethod& row, const ApiCall& call,
                               const ReplyEncoder& encode, int pipe_fd);

// For servers that fork children of other kinds: makes the process that was just forked a plain
// one, as above, with only the standard streams (/dev/null) and `fd` open, whose new number is the
// result. -1 on failure.
int EnterChild(int fd);

}  // namespace nas
