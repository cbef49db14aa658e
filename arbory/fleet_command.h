#pragma once
// `arbory fleet`: what administrators of a fleet need.

#include "arbory/options.h"

namespace arbory {

// `arbory fleet key`: writes a new secret key and prints the public one, which boxes are told.
// Throws UsageError where the file is there already or cannot be written.
int RunFleetKeyCommand(const FleetOptions& options);

}  // namespace arbory
