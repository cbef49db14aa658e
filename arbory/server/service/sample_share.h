#pragma once
// A few files to search, for a server that has been given no share: so that whoever tries it finds
// something at once. They are installed with the program and copied once; what their owner changes
// or deletes in the copy stays so.

#include <optional>
#include <string>

namespace arbory {

inline constexpr char kSampleShare[] = "sample";

// The folder STATE/sample, made of the installed files where it is missing. Nothing where those
// files are missing too. Throws std::runtime_error when the copying fails; what it had made is left
// under another name then. Before the server's loop runs.
std::optional<std::string> MakeSampleShare(const std::string& state_dir);

}  // namespace arbory
