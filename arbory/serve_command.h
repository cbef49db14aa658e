#pragma once
// `arbory serve`: the web server that people search with.

#include "arbory/options.h"

namespace arbory {

// Serves until it is told to stop by SIGTERM or SIGINT. Returns an exit code. Throws UsageError, or
// std::runtime_error when the server cannot be started.
int RunServeCommand(const ServeOptions& options);

}  // namespace arbory
