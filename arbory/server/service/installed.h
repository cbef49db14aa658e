#pragma once
// Folders of files that belong to the program: installed with it, or in the tree that it was built
// from.

#include <optional>
#include <string>

namespace arbory {

// The first place that has `file`: ../share/arbory/NAME and ../NAME as seen from the program's
// folder, and `in_tree` of the tree that it was built from. Nothing when none has it.
std::optional<std::string> FindInstalled(const std::string& name, const std::string& in_tree,
                                         const std::string& file);

}  // namespace arbory
