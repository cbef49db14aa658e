// Reading of the configuration file:
//
//   state_dir = "/var/lib/arbory"
//   volumes = ["/volume*"]
//   module = "/usr/lib/arbory/NUVA.Arbory.Search.so"
//   [shares]
//   photo = "/srv/photo"
//   [server]
//   listen = "127.0.0.1:8750"
//   [index]
//   folders = ["photo", "/srv/music"]
//   [fleet]
//   name = "box1"
//   [fleet.fronts.office]
//   key = "..."
//   groups = ["staff"]
//
// and of the file that says what a front asks:
//
//   front = "office"
//   key_file = "/etc/arbory/office.key"
//   [boxes]
//   box1 = "http://box1.example.net:8750"
//
// A key that is not known is an error, so that a misspelt one is noticed.

#include <fcntl.h>
#include <unistd.h>

#include <toml++/toml.h>
#include <algorithm>
#include <cstdlib>
#include <functional>
#include <map>

#include "nas/base/accounts.h"
#include "nas/base/file_io.h"
#include "nas/system/config.h"

namespace nas {
namespace {

constexpr size_t kMaxFileBytes = size_t{1} << 20;
constexpr int kMaxLimit = 1'000'000'000;  // so that no sum or product of limits overflows 64 bits
constexpr char kSystemFile[] = "/etc/arbory/arbory.toml";

std::string Environment(const char* name) {
  const char* value = std::getenv(name);
  return value == nullptr ? std::string() : std::string(value);
}

// An XDG base directory; a relative value counts as unset.
std::string BaseDirectory(const char* variable, const char* below_home) {
  std::string value = Environment(variable);
  if (value.starts_with('/')) return value;
  std::string home = Environment("HOME");
  if (home.empty()) {
    const auto account = FindAccount(geteuid());
    if (account) home = account->home;
  }
  return home.starts_with('/') ? home + "/" + below_home : std::string();
}

std::string DefaultStateDir() {
  if (geteuid() == 0) return kSystemStateDir;
  const std::string base = BaseDirectory("XDG_STATE_HOME", ".local/state");
  // A user without a home has nowhere to keep state; the first use then says so.
  return (base.empty() ? "/nonexistent" : base) + "/arbory";
}

// The file to read; empty for none.
std::string FindFile(const std::string& path) {
  if (!path.empty()) return path;
  std::string named = Environment("ARBORY_CONFIG");
  if (!named.empty()) return named;
  const std::string base = BaseDirectory("XDG_CONFIG_HOME", ".config");
  for (const std::string& file :
       {std::string(kSystemFile), base.empty() ? base : base + "/arbory/arbory.toml"}) {
    if (!file.empty() && access(file.c_str(), F_OK) == 0) return file;
  }
  return {};
}

class Reader {
 public:
  explicit Reader(const std::string& file) : file_(file) {}

  void Read(Config* config) {
    const auto text = ReadWholeFile(AT_FDCWD, file_, kMaxFileBytes);
    if (!text) throw ConfigError(text.error().Text());
    const toml::table document = Parse(*text);
    const Keys keys = {
        {"state_dir", [&](const toml::node& node) { config->state_dir = Path(node); }},
        {"module", [&](const toml::node& node) { config->module = PathOrNone(node); }},
        {"volumes", [&](const toml::node& node) { config->volumes = Paths(node); }},
        {"shares", [&](const toml::node& node) { config->shares = Shares(node); }},
        {"searches_per_user",
         [&](const toml::node& node) { config->searches_per_user = Limit(node); }},
        {"lease_seconds", [&](const toml::node& node) { config->lease_seconds = Limit(node); }},
        {"call_memory_mb", [&](const toml::node& node) { config->call_memory_mb = Limit(node); }},
        {"large_call_memory_mb",
         [&](const toml::node& node) { config->large_call_memory_mb = Limit(node); }},
        {"large_calls_per_user",
         [&](const toml::node& node) { config->large_calls_per_user = Limit(node); }},
        {"server", [&](const toml::node& node) { ReadServer(node, &config->server); }},
        {"index", [&](const toml::node& node) { ReadIndex(node, &config->index); }},
        {"fleet", [&](const toml::node& node) { ReadBox(node, &config->box); }},
    };
    ReadTable(document, keys);
  }

  void ReadFleet(FleetSettings* fleet) {
    const auto text = ReadWholeFile(AT_FDCWD, file_, kMaxFileBytes);
    if (!text) throw ConfigError(text.error().Text());
    Keys keys = {
        {"front",
         [&](const toml::node& node) { fleet->front = FleetName(node.source(), Text(node)); }},
        {"realm", [&](const toml::node& node) { fleet->realm = Text(node); }},
        {"key_file", [&](const toml::node& node) { fleet->key_file = Path(node); }},
        {"proxy", [&](const toml::node& node) { fleet->proxy = PathOrNone(node); }},
        {"tls_folder", [&](const toml::node& node) { fleet->tls_folder = Path(node); }},
        {"boxes", [&](const toml::node& node) { fleet->boxes = Boxes(node); }},
    };
    AddLimits({{"deadline_ms", &fleet->deadline_ms},
               {"first_page_ms", &fleet->first_page_ms},
               {"rows_per_box", &fleet->rows_per_box}},
              &keys);
    ReadTable(Parse(*text), keys);
    for (const auto& [missing, what] :
         {std::pair(fleet->front.empty(), "front"), std::pair(fleet->key_file.empty(), "key_file"),
          std::pair(fleet->boxes.empty(), "boxes")}) {
      if (missing) throw ConfigError(file_ + ": \"" + what + "\" is missing");
    }
  }

