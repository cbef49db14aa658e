#pragma once
// A real `arbory serve` on a free loopback port, and a client that sends exactly the bytes it is
// given.

#include <json/value.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "nas/base/unique_fd.h"
#include "tests/nas/fixture.h"

namespace server_test {

using nas_test::Eventually;
using nas_test::kSoon;

Json::Value Parsed(const std::string& text);

// Of the configuration: the module whose methods are slow, large and deadly.
inline constexpr char kMisbehaving[] = "module = \"" ARBORY_BIN_DIR "/misbehaving.so\"\n";

struct Reply {
  int status = 0;                             // 0: the connection ended without a whole reply
  std::map<std::string, std::string> fields;  // names in lower case
  std::string body;

  Json::Value json() const { return Parsed(body); }
  int code() const { return json()["code"].asInt(); }
};

// One connection.
class Client {
 public:
  // `from` is the loopback address that the connection comes from.
  explicit Client(int port, const std::string& from = "127.0.0.1");
  bool Send(const std::string& bytes);
  // The next reply; `without_body` for one to HEAD.
  Reply Read(bool without_body = false);
  // Whether the server ended the connection, with nothing more to read, soon.
  bool Ended();
  void HalfClose();
  int fd() const { return fd_.get(); }

 private:
  bool Fill();

  nas::UniqueFd fd_;
  std::string in_;
};

struct Server {
  pid_t pid = -1;
  int port = 0;
  std::string open_path;  // "/open?token=..."; empty with logins
  std::string cookie;     // "name=value", sent by the calls below when not empty

  // A whole request on its own connection. `fields` are lines with their CRLF.
  Reply Ask(const std::string& method, const std::string& target, const std::string& body = "",
            const std::string& fields = "") const;
  Reply Get(const std::string& target) const { return Ask("GET", target); }
  Reply Post(const std::string& target, const std::string& json) const;
  Reply Call(const std::string& method, const std::string& json) const;
  // Whether a line of the counts is this, a name and a value.
  bool Counts(const std::string& line) const;
  std::string Host() const { return "127.0.0.1:" + std::to_string(port); }
  std::string RequestText(const std::string& method, const std::string& target,
                          const std::string& body, const std::string& fields) const;
  // Opens the session by the token and keeps its cookie.
  void Open();
  bool LogIn(const std::string& user, const std::string& password);
};

class ServerTest : public nas_test::PlatformTest {
 protected:
  void SetUp() override;
  void TearDown() override;

  enum class As { kOrdinaryUser, kRootWithLogins };
  // Starts a server; `server_lines` go into the [server] table and `top_lines` before it.
  Server Start(const std::string& server_lines = "", const std::string& top_lines = "",
               As as = As::kOrdinaryUser);
  // The same with the misbehaving module.
  Server StartMisbehaving(const std::string& server_lines = "");
  // Ends it by SIGTERM; its exit status.
  int Stop(const Server& server);
  std::string Log() const { return nas_test::ReadFile(dir_ + "/log"); }

  // The user whom the server acts for in single-user mode.
  static std::string User();
  std::string program_ = ARBORY_BIN_DIR "/arbory";  // that servers are started of
  std::string fleet_file_;   // what a front is started with; empty: it is none
  std::string root_state_;   // the state folder of root's server
  std::string share_;        // the folder of the share "photo", the user's own
  std::string share_lines_;  // of the configuration

 private:
  std::vector<pid_t> servers_;
};

}  // namespace server_test
