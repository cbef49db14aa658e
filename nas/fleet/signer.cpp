#include "nas/fleet/signer.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <syslog.h>

#include <algorithm>
#include <charconv>
#include <sstream>

#include "nas/base/file_io.h"
#include "nas/base/random_name.h"
#include "nas/base/system_call.h"
#include "nas/base/unique_fd.h"
#include "nas/fleet/token.h"
#include "nas/system/child.h"
#include "nas/system/identity.h"

namespace nas {
namespace {

constexpr size_t kMostMessageBytes = 1024;
constexpr size_t kMostKeyBytes = 256;

// Of this process and its forks. Guard: set once, by a process of one thread.
UniqueFd g_signer;

// Bytes; empty, with a line in the log, where the file cannot be used.
std::string ReadKey(const std::string& path) {
  const ScopedRoot root;  // the terminal's process is the user's already
  struct stat info;
  if (stat(path.c_str(), &info) == 0 && (info.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
    syslog(LOG_ERR, "fleet: %s can be read by others; the key is not used", path.c_str());
    return {};
  }
  const auto text = ReadWholeFile(AT_FDCWD, path, kMostKeyBytes);
  if (!text) {
    syslog(LOG_ERR, "fleet: %s", text.error().Text().c_str());
    return {};
  }
  return FromHex(text->substr(0, text->find('\n'))).value_or("");
}

std::string Answer(const std::string& question, const std::string& user, const std::string& key) {
  const FleetSettings& fleet = CurrentConfig().fleet;
  std::istringstream words(question);
  FleetToken token;
  int offset = 0;
  words >> token.box >> token.hash >> offset;
  const bool known =
      std::ranges::find(fleet.boxes, token.box, &FleetBox::name) != fleet.boxes.end();
  if (!words || !known || !FromHex(token.hash) || std::abs(offset) > kMostClockOff) return {};
  token.front = fleet.front;
  token.user = fleet.realm.empty() ? user : user + "@" + fleet.realm;
  token.issued = std::time(nullptr) + offset;
  token.nonce = RandomName();
  return SignedToken(token, key);
}

std::string Receive(int connection) {
  std::string message(kMostMessageBytes, '\0');
  const ssize_t count =
      Uninterrupted([&] { return recv(connection, message.data(), message.size(), 0); });
  message.resize(count > 0 ? static_cast<size_t>(count) : 0);
  return message;
}

bool Send(int connection, const std::string& message) {
  return Uninterrupted([&] {
           return send(connection, message.data(), message.size(), MSG_NOSIGNAL);
         }) == static_cast<ssize_t>(message.size());
}

void AnswerAll(int connection, const std::string& user) {
  const std::string key = ReadKey(CurrentConfig().fleet.key_file);
  if (key.empty()) return;
  for (;;) {
    const std::string question = Receive(connection);
    if (question.empty()) return;
    const std::string token = Answer(question, user, key);
    // An empty message would be taken for the end.
    if (!Send(connection, token.empty() ? "-" : token)) return;
  }
}

}  // namespace

void StartFleetSigner(const std::string& user) {
  if (CurrentConfig().fleet.boxes.empty()) return;
  g_signer = StartAnsweringChild([&](int connection) { AnswerAll(connection, user); }).fd;
}

std::string FleetTokenFor(const FleetBox& box, const std::string& hash, int clock_offset) {
  if (!g_signer ||
      !Send(g_signer.get(), box.name + " " + hash + " " + std::to_string(clock_offset))) {
    return {};
  }
  const std::string token = Receive(g_signer.get());
  return token == "-" ? std::string() : token;
}

}  // namespace nas
