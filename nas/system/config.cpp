// The configuration in force, and the checks it must pass.

#include "nas/system/config.h"

#include <unistd.h>

#include <cstdlib>
#include <memory>
#include <set>

#include "nas/base/paths.h"
#include "nas/system/share_names.h"

namespace nas {
namespace {

Config g_config;
bool g_configured = false;

std::string Absolute(const std::string& directory) {
  if (directory.starts_with('/')) return directory;
  const std::unique_ptr<char, void (*)(void*)> current(getcwd(nullptr, 0), std::free);
  if (!current) throw ConfigError("the current directory cannot be told");
  return directory.empty() ? directory : std::string(current.get()) + "/" + directory;
}

[[noreturn]] void Fail(const ShareSetting& share, const std::string& trouble) {
  const std::string place = share.origin.empty() ? std::string() : share.origin + ": ";
  throw ConfigError(place + "share \"" + share.name + "\": " + trouble);
}

void CheckShare(ShareSetting* share) {
  const std::string name_trouble = TroubleWithShareName(share->name);
  if (!name_trouble.empty()) Fail(*share, name_trouble);
  share->directory = Absolute(share->directory);
  if (share->directory.empty()) Fail(*share, "no directory is given");
  // A directory that is not there yet is judged by its name for now, and again when it is used.
  std::string root = RealPath(share->directory).value_or(share->directory);
  while (root.ends_with('/')) root.pop_back();
  const std::string root_trouble = TroubleWithShareRoot(share->name, root);
  if (!root_trouble.empty()) Fail(*share, root_trouble);
}

}  // namespace

void Configure(Config config) {
  if (!config.state_dir.starts_with('/')) {
    throw ConfigError("the state directory must be an absolute path: " + config.state_dir);
  }
  while (config.state_dir.size() > 1 && config.state_dir.ends_with('/')) {
    config.state_dir.pop_back();
  }
  for (const std::string& volume : config.volumes) {
    if (!volume.starts_with('/')) {
      throw ConfigError("a volume must be an absolute path: " + volume);
    }
  }
  std::set<std::string> names;
  for (ShareSetting& share : config.shares) {
    CheckShare(&share);
    if (!names.insert(share.name).second) Fail(share, "the name is given twice");
  }
  g_config = std::move(config);
  g_configured = true;
}

const Config& CurrentConfig() {
  if (!g_configured) {
    g_config = DefaultConfig();
    g_configured = true;
  }
  return g_config;
}

}  // namespace nas
