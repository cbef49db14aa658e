#pragma once
// `arbory call`: one API call as a server would make it, its reply as one line of JSON.

#include "arbory/options.h"

namespace arbory {

// Returns an exit code. Throws UsageError, or std::runtime_error when the call cannot be made.
int RunCallCommand(const CallOptions& options);

}  // namespace arbory
