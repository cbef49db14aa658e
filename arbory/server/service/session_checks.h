#pragma once
// Whether those who are logged in may still be. A session would otherwise outlive for hours what it
// was given for: a password that has been changed since, an account that is closed. Of the loop's
// thread alone; each look is a child's.

#include <chrono>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "arbory/server/service/calls.h"
#include "arbory/server/service/login.h"
#include "arbory/server/service/metrics.h"
#include "arbory/server/service/sessions.h"
#include "arbory/server/transport/http.h"

namespace arbory {

class SessionChecks {
 public:
  struct Rules {
    PamService pam;
    std::chrono::seconds pause;  // between two looks at one account
    bool log = false;            // tell on standard error of sessions that end
  };
  // What is given must outlive this object.
  SessionChecks(Rules rules, Sessions* sessions, Calls* calls, Metrics* metrics);

  // The children that are due, when asked about once a second: one for each user with a session
  // within a pause, spread over it, and never two at once for one user. A session ends when the
  // account phase refuses its user, or when the account's stamp is not that of the login any more;
  // it stays where neither can be told. No value while nobody is logged in.
  std::optional<std::vector<ChildAnswer>> Due(Clock::time_point now);

 private:
  struct Check {
    Clock::time_point due;
    std::weak_ptr<void> running = {};
  };
  using Checks = std::map<std::string, Check>;  // by user

  void FollowUsers(Clock::time_point now);
  // Nothing where too many run already.
  std::optional<ChildAnswer> Start(const std::string& user, Check* check);
  void Judge(const std::string& user, const nas::ReplyHead* head);

  const Rules rules_;
  Sessions& sessions_;
  Calls& calls_;
  Metrics& metrics_;
  Checks checks_;
};

}  // namespace arbory
