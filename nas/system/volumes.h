#pragma once
// Volumes on disk and the temporary folder of each, VOLUME/@tmp, where searches keep their result
// databases. The operations on them stand in shares.h.

#include <map>
#include <string>
#include <vector>

namespace nas {

// Below a volume: @tmp/webfm/FBSearch/USER.
inline constexpr char kTemporaryFolder[] = "@tmp";

// Where ResultFolder (shares.h) is or would be; nothing is looked at or made.
std::string ResultFolderPath(const std::string& volume, const std::string& user);

// The path under which each volume, the scratch volume among them, appears to a confined command:
// its own where the pattern /volume* matches it, otherwise an unused /volumeN; the scratch volume
// is /volume0 unless a volume is.
std::map<std::string, std::string> NamesInSandbox(const std::vector<std::string>& volumes,
                                                  const std::string& scratch);

}  // namespace nas
