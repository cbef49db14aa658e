#pragma once

#include "arbory/options.h"

namespace arbory {

// Prints what leaves a file out of a search's results, or that nothing does. Returns the exit code;
// throws what the user can put right as UsageError, such as a file that does not exist.
int RunWhyCommand(const WhyOptions& options);

}  // namespace arbory
