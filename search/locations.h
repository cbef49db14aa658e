#pragma once
// The user's home as a location.

#include <string>

// Sets `path` to the user's home in the form "/homes/FOLDER", whatever volume holds it. False when
// the user has no home there, which is logged.
bool GetUserHomesPath(const char* user, std::string& path);
