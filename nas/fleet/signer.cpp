#include "nas/fleet/signer.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <syslog.h>

#include <algorithm>
#include <charconv>
#include <iterator>
#include <sstream>
#include <utility>
#include <vector>

#include "nas/base/file_io.h"
#include "nas/base/random_name.h"
#include "nas/base/system_call.h"
#include "nas/base/unique_fd.h"
#include "nas/fleet/token.h"
#include "nas/system/child.h"
#include "nas/system/identity.h"

namespace nas {
namespace {

// Few, so that the first tokens are there soon.
constexpr size_t kMostQuestions = 8;  // of a message
// That are under way; together far less than a connection holds, so that neither end waits for the
// other to read.
constexpr size_t kMostMessages = 4;
constexpr size_t kMostMessageBytes = kMostQuestions * 2048;
constexpr size_t kMostKeyBytes = 256;

// A line, of a token that there is not.
constexpr char kNone[] = "-";

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
  const bool known = std::ranges::binary_search(fleet.boxes, token.box, {}, &FleetBox::name);
  if (!words || !known || !FromHex(token.hash) || std::abs(offset) > kMostClockOff) return {};
  token.front = fleet.front;
  token.user = fleet.realm.empty() ? user : user + "@" + fleet.realm;
  token.issued = std::time(nullptr) + offset;
  token.nonce = RandomName();
  return SignedToken(token, key);
}

std::vector<std::string> LinesOf(const std::string& message) {
  std::vector<std::string> lines;
  std::istringstream stream(message);
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
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
    const std::string questions = Receive(connection);
    if (questions.empty()) return;
    std::string tokens;
    for (const std::string& question : LinesOf(questions)) {
      const std::string token = Answer(question, user, key);
      tokens += (token.empty() ? kNone : token) + "\n";
    }
    if (!Send(connection, tokens)) return;
  }
}

}  // namespace

void StartFleetSigner(const std::string& user) {
  if (CurrentConfig().fleet.boxes.empty()) return;
  g_signer = StartAnsweringChild([&](int connection) { AnswerAll(connection, user); }).fd;
}

void FleetTokens::Ask(const FleetBox& box, const std::string& hash, int clock_offset) {
  questions_.push_back(box.name + " " + hash + " " + std::to_string(clock_offset) + "\n");
  // The first are signed while the others are still thought of.
  if (questions_.size() >= kMostQuestions) Send();
}

std::string FleetTokens::Take() {
  Send();
  if (tokens_.empty() && !Receive()) {
    // Nobody signs any more.
    if (!questions_.empty()) questions_.pop_front();
    return {};
  }
  std::string token = std::move(tokens_.front());
  tokens_.pop_front();
  return token == kNone ? std::string() : token;
}

void FleetTokens::Drop() {
  questions_.clear();
  while (!under_way_.empty()) Receive();
  tokens_.clear();
}

void FleetTokens::Send() {
  while (g_signer && !questions_.empty() && under_way_.size() < kMostMessages) {
    std::string message;
    size_t lines = 0;
    for (; lines < std::min(kMostQuestions, questions_.size()); ++lines) {
      message += questions_[lines];
    }
    if (!nas::Send(g_signer.get(), message)) return;
    questions_.erase(questions_.begin(), questions_.begin() + static_cast<std::ptrdiff_t>(lines));
    under_way_.push_back(lines);
  }
}

// False where nothing is under way. What the signer has not answered counts as a refusal.
bool FleetTokens::Receive() {
  if (under_way_.empty()) return false;
  std::vector<std::string> answers = LinesOf(nas::Receive(g_signer.get()));
  answers.resize(under_way_.front(), kNone);
  under_way_.pop_front();
  std::ranges::move(answers, std::back_inserter(tokens_));
  return true;
}

}  // namespace nas
