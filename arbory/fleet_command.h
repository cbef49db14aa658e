#pragma once
// `arbory fleet`: what administrators of a fleet need.

#include "arbory/options.h"

namespace arbory {

// `arbory fleet key`: writes a new secret key and prints the public one, which boxes are told.
// Throws UsageError where the file is there already or cannot be written.
int RunFleetKeyCommand(const FleetOptions& options);

// `arbory fleet config`: prints what HAProxy needs to stand between the front and its boxes, or
// replaces a file with it and has that read anew. Throws nas::ConfigError, and UsageError for what
// cannot be written or read.
int RunFleetConfigCommand(const FleetOptions& options);

// `arbory fleet status`: asks every box and prints a line of each; exit code 1 where one does not
// answer. Throws nas::ConfigError.
int RunFleetStatusCommand(const FleetOptions& options);

}  // namespace arbory
