#include "nas/system/shares.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <map>
#include <set>

#include "nas/base/paths.h"
#include "nas/system/config.h"
#include "nas/system/share_names.h"
#include "nas/system/volumes.h"

namespace nas {

namespace {

std::string VolumeOf(const std::string& real_path) {
  std::string best;
  size_t best_length = 0;
  for (const std::string& volume : ListVolumes()) {
    const auto real = RealPath(volume);
    if (real && IsWithin(real_path, *real) && real->size() > best_length) {
      best = volume;
      best_length = real->size();
    }
  }
  return best;
}

std::optional<Share> MakeShare(const std::string& name, const std::string& directory) {
  const auto real = RealPath(directory);
  struct stat info;
  if (!real || stat(real->c_str(), &info) != 0 || !S_ISDIR(info.st_mode)) return std::nullopt;
  const std::string root = *real == "/" ? std::string() : *real;
  if (!TroubleWithShareRoot(name, root).empty()) return std::nullopt;
  return Share{name, root, VolumeOf(*real)};
}

// A folder of a volume is a share only as a folder of its own: a link could lead anywhere.
std::optional<Share> ShareOnVolume(const std::string& volume, const std::string& name) {
  constexpr std::string_view kNotShares = "@.#";
  if (!TroubleWithShareName(name).empty() || kNotShares.find(name[0]) != std::string_view::npos) {
    return std::nullopt;
  }
  const std::string directory = volume + "/" + name;
  struct stat info;
  if (lstat(directory.c_str(), &info) != 0 || !S_ISDIR(info.st_mode)) return std::nullopt;
  return MakeShare(name, directory);
}

}  // namespace

std::optional<Share> FindShare(const std::string& name) {
  for (const ShareSetting& setting : CurrentConfig().shares) {
    if (setting.name == name) return MakeShare(name, setting.directory);
  }
  for (const std::string& volume : ListVolumes()) {
    if (auto share = ShareOnVolume(volume, name)) return share;
  }
  return std::nullopt;
}

std::vector<Share> ListShares() {
  std::map<std::string, Share> shares;
  std::set<std::string> configured;
  for (const ShareSetting& setting : CurrentConfig().shares) {
    configured.insert(setting.name);
    if (const auto share = MakeShare(setting.name, setting.directory)) {
      shares.emplace(share->name, *share);
    }
  }
  for (const std::string& volume : ListVolumes()) {
    for (const std::string& name : NamesIn(AT_FDCWD, volume).value_or({})) {
      if (configured.contains(name) || shares.contains(name)) continue;
      if (const auto share = ShareOnVolume(volume, name)) shares.emplace(name, *share);
    }
  }
  std::vector<Share> sorted;
  sorted.reserve(shares.size());
  for (auto& [name, share] : shares) sorted.push_back(std::move(share));
  return sorted;
}

}  // namespace nas
