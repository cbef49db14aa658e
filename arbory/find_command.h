#pragma once
// `arbory find`: the best matches that the index knows, printed at once or offered to choose from.

#include "arbory/options.h"

namespace arbory {

// Returns an exit code. Throws UsageError, also where the index has no answer, or
// std::runtime_error when it cannot be asked.
int RunFindCommand(const FindOptions& options);

}  // namespace arbory