 private:
  using Keys = std::map<std::string_view, std::function<void(const toml::node&)>>;

  toml::table Parse(const std::string& text) {
    try {
      return toml::parse(std::string_view(text), std::string_view(file_));
    } catch (const toml::parse_error& error) {
      throw ConfigError(Place(error.source()) + ": " + std::string(error.description()));
    }
  }

  std::string Place(const toml::source_region& source) const {
    return file_ + ":" + std::to_string(source.begin.line);
  }

  [[noreturn]] void Fail(const toml::source_region& source, const std::string& trouble) const {
    throw ConfigError(Place(source) + ": " + trouble);
  }

  void ReadTable(const toml::table& table, const Keys& keys) {
    for (const auto& [key, node] : table) {
      const auto known = keys.find(key.str());
      if (known == keys.end()) {
        Fail(key.source(), "unknown key \"" + std::string(key.str()) + "\"");
      }
      known->second(node);
    }
  }

  const toml::table& Table(const toml::node& node) {
    const toml::table* table = node.as_table();
    if (table == nullptr) Fail(node.source(), "a table is expected here");
    return *table;
  }

  void AddLimits(std::initializer_list<std::pair<const char*, int*>> limits, Keys* keys) {
    for (const auto& [name, limit] : limits) {
      (*keys)[name] = [this, limit = limit](const toml::node& value) { *limit = Limit(value); };
    }
  }

  void ReadServer(const toml::node& node, ServerSettings* server) {
    Keys keys = {
        {"listen", [&](const toml::node& value) { server->listen = Text(value); }},
        {"web_dir", [&](const toml::node& value) { server->web_dir = PathOrNone(value); }},
        {"behind_tls", [&](const toml::node& value) { server->behind_tls = Truth(value); }},
        {"origins", [&](const toml::node& value) { server->origins = Origins(value); }},
        {"proxies", [&](const toml::node& value) { server->proxies = Texts(value); }},
        {"pam_service", [&](const toml::node& value) { server->pam_service = Text(value); }},
        {"pam_dir", [&](const toml::node& value) { server->pam_dir = PathOrNone(value); }},
        {"access_log", [&](const toml::node& value) { server->access_log = Truth(value); }},
    };
    AddLimits(
        {
            {"max_connections", &server->max_connections},
            {"max_calls", &server->max_calls},
            {"body_bytes", &server->body_bytes},
            {"header_seconds", &server->header_seconds},
            {"idle_seconds", &server->idle_seconds},
            {"stall_seconds", &server->stall_seconds},
            {"call_seconds", &server->call_seconds},
            {"logins_per_minute", &server->logins_per_minute},
            {"session_minutes", &server->session_minutes},
            {"account_check_seconds", &server->account_check_seconds},
        },
        &keys);
    ReadTable(Table(node), keys);
  }

  void ReadIndex(const toml::node& node, IndexSettings* index) {
    Keys keys = {
        {"socket", [&](const toml::node& value) { index->socket = PathOrNone(value); }},
        {"folders", [&](const toml::node& value) { index->folders = Texts(value); }},
        {"modify_events", [&](const toml::node& value) { index->modify_events = Truth(value); }},
    };
    AddLimits({{"questions_per_user", &index->questions_per_user},
               {"question_memory_mb", &index->question_memory_mb},
               {"question_seconds", &index->question_seconds},
               {"max_changes", &index->max_changes},
               {"rewrite_minutes", &index->rewrite_minutes}},
              &keys);
    ReadTable(Table(node), keys);
  }

  void ReadBox(const toml::node& node, BoxSettings* box) {
    Keys keys = {
        {"name",
         [&](const toml::node& value) { box->name = FleetName(value.source(), Text(value)); }},
        {"fronts",
         [&](const toml::node& value) {
           for (const auto& [name, front] : Table(value)) {
             box->fronts.push_back(Front(FleetName(name.source(), std::string(name.str())), front));
           }
         }},
    };
    AddLimits({{"lowest_uid", &box->lowest_uid}}, &keys);
    ReadTable(Table(node), keys);
    if (box->name.empty()) Fail(node.source(), "the name that fronts know this box by is missing");
  }

