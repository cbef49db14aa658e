#pragma once
// Configuration: where state is kept, which directories are volumes, and what is shared. Nothing
// outside nas/system reads a configuration file or an environment variable; within it, child.h's
// children alone look at one that is no configuration (for tests).

#include <cstdint>
#include <stdexcept>
#include <string>
#include <vector>

namespace nas {

struct ShareSetting {
  std::string name;
  std::string directory;    // as given; made real when the share is looked up
  std::string origin = {};  // "FILE:LINE" for messages; empty when no file says so

  bool operator==(const ShareSetting&) const = default;
};

// What `arbory serve` goes by. Each number is a limit that keeps one client from taking the server
// from the others; the defaults suit a household or an office on a small machine.
struct ServerSettings {
  std::string listen = "127.0.0.1:8750";  // ADDRESS:PORT, an IPv6 address in brackets
  std::string web_dir;                    // the built page; empty: the one beside the program
  bool behind_tls = false;                // a proxy in front speaks HTTPS
  std::vector<std::string> origins;       // what browsers may call it, such as "https://nas.home"
  std::vector<std::string> proxies;       // addresses whose X-Forwarded-For is believed
  std::string pam_service = "arbory";
  std::string pam_dir;  // folder of PAM service files; empty: the system's
  bool access_log = true;

  int max_connections = 512;
  int max_calls = 64;          // request children at once
  int body_bytes = 1 << 20;    // of one request
  int header_seconds = 10;     // for a request to arrive whole, once begun
  int idle_seconds = 60;       // that a connection may wait for its next request
  int stall_seconds = 30;      // that a client may take nothing of a reply
  int call_seconds = 120;      // for a child to begin or go on with its reply
  int logins_per_minute = 10;  // refused ones of an address; of an account ten times as many
  int session_minutes = 12 * 60;
  int account_check_seconds = 60;  // between two looks at whether a user may still be logged in

  bool operator==(const ServerSettings&) const = default;
};

// Whether searches ask the index: where it is current, only there, or never.
enum class IndexUse { kAuto, kAlways, kNever };

// What `arbory index` goes by.
struct IndexSettings {
  std::string socket;  // empty: the usual place (index/daemon_socket.h)
  // Names of shares and absolute folders; empty: every share and volume.
  std::vector<std::string> folders;
  // Whether each write to a file is noted. Without it writers pay less, and attributes that a
  // search asks for are looked up.
  bool modify_events = true;
  int questions_per_user = 8;  // at once
  int question_memory_mb = 512;
  int question_seconds = 600;  // of processor time
  // Changes that are kept in mind, and events while there is no table to note them with; beyond it
  // the table is compared with the file system.
  int max_changes = 1'000'000;
  // Between two writings of the table where little has changed.
  int rewrite_minutes = 15;

  bool operator==(const IndexSettings&) const = default;
};

// Another machine's `arbory serve` that asks this one for people who are logged in there.
struct FrontSetting {
  std::string name;
  std::string key;    // its Ed25519 public key in hexadecimal
  std::string realm;  // of the people it names: USER@REALM, or USER where there is none
  // Whom it may speak for: these, and the members of these groups.
  std::vector<std::string> users;
  std::vector<std::string> groups;
  int searches = 32;  // running at once

  bool operator==(const FrontSetting&) const = default;
};

// What `arbory serve` answers fronts by; nobody without any of them.
struct BoxSettings {
  std::string name;  // that fronts know it by
  // Below are the system's own accounts, for whom no front may speak; nor for root.
  int lowest_uid = 1000;
  std::vector<FrontSetting> fronts;

  bool operator==(const BoxSettings&) const = default;
};

// A machine that a front asks.
struct FleetBox {
  std::string name;
  std::string address;  // "http://HOST:PORT", or with https

  bool operator==(const FleetBox&) const = default;
};

// What a front asks boxes by; none without any of them.
struct FleetSettings {
  std::string front;  // what boxes know it by
  std::string realm;
  std::string key_file;  // its secret key, for root or its user alone
  std::string proxy;     // socket of a proxy that knows every box by its name; empty: no such thing
  // What the proxy shows boxes, front.pem, and by whom their certificates are signed, ca.pem.
  std::string tls_folder = "/etc/arbory/fleet";
  int deadline_ms = 2000;        // for a box to say something
  int first_page_ms = 10;        // for a box to find all, so that its first rows are in order
  int rows_per_box = 1'000'000;  // of one search; what is over stays where it is
  std::vector<FleetBox> boxes;   // in the order of their names

  bool operator==(const FleetSettings&) const = default;
};

// Where root's state is unless configured otherwise.
inline constexpr char kSystemStateDir[] = "/var/lib/arbory";

struct Config {
  std::string state_dir;                            // absolute
  std::vector<std::string> volumes = {"/volume*"};  // shell patterns of absolute directories
  std::string module;                               // path of the module; empty: beside the program
  std::vector<ShareSetting> shares;
  // A user's searches at once: enough for several open windows, and a bound on what one user can
  // take from the machine.
  int searches_per_user = 8;
  // How long a search goes on whose asker is gone without a word, for those made with a lease. A
  // browser looks after a hidden page once a minute.
  int lease_seconds = 150;
  // Memory of one call. What is over is for listings of very many rows, of which one user has a few
  // at once.
  int call_memory_mb = 256;
  int large_call_memory_mb = 2048;
  int large_calls_per_user = 2;
  std::uint64_t call_memory_bytes() const { return Megabytes(call_memory_mb); }
  std::uint64_t large_call_memory_bytes() const { return Megabytes(large_call_memory_mb); }
  static std::uint64_t Megabytes(int count) { return static_cast<std::uint64_t>(count) << 20; }
  ServerSettings server;
  // Of one run of the program; no file says them.
  IndexUse index_use = IndexUse::kAuto;
  int search_threads = 0;       // that a search uses; 0: as many as are of use
  bool list_unread = false;     // folders that could not be read are named in a search's record
  bool keep_attributes = true;  // false: of results only names and types are asked for
  bool keep_orderings = true;   // results may be listed later, sorted by any column
  IndexSettings index;
  BoxSettings box;
  FleetSettings fleet;  // of `arbory serve --fleet`, from a file of its own

  bool operator==(const Config&) const = default;
};

// A configuration that cannot be used. what() names the file, the line and the trouble.
class ConfigError : public std::runtime_error {
  using std::runtime_error::runtime_error;
};

// Reads the file at `path`, or, when that is empty, the first that exists of $ARBORY_CONFIG,
// /etc/arbory/arbory.toml and $XDG_CONFIG_HOME/arbory/arbory.toml; without any of them, defaults
// for the calling user. A file named by `path` or $ARBORY_CONFIG must exist. Throws ConfigError.
Config LoadConfig(const std::string& path);
// Reads what a front asks boxes by. Throws ConfigError.
FleetSettings LoadFleet(const std::string& path);
// The configuration without any file.
Config DefaultConfig();

// Makes `config` the configuration of this process and of every process forked from it, in the
// place of the one before. Call it while there is one thread and before whatever goes by it; a
// program may call it again, as when it adds a share to those configured. Throws ConfigError, with
// the configuration as it was, when a share cannot be offered (see share_names.h) or a path is not
// absolute. A share's directory given relative to the current one becomes absolute; one that does
// not exist yet is no error.
void Configure(Config config);
const Config& CurrentConfig();

}  // namespace nas
