#include "arbory/server/service/entrance.h"

#include <algorithm>

#include "arbory/caller.h"
#include "arbory/server/service/bodies.h"
#include "arbory/server/service/user_calls.h"
#include "arbory/server/transport/addresses.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/json_text.h"
#include "nas/base/random_name.h"

namespace arbory {
namespace {

constexpr long kMinuteSeconds = 60;
// Every refused login takes this long, so that its time tells nothing of the user; far longer than
// hashing a password, and what PAM's own modules let a wrong one wait.
constexpr std::chrono::seconds kRefusalTime{2};
// Names and passwords longer than this are not looked at.
constexpr size_t kMaxCredentialBytes = 1024;
// Both, each byte escaped, and some room.
constexpr std::uint64_t kMaxBodyBytes = Bodies::kSmallBytes;
// Objects, lists and further members in them. These bodies alone are read in the loop, which must
// know whom a login is for and whether a logout is one; many small values would take it
// milliseconds.
constexpr int kMaxParts = 32;
constexpr char kStopMethod[] = "stop";

// Takes as long wherever the texts differ.
bool SameText(const std::string& a, const std::string& b) {
  unsigned char difference = a.size() == b.size() ? 0 : 1;
  for (size_t at = 0; at < std::min(a.size(), b.size()); ++at) {
    difference |= static_cast<unsigned char>(a[at] ^ b[at]);
  }
  return difference == 0;
}

// By a browser, which shows the page, and not by a program, which is told in a status.
bool IsOpenedByPerson(const HttpRequest& request) {
  const std::string* accept = request.Field("accept");
  return request.method == "GET" && accept != nullptr &&
         accept->find("text/html") != std::string::npos;
}

HttpReply ToPage(const char* address) {
  HttpReply reply;
  reply.status = kSeeOther;
  reply.fields = {{"Location", address}, {"Cache-Control", "no-store"}};
  return reply;
}

bool IsAbsurd(const std::string& text) {
  return text.size() > kMaxCredentialBytes || text.find('\0') != std::string::npos;
}

bool HasFewParts(const std::string& json) {
  int parts = 0;
  bool in_string = false;
  for (size_t at = 0; at < json.size(); ++at) {
    const char byte = json[at];
    if (byte == '\\') {
      ++at;
    } else if (byte == '"') {
      in_string = !in_string;
    } else if (!in_string && (byte == '{' || byte == '[' || byte == ',')) {
      ++parts;
    }
  }
  return parts <= kMaxParts;
}

// The parameters in the body of a request that this file answers, or the reply to a bad one.
std::variant<Json::Value, HttpReply> SmallBody(const HttpRequest& request, const char* too_large) {
  if (request.body_bytes > kMaxBodyBytes) {
    return ErrorReply(kTooLarge, too_large);
  }
  auto params = HasFewParts(request.body) ? JsonBody(request.body) : std::nullopt;
  if (!params) return BadBodyReply();
  return std::move(*params);
}

}  // namespace

Entrance::Entrance(Rules rules, const nas::Module& module, Calls* calls, Metrics* metrics)
    : rules_(std::move(rules)),
      module_(module),
      calls_(*calls),
      metrics_(*metrics),
      sessions_(std::chrono::seconds(rules_.session_minutes * kMinuteSeconds)),
      login_limit_(rules_.logins_per_minute),
      checks_(rules_.checks, &sessions_, calls, metrics) {}

const std::string& Entrance::NewToken() { return token_ = nas::RandomName(); }

std::string Entrance::SessionId(const HttpRequest& request) const {
  return Cookie(request, rules_.cookie);
}

std::optional<HttpReply> Entrance::LetIn(HttpRequest* request) {
  const auto session = sessions_.Find(SessionId(*request), std::time(nullptr));
  if (!session) return NotLoggedIn();
  request->user = session->user;
  return std::nullopt;
}

std::string Entrance::UserOf(const HttpRequest& request) {
  const auto session = sessions_.Find(SessionId(request), std::time(nullptr));
  return session ? session->user : std::string();
}

HttpReply Entrance::Describe(const HttpRequest& request) {
  const auto session = sessions_.Find(SessionId(request), std::time(nullptr));
  return session ? SessionReply(*session) : NotLoggedIn();
}

Answer Entrance::OpenByToken(const HttpRequest& request) {
  const auto given = QueryValue(request.query(), "token");
  const bool good = !token_.empty() && given && SameText(*given, token_);
  if (rules_.single_user.empty() || !good) {
    if (IsOpenedByPerson(request)) return ToPage(UserOf(request).empty() ? "/?used" : "/");
    return ErrorReply(kForbidden,
                      "This address opens the page only once. Print a new one: send the server "
                      "the signal HUP, or start it again.");
  }
  if (request.method != "GET") return NotAllowedReply("GET");
  token_.clear();
  const std::string id = sessions_.Begin(rules_.single_user, std::time(nullptr));
  HttpReply reply = ToPage("/");
  reply.fields.emplace_back("Set-Cookie", NewSessionCookie(id));
  return reply;
}

Answer Entrance::Login(const HttpRequest& request) {
  if (!rules_.single_user.empty()) {
    return ErrorReply(kForbidden, "This server has one user; open the address it printed.");
  }
  auto body = SmallBody(request, "The user or the password is too long.");
  if (auto* reply = std::get_if<HttpReply>(&body)) return std::move(*reply);
  const Json::Value& params = std::get<Json::Value>(body);
  const Json::Value& user = params["user"];
  const Json::Value& password = params["password"];
  if (!user.isString() || !password.isString() || user.asString().empty()) {
    return ErrorReply(kBadRequest, R"(Send {"user": TEXT, "password": TEXT}.)");
  }
  Credentials credentials{user.asString(), password.asString()};
  if (IsAbsurd(credentials.user) || IsAbsurd(credentials.password)) {
    return ErrorReply(kBadRequest, "The user or the password is too long or malformed.");
  }
  const std::string client = NetworkOf(request.peer);
  const int wait = login_limit_.Begin(client, credentials.user, Clock::now());
  if (wait > 0) {
    metrics_.CountRefusedLogin();
    return BusyReply(kTooMany, "Too many refused logins; wait a minute and try again.",
                     std::to_string(wait));
  }
  Answer answer = calls_.Run(Calls::Kind::kLogin, client, "login",
                             [&] { return StartLogin(credentials, rules_.checks.pam); });
  if (auto* child = std::get_if<ChildAnswer>(&answer)) {
    child->make_reply = [this, attempt = Attempt{client, credentials.user, Clock::now()},
                         count = std::move(child->make_reply)](const nas::ReplyHead* head) {
      count(head);
      return LoginReply(attempt, head);
    };
  }
  return answer;
}

HttpReply Entrance::LoginReply(const Attempt& attempt, const nas::ReplyHead* head) {
  if (head != nullptr && head->status == kOk) {
    const auto named = SplitPath("/" + head->fields.at(0).second);
    const std::string user = named && named->size() == 1 ? named->front() : attempt.user;
    login_limit_.Succeeded(attempt.client, attempt.user);
    const std::time_t now = std::time(nullptr);
    const std::string id = sessions_.Begin(user, now, head->fields.at(1).second);
    HttpReply reply = SessionReply(*sessions_.Find(id, now));
    reply.fields.emplace_back("Set-Cookie", NewSessionCookie(id));
    return reply;
  }
  metrics_.CountRefusedLogin();
  const bool refused = head != nullptr && head->status == kForbidden;
  HttpReply reply =
      refused
          ? ErrorReply(kUnauthorized, "The user or the password is wrong; try again.")
          : ErrorReply(kUnavailable, "Logins cannot be checked now; the server's log says why.");
  reply.not_before = attempt.begun + kRefusalTime;
  return reply;
}

Answer Entrance::Logout(const HttpRequest& request) {
  auto body = SmallBody(request, "The request is too large; send fewer parameters.");
  if (auto* reply = std::get_if<HttpReply>(&body)) return std::move(*reply);
  const Json::Value& stops = std::get<Json::Value>(body)["stop_searches"];
  if (!stops.isNull() && !stops.isBool()) {
    return ErrorReply(kBadRequest, R"(Send {"stop_searches": true} or false.)");
  }
  sessions_.End(SessionId(request));
  const std::string gone = SessionCookie("", 0);
  const NUVA::APIMethod* stop = module_.Find(kSearchApi, 1, kStopMethod);
  if (!stops.isBool() || !stops.asBool() || stop == nullptr) {
    HttpReply reply = JsonReply(kOk, "{}");
    reply.fields.emplace_back("Set-Cookie", gone);
    return reply;
  }
  Answer answer = calls_.Run(Calls::Kind::kCall, request.user, "logout",
                             [&] { return StartStopSearches(request.user, *stop); });
  if (auto* busy = std::get_if<HttpReply>(&answer)) {
    busy->fields.emplace_back("Set-Cookie", gone);
    return answer;
  }
  auto& child = std::get<ChildAnswer>(answer);
  child.make_reply = [make = std::move(child.make_reply), gone](const nas::ReplyHead* head) {
    HttpReply reply = make(head);
    reply.fields.emplace_back("Set-Cookie", gone);
    return reply;
  };
  return answer;
}

std::optional<std::vector<ChildAnswer>> Entrance::Checks() {
  if (!rules_.single_user.empty()) return std::nullopt;
  return checks_.Due(Clock::now());
}

HttpReply Entrance::SessionReply(const Sessions::Session& session) const {
  Json::Value body;
  body["user"] = session.user;
  body["mode"] = rules_.single_user.empty() ? "login" : "single";
  body["expires"] = Json::Int64{session.expires};
  body["version"] = ARBORY_VERSION;
  return JsonReply(kOk, nas::JsonText(body, nas::JsonBytes::kClean));
}

std::string Entrance::SessionCookie(const std::string& id, long max_age) const {
  return rules_.cookie + "=" + id +
         "; Path=/; HttpOnly; SameSite=Strict; Max-Age=" + std::to_string(max_age) +
         (rules_.behind_tls ? "; Secure" : "");
}

std::string Entrance::NewSessionCookie(const std::string& id) const {
  return SessionCookie(id, rules_.session_minutes * kMinuteSeconds);
}

HttpReply Entrance::NotLoggedIn() const {
  const bool single = !rules_.single_user.empty();
  Json::Value body;
  body["code"] = kUnauthorized;
  body["error"] = single ? "Open the address that the server printed when it started; a used one "
                           "is replaced when the server gets the signal HUP."
                         : "Log in first.";
  body["mode"] = single ? "single" : "login";
  return JsonReply(kUnauthorized, nas::JsonText(body, nas::JsonBytes::kClean));
}

}  // namespace arbory
