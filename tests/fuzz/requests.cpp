// Requests to the service: targets, fields, cookies, ranges and bodies, by somebody with a session
// and by somebody without one. No child is made: what one would answer is played.

#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>

#include "arbory/server/service/files.h"
#include "arbory/server/service/service.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/json_text.h"
#include "tests/fuzz/fuzz.h"

namespace {

using arbory::HttpReply;
using arbory::HttpRequest;

constexpr char kCookie[] = "arbory";
constexpr std::string_view kSession = "@";  // in a cookie: the id of a session
constexpr pid_t kChild = 4711;

class Server {
 public:
  Server() : module_(""), service_(Setup(), module_) {
    HttpRequest request;
    request.method = "GET";
    request.target = "/open?token=" + service_.NewToken();
    request.fields = {{"host", "localhost"}};
    const auto answer = service_.Handle(&request);
    for (const auto& [name, value] : std::get<HttpReply>(answer).fields) {
      if (name != "Set-Cookie") continue;
      session_ = value.substr(0, value.find(';'));
      session_.erase(0, session_.find('=') + 1);
    }
    DEMAND(session_.size() > 16);
  }

  const std::string& session() const { return session_; }
  arbory::Service& service() { return service_; }

 private:
  static arbory::Service::Setup Setup() {
    const std::string web = fuzz::Scratch() + "/web";
    std::filesystem::create_directories(web);
    fuzz::WriteFile(web + "/index.html", "<p>page</p>");
    arbory::Service::Setup setup;
    setup.settings.access_log = false;
    setup.settings.max_calls = 4;
    setup.single_user = "ann";
    setup.cookie = kCookie;
    setup.web_dir = web;
    setup.counts = [] { return arbory::ServerCounts{}; };
    return setup;
  }

  nas::Module module_;
  arbory::Service service_;
  std::string session_;
};

// "METHOD TARGET", fields, an empty line, the body.
HttpRequest ReadRequest(std::string_view text, const std::string& session, bool* knows_session) {
  HttpRequest request;
  std::string_view first = fuzz::Take(&text, '\n');
  request.method = fuzz::Take(&first, ' ');
  request.target = first;
  request.peer = "127.0.0.1";
  while (!text.empty()) {
    std::string_view line = fuzz::Take(&text, '\n');
    if (line.empty()) break;
    const std::string name = arbory::LowerCase(fuzz::Take(&line, ':'));
    if (line.starts_with(' ')) line.remove_prefix(1);
    std::string value(line);
    const size_t at = name == "cookie" ? value.find(kSession) : std::string::npos;
    if (at != std::string::npos) {
      value.replace(at, 1, session);
      *knows_session = true;
    }
    request.fields.emplace_back(name, value);
  }
  request.body = text;
  return request;
}

// A connection hands over only what it took for a request.
bool CouldArrive(const HttpRequest& request) {
  const auto bad = [](unsigned char byte) { return byte <= ' ' || byte == 0x7f; };
  const auto broken = [](unsigned char byte) { return byte < ' ' && byte != '\t'; };
  if (request.method.empty() || request.target.empty()) return false;
  if (std::ranges::any_of(request.method + request.target, bad)) return false;
  return std::ranges::none_of(
      request.fields, [&](const auto& field) { return std::ranges::any_of(field.second, broken); });
}

void CheckReply(const HttpReply& reply) {
  DEMAND(reply.status >= 200 && reply.status < 504);
  bool json = false;
  for (const auto& [name, value] : reply.fields) {
    // A line's end in a field would begin another, or the body.
    for (const unsigned char byte : name + value) DEMAND(byte >= ' ');
    json |= name == "Content-Type" && value == "application/json";
  }
  Json::Value body;
  if (json && !reply.child_follows) DEMAND(nas::ParseJson(reply.body, &body));
  if (json && reply.status >= 400) DEMAND(!body["error"].asString().empty());
}

void CheckRange(const HttpRequest& request) {
  const std::string* field = request.Field("range");
  if (field == nullptr) return;
  for (const std::uint64_t size : {std::uint64_t{0}, std::uint64_t{1}, std::uint64_t{1000},
                                   std::uint64_t{1} << 63, ~std::uint64_t{0}}) {
    const arbory::ByteRange range = arbory::ParseRange(*field, size);
    DEMAND(range.first <= size && range.count <= size - range.first);
    if (range.partial) DEMAND(range.satisfiable && range.count > 0);
    if (!range.partial && range.satisfiable) DEMAND(range.first == 0 && range.count == size);
  }
}

}  // namespace

extern "C" {
void syslog(int /*priority*/, const char* /*format*/, ...) {}
void __syslog_chk(int /*priority*/, int /*flag*/, const char* /*format*/, ...) {}
pid_t fork() noexcept { return kChild; }
}

int fuzz::Target(std::string_view input) {
  static Server server;
  bool knows_session = false;
  HttpRequest request = ReadRequest(input, server.session(), &knows_session);
  if (!CouldArrive(request)) return fuzz::kUseless;
  // A logout would end the session of all inputs to come.
  if (request.target.find("logout") != std::string::npos) return fuzz::kUseless;
  arbory::Answer answer = server.service().Handle(&request);
  if (auto* child = std::get_if<arbory::ChildAnswer>(&answer)) {
    // Nobody without a session makes this server fork.
    DEMAND(knows_session && request.user == "ann");
    const nas::ReplyHead head{arbory::kOk, 0, {}};
    CheckReply(child->make_reply(input.size() % 2 == 0 ? &head : nullptr));
  } else {
    CheckReply(std::get<HttpReply>(answer));
  }
  CheckRange(request);
  return fuzz::kUsed;
}
