#pragma once
// `arbory search`: a search started, listed while it runs, and cleaned up at the end.

#include "arbory/options.h"

namespace arbory {

// Returns an exit code. Throws UsageError, or std::runtime_error when the search cannot be run.
int RunSearchCommand(const SearchOptions& options);

}  // namespace arbory
