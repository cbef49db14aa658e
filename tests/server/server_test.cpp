#include "tests/server/server_test.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <pwd.h>
#include <sys/prctl.h>
#include <sys/socket.h>

#include <algorithm>

#include "nas/base/json_text.h"

namespace server_test {

using nas_test::AmRoot;
using nas_test::WriteFile;
using std::chrono::milliseconds;
using std::chrono::steady_clock;

namespace {

constexpr size_t kReadBytes = size_t{64} << 10;
const int kSoonMs = static_cast<int>(milliseconds(kSoon).count());

std::string Lower(std::string text) {
  std::transform(text.begin(), text.end(), text.begin(),
                 [](unsigned char c) { return tolower(c); });
  return text;
}

void GiveTo(const std::string& path, const std::string& user) {
  const passwd* account = getpwnam(user.c_str());
  ASSERT_EQ(chown(path.c_str(), account->pw_uid, account->pw_gid), 0);
}

[[noreturn]] void Exec(const std::string& program, const std::string& config,
                       const std::string& fleet, const std::string& log, int out, bool step_down) {
  const int null = open("/dev/null", O_RDONLY);
  const int err = open(log.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0666);
  dup2(null, STDIN_FILENO);
  dup2(out, STDOUT_FILENO);
  dup2(err, STDERR_FILENO);
  prctl(PR_SET_PDEATHSIG, SIGTERM);  // a test that crashes leaves no server behind
  // Root serves the other user without becoming it first: that user may not be able to enter the
  // tree.
  std::vector<const char*> words = {"arbory", "serve", "--config", config.c_str()};
  if (!fleet.empty()) words.insert(words.end(), {"--fleet", fleet.c_str()});
  if (step_down) words.insert(words.end(), {"--user", nas_test::kOtherUser});
  words.push_back(nullptr);
  execv(program.c_str(), const_cast<char**>(words.data()));
  _exit(98);
}

}  // namespace

Json::Value Parsed(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(nas::ParseJson(text, &value)) << text;
  return value;
}

Client::Client(int port, const std::string& from)
    : fd_(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  inet_pton(AF_INET, from.c_str(), &address.sin_addr);
  EXPECT_EQ(bind(fd_.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  address.sin_port = htons(static_cast<uint16_t>(port));
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  EXPECT_EQ(connect(fd_.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
}

bool Client::Send(const std::string& bytes) {
  size_t done = 0;
  while (done < bytes.size()) {
    const ssize_t sent = send(fd_.get(), bytes.data() + done, bytes.size() - done, MSG_NOSIGNAL);
    if (sent <= 0) return false;
    done += static_cast<size_t>(sent);
  }
  return true;
}

void Client::HalfClose() { shutdown(fd_.get(), SHUT_WR); }

bool Client::Fill() {
  pollfd watched = {fd_.get(), POLLIN, 0};
  if (poll(&watched, 1, kSoonMs) != 1) return false;
  const size_t before = in_.size();
  in_.resize(before + kReadBytes);
  const ssize_t count = recv(fd_.get(), in_.data() + before, kReadBytes, 0);
  in_.resize(before + (count > 0 ? static_cast<size_t>(count) : 0));
  return count > 0;
}

Reply Client::Read(bool without_body) {
  size_t end;
  while ((end = in_.find("\r\n\r\n")) == std::string::npos) {
    if (!Fill()) return {};
  }
  Reply reply;
  reply.status = in_.starts_with("HTTP/1.1 ") ? std::stoi(in_.substr(9, 3)) : 0;
  for (size_t at = in_.find("\r\n") + 2; at < end;) {
    const size_t line_end = in_.find("\r\n", at);
    const size_t colon = in_.find(": ", at);
    EXPECT_LT(colon, line_end) << in_.substr(at, line_end - at);
    const std::string name = Lower(in_.substr(at, colon - at));
    EXPECT_TRUE(reply.fields.emplace(name, in_.substr(colon + 2, line_end - colon - 2)).second)
        << name << " is there twice";
    at = line_end + 2;
  }
  in_.erase(0, end + 4);
  if (!without_body && reply.fields.contains("transfer-encoding")) {  // as it comes
    while (!in_.ends_with("\r\n0\r\n\r\n")) {
      if (!Fill()) return {};
    }
    reply.body.swap(in_);
    return reply;
  }
  const size_t length = without_body ? 0 : std::stoul(reply.fields["content-length"]);
  while (in_.size() < length) {
    if (!Fill()) return {};
  }
  reply.body = in_.substr(0, length);
  in_.erase(0, length);
  return reply;
}

bool Client::Ended() {
  const auto end = steady_clock::now() + kSoon;
  while (Fill() && steady_clock::now() < end) {
  }
  pollfd watched = {fd_.get(), POLLIN, 0};
  return poll(&watched, 1, 0) == 1 && steady_clock::now() < end;
}

std::string Server::RequestText(const std::string& method, const std::string& target,
                                const std::string& body, const std::string& fields) const {
  std::string text = method + " " + target + " HTTP/1.1\r\nHost: " + Host() + "\r\n" + fields;
  if (!cookie.empty()) text += "Cookie: " + cookie + "\r\n";
  if (!body.empty()) text += "Content-Length: " + std::to_string(body.size()) + "\r\n";
  return text + "\r\n" + body;
}

Reply Server::Ask(const std::string& method, const std::string& target, const std::string& body,
                  const std::string& fields) const {
  Client client(port);
  client.Send(RequestText(method, target, body, fields));
  return client.Read(method == "HEAD");
}

Reply Server::Post(const std::string& target, const std::string& json) const {
  return Ask("POST", target, json, "Content-Type: application/json\r\n");
}

Reply Server::Call(const std::string& method, const std::string& json) const {
  return Post("/api/NUVA.Arbory.Search/2/" + method, json);
}

bool Server::Counts(const std::string& line) const {
  return Get("/metrics").body.find("\n" + line + "\n") != std::string::npos;
}

void Server::Open() {
  const std::string set = Get(open_path).fields["set-cookie"];
  ASSERT_FALSE(set.empty());
  cookie = set.substr(0, set.find(';'));
}

bool Server::LogIn(const std::string& user, const std::string& password) {
  Json::Value body;
  body["user"] = user;
  body["password"] = password;
  const Reply reply = Post("/login", nas::JsonText(body, nas::JsonBytes::kRaw));
  if (reply.status != 200) return false;
  const std::string& set = reply.fields.at("set-cookie");
  cookie = set.substr(0, set.find(';'));
  return true;
}

std::string ServerTest::User() { return AmRoot() ? nas_test::kOtherUser : nas_test::Me(); }

void ServerTest::SetUp() {
  PlatformTest::SetUp();
  root_state_ = dir_ + "/root-state";
  share_ = MakeFolder("photo");
  share_lines_ = "[shares]\nphoto = \"" + share_ + "\"\n";
  MakeFolder("state");
  if (AmRoot()) GiveTo(share_, User());
}

void ServerTest::TearDown() {
  while (!servers_.empty()) EXPECT_EQ(Stop({servers_.front(), 0, "", ""}), 0) << Log();
  EXPECT_EQ(Log().find("Sanitizer"), std::string::npos) << Log();
  EXPECT_EQ(Log().find("runtime error"), std::string::npos) << Log();
  PlatformTest::TearDown();
}

Server ServerTest::Start(const std::string& server_lines, const std::string& top_lines, As as) {
  const bool logins = as == As::kRootWithLogins;
  const std::string state = logins ? root_state_ : state_;
  const std::string config = dir_ + "/server.toml";
  WriteFile(config, "state_dir = \"" + state + "\"\nvolumes = [\"" + dir_ + "/volume*\"]\n" +
                        top_lines + share_lines_ + "[server]\nlisten = \"127.0.0.1:0\"\n" +
                        server_lines);
  WriteFile(dir_ + "/log", "");
  chmod((dir_ + "/log").c_str(), 0666);
  int ends[2];
  EXPECT_EQ(pipe2(ends, O_CLOEXEC), 0);
  const nas::UniqueFd out(ends[0]);
  Server server;
  server.pid = fork();
  if (server.pid == 0)
    Exec(program_, config, fleet_file_, dir_ + "/log", ends[1], AmRoot() && !logins);
  close(ends[1]);
  servers_.push_back(server.pid);
  std::string said;
  char byte;
  while (said.find("Open http") == std::string::npos || !said.ends_with('\n')) {
    if (read(out.get(), &byte, 1) != 1) {
      ADD_FAILURE() << "the server did not start: " << said << Log();
      return server;
    }
    said += byte;
  }
  const size_t address = said.find("http://127.0.0.1:") + 17;
  server.port = std::stoi(said.substr(address));
  const std::string path = said.substr(said.find('/', address));
  if (path.starts_with("/open")) server.open_path = path.substr(0, path.size() - 1);
  return server;
}

Server ServerTest::StartMisbehaving(const std::string& server_lines) {
  Server server = Start(server_lines, kMisbehaving);
  server.Open();
  return server;
}

int ServerTest::Stop(const Server& server) {
  int status = -1;
  const auto ended = [&] { return waitpid(server.pid, &status, WNOHANG) == server.pid; };
  kill(server.pid, SIGTERM);
  if (!Eventually(ended)) {
    ADD_FAILURE() << "the server does not stop";
    kill(server.pid, SIGKILL);
    waitpid(server.pid, &status, 0);
  }
  std::erase(servers_, server.pid);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

}  // namespace server_test
