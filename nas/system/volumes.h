#pragma once
// Volumes on disk and the temporary folder of each, VOLUME/@tmp, where searches keep their result
// databases. The operations on them stand in shares.h.

namespace nas {

// Below a volume: @tmp/webfm/FBSearch/USER.
inline constexpr char kTemporaryFolder[] = "@tmp";

}  // namespace nas
