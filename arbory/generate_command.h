#pragma once
// `arbory generate`, which the build runs: writes the manual pages and the completions.

#include "arbory/command_tree.h"
#include "arbory/options.h"

namespace arbory {

// Writes man/ and the shells' folders below options.folder, as they lie below /usr/share. Throws
// std::runtime_error when a file cannot be written.
int RunGenerateCommand(const GenerateOptions& options, const ProgramText& program);

}  // namespace arbory
