#pragma once
// Who is let in: the address that opens one session, logins, logouts, and the cookie that carries a
// session. Of the loop's thread alone; passwords are checked in a child.

#include <ctime>
#include <optional>
#include <string>

#include "arbory/server/service/calls.h"
#include "arbory/server/service/login.h"
#include "arbory/server/service/metrics.h"
#include "arbory/server/service/session_checks.h"
#include "arbory/server/service/sessions.h"
#include "arbory/server/transport/http.h"
#include "nas/webapi/module.h"
#include "nas/webapi/runner.h"

namespace arbory {

class Entrance {
 public:
  struct Rules {
    std::string single_user;  // everybody let in is this one; empty: logins
    std::string cookie;       // its name
    bool behind_tls = false;
    int session_minutes = 0;
    int logins_per_minute = 0;  // refused ones, of an address or a user
    SessionChecks::Rules checks;
  };
  // What is given must outlive this object.
  Entrance(Rules rules, const nas::Module& module, Calls* calls, Metrics* metrics);

  // In single-user mode: a word that opens one session, once. A new one replaces the last. Throws
  // std::runtime_error without randomness, as do OpenByToken and Login.
  const std::string& NewToken();

  // The routes that begin and end sessions; docs/http.md has their bodies. Logout needs a request
  // that was let in.
  Answer OpenByToken(const HttpRequest& request);
  Answer Login(const HttpRequest& request);
  Answer Logout(const HttpRequest& request);

  // Fills in the request's user; a refusal when it has no session.
  std::optional<HttpReply> LetIn(HttpRequest* request);
  // Whose session the request has; empty for nobody's.
  std::string UserOf(const HttpRequest& request);
  // Of a request that was let in: who and until when.
  HttpReply Describe(const HttpRequest& request);
  // The id in the request's cookie; empty without one. It is the key to the account.
  std::string SessionId(const HttpRequest& request) const;

  // See SessionChecks::Due; no value where nobody logs in.
  std::optional<std::vector<ChildAnswer>> Checks();

  size_t SessionCount() { return sessions_.Count(std::time(nullptr)); }

 private:
  struct Attempt {
    std::string client, user;
    Clock::time_point begun;  // the check, as a client may draw its request out as it likes
  };
  HttpReply LoginReply(const Attempt& attempt, const nas::ReplyHead* head);
  HttpReply SessionReply(const Sessions::Session& session) const;
  std::string SessionCookie(const std::string& id, long max_age) const;
  std::string NewSessionCookie(const std::string& id) const;
  HttpReply NotLoggedIn() const;

  const Rules rules_;
  const nas::Module& module_;
  Calls& calls_;
  Metrics& metrics_;
  Sessions sessions_;
  LoginLimit login_limit_;
  SessionChecks checks_;
  std::string token_;
};

}  // namespace arbory
