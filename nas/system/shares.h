#pragma once
// Shares. A share is a name and a directory: every directory directly inside a volume (volumes.h)
// whose name does not begin with "@", "." or "#", and what the configuration adds. A location is
// "/SHARE" or "/SHARE/below". Any thread may ask; what a user may not see is told all the same, and
// cannot be opened.

#include <optional>
#include <string>
#include <vector>

namespace nas {

struct Share {
  std::string name;
  std::string root;    // real absolute path, no final "/"; empty for the root directory
  std::string volume;  // the volume it lies in; empty for a share outside every volume
};

// The share of that name (exact), looked up anew at each call so that a folder made on a volume is
// seen at once. Configured shares come before a volume's folders of the same name.
std::optional<Share> FindShare(const std::string& name);
// All shares, sorted by name.
std::vector<Share> ListShares();

}  // namespace nas
