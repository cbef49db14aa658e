#pragma once
// Configuration: where state is kept, which directories are volumes, and what is shared. Nothing
// outside nas/system reads a configuration file or an environment variable.

#include <stdexcept>
#include <string>
#include <vector>

namespace nas {

struct ShareSetting {
  std::string name;
  std::string directory;    // as given; made real when the share is looked up
  std::string origin = {};  // "FILE:LINE" for messages; empty when no file says so
};

struct Config {
  std::string state_dir;                            // absolute
  std::vector<std::string> volumes = {"/volume*"};  // shell patterns of absolute directories
  std::string module;                               // path of the module; empty: beside the program
  std::vector<ShareSetting> shares;
};

// A configuration that cannot be used. what() names the file, the line and the trouble.
class ConfigError : public std::runtime_error {
  using std::runtime_error::runtime_error;
};

// Reads the file at `path`, or, when that is empty, the first that exists of $ARBORY_CONFIG,
// /etc/arbory/arbory.toml and $XDG_CONFIG_HOME/arbory/arbory.toml; without any of them, defaults
// for the calling user. A file named by `path` or $ARBORY_CONFIG must exist. Throws ConfigError.
Config LoadConfig(const std::string& path);
// The configuration without any file.
Config DefaultConfig();

// Makes `config` the configuration of this process and of every process forked from it. To be
// called once, before any platform operation, while there is one thread. Throws ConfigError when a
// share cannot be offered (see shares.h) or a path is not absolute. A share's directory given
// relative to the current one becomes absolute; one that does not exist yet is no error.
void Configure(Config config);
const Config& CurrentConfig();

}  // namespace nas
