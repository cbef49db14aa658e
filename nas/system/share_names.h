#pragma once
// What a share may be called and where it may lie. A trouble is a text for the administrator;
// empty when there is none.

#include <string>

namespace nas {

inline constexpr char kHomesShare[] = "homes";

// Not empty, "." or "..", at most 255 bytes, no "/" (it ends the share in a location), no "," (it
// separates locations), no control character, and not "home", which stands for the user's own home.
std::string TroubleWithShareName(const std::string& name);

// Paths of a file below ".../homes/" are shown as the homes share's, so only that share may lie
// there, and it must be the folder "homes" itself. `root` is absolute without a final "/".
std::string TroubleWithShareRoot(const std::string& name, const std::string& root);

}  // namespace nas
