#pragma once
// A few files to search, for a server that has been given no share: so that whoever tries it finds
// something at once. Made once; what its owner changes or deletes in it stays so.

#include <string>

namespace arbory {

inline constexpr char kSampleShare[] = "sample";

// The folder STATE/sample, made and filled where it is missing. Throws std::runtime_error when
// that fails.
std::string MakeSampleShare(const std::string& state_dir);

}  // namespace arbory
