#pragma once
// `arbory index`: the daemon that keeps the name index, and asking it how it is.

#include "arbory/options.h"

namespace arbory {

// Returns an exit code: of the daemon when it is told to stop, of the others as their help says.
// Throws UsageError, or std::runtime_error when the daemon cannot be started.
int RunIndexCommand(const IndexOptions& options);

}  // namespace arbory