  FrontSetting Front(const std::string& name, const toml::node& node) {
    FrontSetting front;
    front.name = name;
    Keys keys = {
        {"key", [&](const toml::node& value) { front.key = Key(value); }},
        {"realm", [&](const toml::node& value) { front.realm = Text(value); }},
        {"users", [&](const toml::node& value) { front.users = Texts(value); }},
        {"groups", [&](const toml::node& value) { front.groups = Texts(value); }},
    };
    AddLimits({{"searches", &front.searches}}, &keys);
    ReadTable(Table(node), keys);
    if (front.key.empty()) Fail(node.source(), "the front's public key is missing");
    return front;
  }

  std::vector<FleetBox> Boxes(const toml::node& node) {
    std::vector<FleetBox> boxes;
    for (const auto& [name, address] : Table(node)) {
      const std::string text = Text(address);
      if (!text.starts_with("http://") && !text.starts_with("https://")) {
        Fail(address.source(), "an address such as http://box1.example.net:8750 is expected here");
      }
      boxes.push_back({FleetName(name.source(), std::string(name.str())), text});
    }
    std::ranges::sort(boxes, {}, &FleetBox::name);
    return boxes;
  }

  // It is a folder's name in locations and a part of addresses; those of homes mean something else.
  std::string FleetName(const toml::source_region& source, const std::string& name) {
    constexpr std::string_view kAllowed =
        "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789-_";
    constexpr size_t kMostBytes = 64;
    const bool good = !name.empty() && name.size() <= kMostBytes &&
                      name.find_first_not_of(kAllowed) == std::string::npos;
    if (!good || name == "home" || name == "homes") {
      Fail(source, "a name of letters, digits, '-' and '_' is expected here, no \"home\"");
    }
    return name;
  }

  std::string Key(const toml::node& node) {
    constexpr size_t kKeyDigits = 64;
    const std::string key = Text(node);
    if (key.size() != kKeyDigits ||
        key.find_first_not_of("0123456789abcdef") != std::string::npos) {
      Fail(node.source(),
           "64 hexadecimal digits are expected here, as arbory fleet key prints them");
    }
    return key;
  }

  std::string Text(const toml::node& node) {
    const auto* text = node.as_string();
    if (text == nullptr) Fail(node.source(), "a text is expected here");
    return text->get();
  }

  std::string Path(const toml::node& node) {
    const std::string path = Text(node);
    if (!path.starts_with('/')) Fail(node.source(), "an absolute path is expected here");
    return path;
  }

  // Where an empty text, which is the default, stands for a place of the program's own choice.
  std::string PathOrNone(const toml::node& node) {
    return node.value_or<std::string_view>("?").empty() ? std::string() : Path(node);
  }

  bool Truth(const toml::node& node) {
    const auto* truth = node.as_boolean();
    if (truth == nullptr) Fail(node.source(), "true or false is expected here");
    return truth->get();
  }

  int Limit(const toml::node& node) {
    const auto* number = node.as_integer();
    if (number == nullptr || number->get() < 1 || number->get() > kMaxLimit) {
      Fail(node.source(), "a number from 1 to " + std::to_string(kMaxLimit) + " is expected here");
    }
    return static_cast<int>(number->get());
  }

  template <typename Item>
  auto ListOf(const toml::node& node, Item item) {
    const toml::array* array = node.as_array();
    if (array == nullptr) Fail(node.source(), "a list of texts is expected here");
    std::vector<std::string> texts;
    for (const toml::node& element : *array) texts.push_back(item(element));
    return texts;
  }

  std::vector<std::string> Paths(const toml::node& node) {
    return ListOf(node, [this](const toml::node& item) { return Path(item); });
  }

  std::vector<std::string> Texts(const toml::node& node) {
    return ListOf(node, [this](const toml::node& item) { return Text(item); });
  }

  // As browsers write them: another way would match no request.
  std::vector<std::string> Origins(const toml::node& node) {
    return ListOf(node, [this](const toml::node& item) {
      const std::string origin = Text(item);
      const size_t mark = origin.find("://");
      const std::string scheme = origin.substr(0, mark);
      const bool known = mark != std::string::npos && (scheme == "https" || scheme == "http");
      const std::string host = known ? origin.substr(mark + 3) : std::string();
      if (host.empty() || host.find_first_of("/?#@ ") != std::string::npos) {
        Fail(item.source(),
             "an address without a path, such as https://search.example.net, is expected here");
      }
      return origin;
    });
  }

  std::vector<ShareSetting> Shares(const toml::node& node) {
    const toml::table* table = node.as_table();
    if (table == nullptr) Fail(node.source(), "a table of shares is expected here");
    std::vector<ShareSetting> shares;
    for (const auto& [name, directory] : *table) {
      shares.push_back({std::string(name.str()), Path(directory), Place(name.source())});
    }
    return shares;
  }

  std::string file_;
};

}  // namespace

Config DefaultConfig() {
  Config config;
  config.state_dir = DefaultStateDir();
  return config;
}

Config LoadConfig(const std::string& path) {
  Config config = DefaultConfig();
  const std::string file = FindFile(path);
  if (!file.empty()) Reader(file).Read(&config);
  return config;
}

FleetSettings LoadFleet(const std::string& path) {
  FleetSettings fleet;
  Reader(path).ReadFleet(&fleet);
  return fleet;
}

}  // namespace nas
