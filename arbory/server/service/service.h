#pragma once
// What requests mean: who may ask, what is answered at once, and which child answers the rest. The
// routes and their bodies are documented in docs/http.md.

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "arbory/server/service/guard.h"
#include "arbory/server/service/metrics.h"
#include "arbory/server/service/sessions.h"
#include "arbory/server/transport/http.h"
#include "nas/system/config.h"
#include "nas/webapi/runner.h"

namespace arbory {

class Service : public HttpService {
 public:
  struct Setup {
    nas::ServerSettings settings;
    std::string single_user;  // everybody let in is this one; empty: logins
    std::string cookie;       // its name
    SiteRules site;
    std::string web_dir;
    std::function<ServerCounts()> counts;
  };
  Service(Setup setup, const nas::Module& module);

  // In single-user mode: a word that opens one session, once. A new one replaces the last.
  const std::string& NewToken();

  Answer Handle(HttpRequest* request) override;
  void Finished(const HttpRequest& request, int status, std::uint64_t bytes) override;

 private:
  using Path = std::vector<std::string>;

  Answer Route(HttpRequest* request, const Path& path);
  Answer RouteGet(HttpRequest* request, const Path& path);
  Answer RoutePost(HttpRequest* request, const Path& path);

  Answer OpenByToken(const HttpRequest& request);
  Answer Login(const HttpRequest& request);
  struct Attempt {
    std::string peer, user;
    Clock::time_point begun;  // the check, as a client may draw its request out as it likes
  };
  HttpReply LoginReply(const Attempt& attempt, const ChildHead* head);
  Answer Logout(HttpRequest* request);
  Answer CallApi(HttpRequest* request, const Path& path);
  HttpReply NoSuchRow(const Path& path) const;
  Answer GetFile(HttpRequest* request, const Path& path);

  HttpReply SessionReply(int status, const Sessions::Session& session) const;
  std::string SessionCookie(const std::string& id, long max_age) const;
  // Finds the session's user; otherwise fills `refusal`.
  bool Authenticate(HttpRequest* request, Answer* refusal);
  // Fills `refusal` unless the body is nothing or a JSON object.
  static bool ParseBody(const HttpRequest& request, Json::Value* params, Answer* refusal);
  HttpReply NotLoggedIn() const;

  // Starts a child for the user unless too many run. `method` is for the counts.
  Answer Run(const HttpRequest& request, const std::string& method,
             const std::function<nas::RunningCall()>& start);

  const Setup setup_;
  const nas::Module& module_;
  Sessions sessions_;
  LoginLimit login_limit_;
  Metrics metrics_;
  std::string token_;
  std::string api_list_;
  std::string openapi_;
  std::map<std::string, int> running_;  // children, by user
};

}  // namespace arbory
