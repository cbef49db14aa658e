#pragma once
// Libraries of the program's own that hold what few of its processes need, and that bring others
// with them: whoever does not load them starts in milliseconds.

namespace nas {

// Loads the library of that file name for the rest of the process, and finds its function `entry`.
// Throws std::runtime_error, with what is wrong, where it cannot be had.
void* LoadOwnLibrary(const char* name, const char* entry);

}  // namespace nas
