#pragma once
// realpath(3) with an owner for its result.

#include <optional>
#include <string>

namespace nas {

// Nothing, with errno set, where the path does not exist or cannot be followed.
std::optional<std::string> RealPath(const std::string& path);

}  // namespace nas
