#include "arbory/fleet_command.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <utility>
#include <vector>

#include "arbory/terminal.h"
#include "nas/base/accounts.h"
#include "nas/base/file_io.h"
#include "nas/base/json_text.h"
#include "nas/base/unique_fd.h"
#include "nas/fleet/asker.h"
#include "nas/fleet/library.h"
#include "nas/fleet/signer.h"
#include "nas/fleet/token.h"

namespace arbory {
namespace {

constexpr char kProxyUser[] = "haproxy";
constexpr size_t kMostStatusBytes = size_t{64} << 10;
constexpr size_t kMostConfigBytes = size_t{16} << 20;  // ten thousand boxes
constexpr mode_t kReadableByAll = S_IRUSR | S_IWUSR | S_IRGRP | S_IROTH;

// "box1.example.net:8750" and whether TLS is spoken there.
std::pair<std::string, bool> ServerOf(const nas::FleetBox& box) {
  constexpr char kUsualPort[] = ":80";
  constexpr char kTlsPort[] = ":443";
  const bool tls = box.address.starts_with("https://");
  std::string host = box.address.substr(box.address.find("://") + 3);
  host = host.substr(0, host.find('/'));
  const size_t bracket = host.rfind(']');
  const bool has_port = host.find(':', bracket == std::string::npos ? 0 : bracket) != host.npos;
  return {has_port ? host : host + (tls ? kTlsPort : kUsualPort), tls};
}

// Between two checks of a box: a hundred a second of all.
size_t CheckSeconds(size_t boxes) {
  constexpr size_t kFewest = 2;
  constexpr size_t kChecksASecond = 100;
  return std::max(kFewest, boxes / kChecksASecond);
}

// Each box has a backend of its own: a pool of connections that are kept, and a check that makes a
// dead one be told of at once.
std::string ProxyConfig(const nas::FleetSettings& fleet) {
  std::string text =
      "# Printed by `arbory fleet config`. The socket is open to all: tokens are what boxes go "
      "by.\n";
  // Root's reads keys and binds the socket as root, and does all else as this user.
  if (geteuid() == 0 && nas::FindAccount(kProxyUser)) {
    text += std::string("global\n    user ") + kProxyUser + "\n\n";
  }
  text +=
      "defaults\n"
      "    mode http\n"
      "    timeout connect 1s\n"
      "    timeout client 1m\n"
      "    timeout server 1m\n"
      "    timeout check 2s\n"
      "    retries 0\n"
      "    http-reuse always\n"
      "    option httpchk\n"
      // A name that is not known now is that of one box that is down, no reason not to start.
      "    default-server check inter " +
      std::to_string(CheckSeconds(fleet.boxes.size())) +
      "s fall 2 rise 1 fastinter 1s init-addr last,libc,none\n"
      "\n"
      "frontend arbory_fleet\n"
      "    bind unix@" +
      fleet.proxy +
      " mode 666\n"
      "    use_backend arbory_%[req.hdr(host)]\n";
  for (const nas::FleetBox& box : fleet.boxes) {
    const auto [server, tls] = ServerOf(box);
    const std::string host = server.substr(0, server.rfind(':'));
    text += "\nbackend arbory_" + box.name +
            "\n    http-check send meth GET uri /health ver HTTP/1.1 hdr Host " + server +
            "\n    http-request set-header Host " + server + "\n    server " + box.name + " " +
            server;
    if (tls) {
      text += " ssl verify required ca-file " + fleet.tls_folder + "/ca.pem crt " +
              fleet.tls_folder + "/front.pem verifyhost " + host + " sni str(" + host + ")";
    }
    text += "\n";
  }
  return text;
}

// What a box says, as a terminal may show it.
std::string Plain(const std::string& said) {
  constexpr size_t kMostBytes = 40;
  std::string text = said.substr(0, kMostBytes);
  std::ranges::replace_if(
      text, [](unsigned char byte) { return byte < ' ' || byte > '~'; }, '?');
  return text;
}

// What is told of one box.
struct BoxLine {
  std::string name;
  bool answered = false;
  std::string state = nas::BoxStateName(nas::BoxState::kAsked);
  std::string version = "-";
  std::string names = "-";  // that its index knows
  std::string index = "-";
  std::string clock = "-";  // seconds that the box is ahead
  std::string spent = "-";  // milliseconds
  std::string why;

