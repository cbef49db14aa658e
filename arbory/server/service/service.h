#pragma once
// What requests mean: who may ask, what is answered at once, and which child answers the rest. The
// routes and their bodies are documented in docs/http.md. Of the loop's thread alone.

#include <functional>
#include <optional>
#include <span>
#include <string>

#include "arbory/server/service/bodies.h"
#include "arbory/server/service/calls.h"
#include "arbory/server/service/entrance.h"
#include "arbory/server/service/files.h"
#include "arbory/server/service/fronts.h"
#include "arbory/server/service/guard.h"
#include "arbory/server/service/metrics.h"
#include "arbory/server/service/routes.h"
#include "arbory/server/transport/http.h"
#include "nas/system/config.h"
#include "nas/webapi/module.h"
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
    std::function<ServerCounts()> counts;  // of the server it answers for
  };
  // The module must outlive it.
  Service(Setup setup, const nas::Module& module);

  // See Entrance::NewToken.
  const std::string& NewToken() { return entrance_.NewToken(); }

  // Every path is answered by one of these; the last stands for all that are not named.
  static std::span<const Route> Routes();

  std::shared_ptr<BodyRoom> RoomFor(const HttpRequest& request) override;
  Answer Handle(HttpRequest* request) override;
  void Finished(const HttpRequest& request, int status, std::uint64_t bytes) override;
  std::optional<std::vector<ChildAnswer>> Errands() override { return entrance_.Checks(); }

 private:
  Answer MetricsReply();
  Answer CallApi(const HttpRequest& request, const RequestPath& path);
  // The answer of a child that reads the request's body, which `start` makes of the call.
  Answer Ask(const HttpRequest& request, const std::string& name,
             const std::function<nas::Child(const nas::ApiCall&)>& start);
  // A call of the server's own, whose parameters are read from `body` where there is one.
  static nas::ApiCall OwnCall(const HttpRequest& request, const std::string* body);
  static Answer WithRoom(const HttpRequest& request, const std::function<Answer()>& answer_of);
  static nas::ApiCall CallOfFront(const HttpRequest& request, bool leased);
  // The same for a front, if that may speak for the user.
  Answer AskForFront(const HttpRequest& request, const std::string& name, bool leased,
                     const std::function<nas::Child(const nas::ApiCall&)>& start);
  Answer EndForFront(const HttpRequest& request);
  Answer StartCall(const HttpRequest& request, const RequestPath& path);
  Answer NoSuchRow(const RequestPath& path, const nas::ApiCall& call);
  HttpReply NoSuchRowReply(const RequestPath& path) const;
  static std::optional<FileRequest> FileOf(const HttpRequest& request, const RequestPath& path);
  Answer GetArchive(const HttpRequest& request, const std::string& task_id);
  Answer GetFile(const HttpRequest& request, const RequestPath& path);
  Answer AskInstantly(const HttpRequest& request);
  Answer BeginSearch(const HttpRequest& request);
  Answer GetFirstLine(const HttpRequest& request, const RequestPath& path);
  // The reply to a request that may not ask this route.
  std::optional<HttpReply> Refusal(const Route& route, HttpRequest* request);

  const Setup setup_;
  const nas::Module& module_;
  Metrics metrics_;
  Calls calls_;
  Bodies bodies_;
  Entrance entrance_;
  Fronts fronts_;
  const std::string api_list_;
  const std::string openapi_;
};

}  // namespace arbory
