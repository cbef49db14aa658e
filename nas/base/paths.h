#pragma once
// Questions about paths and folders that several places ask.

#include <string>
#include <vector>

#include "nas/base/error.h"

namespace nas {

// The path without symbolic links, "." and ".."; fails where it does not exist or cannot be
// followed.
Result<std::string> RealPath(const std::string& path);

// Whether `path` is `folder` or lies somewhere in it, by their names alone: neither is looked at.
// `folder` has no final "/"; that of the root directory may be "/" or empty.
bool IsWithin(const std::string& path, const std::string& folder);

// The folder of the running program, with a final "/"; empty where the system does not tell.
std::string ProgramFolder();

// The names in the folder `name`, relative to `dir_fd` or AT_FDCWD, in no order and without "." and
// "..". For small folders: everything is held at once. A search reads folders with DirectoryReader.
Result<std::vector<std::string>> NamesIn(int dir_fd, const std::string& name);

}  // namespace nas
