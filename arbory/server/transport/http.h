#pragma once
// What the HTTP machinery (connection.cpp, http_server.cpp) and the service that answers requests
// (service.cpp) tell each other. Nothing here needs the network library, whose headers compile
// slowly.
//
// A request is answered at once, or by a child process: whatever looks at a user's files or may
// take its time runs in a child, so that the loop never waits and the server keeps its own
// identity.

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "nas/system/child.h"

namespace arbory {

enum HttpStatus : int {
  kOk = 200,
  kPartial = 206,
  kSeeOther = 303,
  kBadRequest = 400,
  kUnauthorized = 401,
  kForbidden = 403,
  kNotFound = 404,
  kNotAllowed = 405,
  kTimeout = 408,
  kTooLarge = 413,
  kNotJson = 415,
  kNotSatisfiable = 416,
  kTooMany = 429,
  kHeaderTooLarge = 431,
  kUnavailable = 503,
  kOldVersion = 505,
};

using Clock = std::chrono::steady_clock;
using Fields = std::vector<std::pair<std::string, std::string>>;

// Counts what the server holds of one request's body; what was taken is given back with it.
class BodyRoom {
 public:
  virtual ~BodyRoom() = default;
  // False, with nothing taken, where so many more may not be held.
  virtual bool Take(std::uint64_t bytes) = 0;
};

struct HttpRequest {
  std::string method;
  std::string target;              // as sent
  Fields fields;                   // names in lower case
  std::string body;                // empty where there was no room to hold it
  std::uint64_t body_bytes = 0;    // that came
  std::shared_ptr<BodyRoom> room;  // that the body is held in
  std::string peer;                // the client's address, behind whatever proxy is configured
  bool from_loopback = false;
  Clock::time_point begun;

  // For the access log, filled in by the service.
  std::string user;
  std::string front;  // that asks for the user; empty for people

  // The first field of that name (in lower case); null when there is none.
  const std::string* Field(std::string_view name) const;
  size_t CountOf(std::string_view name) const;
  // What the target holds before and after "?".
  std::string_view path() const;
  std::string_view query() const;
};

// What is sent, but for the fields that every reply has (connection.cpp): Date, Content-Length, the
// policies against other sites.
struct HttpReply {
  int status = kOk;
  Fields fields;
  std::string body;
  // The body is what the child sends after its head: as long as that says, or in chunks of the
  // child's own (kUntilEnd), after which the connection ends.
  bool child_follows = false;
  std::optional<Clock::time_point> not_before = {};  // hides how long the answer took to find
};

struct ChildAnswer {
  nas::Child child;
  // Turns the head, or null when the child ended or stayed silent without one, into the reply. In
  // the loop, once; not at all when the client went away before.
  std::function<HttpReply(const nas::ReplyHead* head)> make_reply;
  // Lives as long as the child, which may be longer than the exchange.
  std::shared_ptr<void> token;
};

using Answer = std::variant<HttpReply, ChildAnswer>;

class HttpService {
 public:
  virtual ~HttpService() = default;
  // The room for the body of a request whose header has come; null when none of it is needed.
  virtual std::shared_ptr<BodyRoom> RoomFor(const HttpRequest& request) = 0;
  // In the loop, so it must not wait. The request is the caller's, and whole. What it throws is
  // answered with 503.
  virtual Answer Handle(HttpRequest* request) = 0;
  // The reply went out, or the client went away in the midst of it. Once for each request that was
  // answered, those that were refused before Handle among them.
  virtual void Finished(const HttpRequest& request, int status, std::uint64_t bytes) = 0;
  // Children that do something for the service itself; what their replies are made into goes
  // nowhere. Asked about once a second while there are connections, and after that until there is
  // nothing left to do, which is no value.
  virtual std::optional<std::vector<ChildAnswer>> Errands() { return std::nullopt; }
};

// What a running server can be asked.
struct ServerCounts {
  size_t connections = 0;
  size_t children = 0;  // those that answer requests
};

}  // namespace arbory
