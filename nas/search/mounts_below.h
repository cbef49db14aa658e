#pragma once
// What is mounted below a folder, as this process sees it.

#include <optional>
#include <string>
#include <vector>

namespace nas {

// Of a text as /proc/self/mountinfo has it: the places that lie below `folder` (absolute, without
// links; "/" is the root), each as its path below it, sorted.
std::vector<std::string> MountsBelow(const std::string& mountinfo, const std::string& folder);

// Below the folder open at `fd`; nothing where that cannot be found out, as of one that has been
// deleted or lies outside the process's root.
std::optional<std::vector<std::string>> MountsBelow(int fd);

}  // namespace nas
