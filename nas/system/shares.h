#pragma once
// Shares and volumes. A share is a name and a directory: every directory directly inside a volume
// whose name does not begin with "@", "." or "#", and what the configuration adds. A location is
// "/SHARE" or "/SHARE/below".

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

// The volumes that exist, sorted. The scratch volume, which holds what belongs to shares outside
// every volume, is not among them.
std::vector<std::string> ListVolumes();
std::string ScratchVolume();

// The folder on `volume` that holds the user's result databases, made where missing, with mode 0700
// and the user as its owner. Empty, with the last error and errno set, where `volume` is neither a
// volume nor the scratch volume, or the folder cannot be made or is not the user's own and closed.
// The process must have the user's identity (WfmLibUGIDSet).
std::string ResultFolder(const std::string& volume, const std::string& user);
// The volume for a share's result databases: its own where the user can have a folder there,
// otherwise the scratch volume. Empty, with the last error set, if neither works.
std::string ResultVolume(const Share& share, const std::string& user);

}  // namespace nas
