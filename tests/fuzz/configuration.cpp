// Configuration files: what is taken is within its bounds, what is not is told with its place.

#include "nas/system/config.h"

#include "tests/fuzz/fuzz.h"

namespace {

void CheckBounds(const nas::Config& config) {
  constexpr int kMost = 1'000'000'000;
  const nas::ServerSettings& server = config.server;
  for (const int limit :
       {config.searches_per_user, server.max_connections, server.max_calls, server.body_bytes,
        server.header_seconds, server.idle_seconds, server.stall_seconds, server.call_seconds,
        server.logins_per_minute, server.session_minutes}) {
    DEMAND(limit >= 1 && limit <= kMost);
  }
  DEMAND(config.state_dir.starts_with('/'));
  for (const std::string& volume : config.volumes) DEMAND(volume.starts_with('/'));
  for (const std::string& path : {config.module, server.web_dir, server.pam_dir}) {
    DEMAND(path.empty() || path.starts_with('/'));
  }
  for (const nas::ShareSetting& share : config.shares) DEMAND(!share.origin.empty());
}

}  // namespace

int fuzz::Target(std::string_view input) {
  static const std::string path = fuzz::Scratch() + "/arbory.toml";
  fuzz::WriteFile(path, input);
  try {
    nas::Config config = nas::LoadConfig(path);
    CheckBounds(config);
    nas::Configure(std::move(config));
    for (const nas::ShareSetting& share : nas::CurrentConfig().shares) {
      DEMAND(share.directory.starts_with('/'));
    }
  } catch (const nas::ConfigError& error) {
    DEMAND(std::string(error.what()).find(path) != std::string::npos);
  }
  return fuzz::kUsed;
}
