#pragma once
// What kind of file system a folder lies on.

namespace nas {

// Whether the open folder's file system (proc, sysfs and their like) holds no files of anybody's
// own. False where that cannot be found out.
bool IsPseudoFileSystem(int folder);

}  // namespace nas