  void Take(const nas::BoxAnswer& answer, std::chrono::steady_clock::duration time) {
    Json::Value said;
    state = nas::BoxStateName(answer.state);
    why = answer.why;
    answered = answer.state == nas::BoxState::kAnswered && nas::ParseJson(answer.body, &said) &&
               said.isObject() && said["version"].isString() && said["now"].isInt64();
    if (!answered) return;
    version = Plain(said["version"].asString());
    if (said["names"].isUInt64()) names = std::to_string(said["names"].asUInt64());
    if (said["index"].isString()) index = Plain(said["index"].asString());
    clock = std::to_string(said["now"].asInt64() - std::time(nullptr));
    spent = std::to_string(std::chrono::ceil<std::chrono::milliseconds>(time).count());
  }

  static std::string Row(const std::vector<std::string>& cells) {
    constexpr size_t kWidths[] = {20, 10, 12, 12, 14, 8, 6};
    std::string text;
    for (size_t i = 0; i < cells.size(); ++i) {
      text += cells[i];
      if (i + 1 == cells.size()) break;
      text.append(cells[i].size() < kWidths[i] ? kWidths[i] - cells[i].size() : 1, ' ');
    }
    while (text.ends_with(' ')) text.pop_back();
    return text + "\n";
  }
  static std::string Head() {
    return Row({"BOX", "STATE", "VERSION", "NAMES", "INDEX", "CLOCK", "MS", "WHY"});
  }
  std::string Text() const { return Row({name, state, version, names, index, clock, spent, why}); }
};

}  // namespace

int RunFleetKeyCommand(const FleetOptions& options) {
  std::string secret;
  std::string open_part;
  nas::LoadFleetLibrary().make_key(&secret, &open_part);
  // A key that is there may be one that boxes know.
  const nas::UniqueFd file(open(options.key_file.c_str(),
                                O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                                S_IRUSR | S_IWUSR));
  const nas::Status written =
      file ? nas::WriteAll(file.get(), nas::ToHex(secret) + "\n") : nas::ErrnoError();
  if (!written) {
    throw UsageError("the key cannot be written to " + options.key_file + ": " +
                     std::strerror(written.error().error_number));
  }
  Print(nas::ToHex(open_part) + "\n");
  return kExitSuccess;
}

int RunFleetConfigCommand(const FleetOptions& options) {
  const nas::FleetSettings fleet = nas::LoadFleet(options.file);
  if (fleet.proxy.empty()) {
    throw UsageError("name the proxy's socket in " + options.file +
                     ", such as proxy = \"/run/haproxy/arbory.sock\"");
  }
  const std::string text = ProxyConfig(fleet);
  if (options.write.empty()) {
    Print(text);
    return kExitSuccess;
  }
  const auto before = nas::ReadWholeFile(AT_FDCWD, options.write, kMostConfigBytes);
  if (before && *before == text) return kExitSuccess;
  const nas::Status written =
      nas::ReplaceFile(AT_FDCWD, options.write, text, kReadableByAll, nas::Durability::kFull);
  if (!written) throw UsageError("cannot write " + written.error().Text());
  if (!options.reload.empty() && std::system(options.reload.c_str()) != 0) {
    throw UsageError("written to " + options.write + ", but this failed: " + options.reload);
  }
  return kExitSuccess;
}

int RunFleetStatusCommand(const FleetOptions& options) {
  nas::Config config = nas::DefaultConfig();
  config.fleet = nas::LoadFleet(options.file);
  nas::Configure(std::move(config));
  const auto caller = nas::FindAccount(geteuid());
  if (!caller) throw UsageError("the calling user has no name here");
  nas::StartFleetSigner(caller->name);
  const nas::FleetSettings& fleet = nas::CurrentConfig().fleet;
  nas::FleetAsker asker(fleet, kMostStatusBytes);
  std::vector<BoxLine> lines(fleet.boxes.size());
  const auto begun = std::chrono::steady_clock::now();
  for (size_t i = 0; i < fleet.boxes.size(); ++i) {
    lines[i].name = fleet.boxes[i].name;
    asker.Ask(fleet.boxes[i], {"GET", "/fleet/status"}, [&, i](const nas::BoxAnswer& answer) {
      lines[i].Take(answer, std::chrono::steady_clock::now() - begun);
    });
  }
  asker.Run([] { return false; });
  std::string text = BoxLine::Head();
  for (const BoxLine& line : lines) text += line.Text();
  Print(text);
  return std::ranges::all_of(lines, &BoxLine::answered) ? kExitSuccess : kExitNothing;
}

}  // namespace arbory
