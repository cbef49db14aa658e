#include "arbory/server/service/service.h"

#include <unistd.h>

#include <charconv>
#include <ctime>

#include "arbory/server/service/files.h"
#include "arbory/server/service/openapi.h"
#include "arbory/server/service/pages.h"
#include "arbory/server/service/user_calls.h"
#include "arbory/server/transport/child.h"
#include "arbory/server/transport/http_text.h"
#include "arbory/server/transport/processes.h"
#include "nas/base/file_io.h"
#include "nas/base/json_text.h"
#include "nas/base/random_name.h"

namespace arbory {
namespace {

// What callers of the API are told when no row of the table serves them.
constexpr int kNoSuchApi = 102;
constexpr int kNoSuchMethod = 103;
constexpr int kNoSuchVersion = 104;

constexpr std::chrono::seconds kMinute{60};
constexpr char kRetrySeconds[] = "1";
// The reply as the child says it.
HttpReply ChildsReply(const ChildHead* head) {
  if (head == nullptr) return ErrorReply(kUnavailable, "The server failed here; try again.");
  HttpReply reply;
  reply.status = head->status;
  reply.child_follows = true;
  reply.fields = head->fields;
  if (reply.fields.empty()) reply.fields = JsonReply(kOk, "").fields;
  return reply;
}

std::string ListRows(const nas::Module& module) {
  Json::Value rows(Json::arrayValue);
  for (const NUVA::APIMethod* row = module.table(); row->api != nullptr; ++row) {
    Json::Value entry;
    entry["api"] = row->api;
    entry["version"] = row->version;
    entry["method"] = row->method;
    rows.append(entry);
  }
  return nas::JsonText(rows, nas::JsonBytes::kClean);
}

}  // namespace

Service::Service(Setup setup, const nas::Module& module)
    : setup_(std::move(setup)),
      module_(module),
      sessions_(setup_.settings.session_minutes * kMinute),
      login_limit_(setup_.settings.logins_per_minute),
      api_list_(ListRows(module)),
      openapi_(OpenApiText(module)) {}

const std::string& Service::NewToken() { return token_ = nas::RandomName(); }

void Service::Finished(const HttpRequest& request, int status, std::uint64_t bytes) {
  metrics_.CountReply(status, bytes);
  if (setup_.settings.access_log) {
    nas::WriteAll(STDERR_FILENO, AccessLine(request, status, bytes));
  }
}

Answer Service::Handle(HttpRequest* request) {
  if (request->CountOf("host") != 1) {
    return ErrorReply(kBadRequest, "Send exactly one Host field.");
  }
  const std::string host_trouble = TroubleWithHost(*request, setup_.site);
  if (!host_trouble.empty()) return ErrorReply(kForbidden, host_trouble);
  const auto path = SplitPath(request->path());
  if (!path) {
    return ErrorReply(kBadRequest, "This address is not well-formed; check its path.");
  }
  return Route(request, *path);
}

Answer Service::Route(HttpRequest* request, const Path& path) {
  const bool posts = (path.size() == 1 && (path[0] == "login" || path[0] == "logout")) ||
                     (path.size() == 4 && path[0] == "api");
  if (posts) {
    if (request->method != "POST") return NotAllowedReply("POST");
    return RoutePost(request, path);
  }
  if (request->method != "GET" && request->method != "HEAD") return NotAllowedReply("GET, HEAD");
  return RouteGet(request, path);
}

Answer Service::RoutePost(HttpRequest* request, const Path& path) {
  const std::string origin_trouble = TroubleWithOrigin(*request, setup_.site);
  if (!origin_trouble.empty()) return ErrorReply(kForbidden, origin_trouble);
  if (!request->body.empty() && !IsJson(*request)) {
    return ErrorReply(kNotJson, "Send the parameters as Content-Type: application/json.");
  }
  if (path[0] == "login") return Login(*request);
  if (path[0] == "logout") return Logout(request);
  return CallApi(request, path);
}

Answer Service::RouteGet(HttpRequest* request, const Path& path) {
  const std::string& first = path.empty() ? std::string() : path[0];
  if (path.size() == 1) {
    if (first == "health") return JsonReply(kOk, R"({"status":"ok"})");
    if (first == "open") return OpenByToken(*request);
    if (first == "api") return JsonReply(kOk, api_list_);
    if (first == "metrics") {
      if (!request->from_loopback) {
        return ErrorReply(kForbidden, "Read the metrics on the machine itself.");
      }
      const ServerCounts counts = setup_.counts();
      const size_t all = ChildrenOfThisProcess().size();
      HttpReply reply =
          JsonReply(kOk, metrics_.Text({counts.connections, counts.children,
                                        all > counts.children ? all - counts.children : 0,
                                        sessions_.Count(std::time(nullptr))}));
      reply.fields[0].second = "text/plain; version=0.0.4; charset=utf-8";
      return reply;
    }
  }
  if (path.size() == 2 && first == "api" && path[1] == "openapi.json") {
    return JsonReply(kOk, openapi_);
  }
  const bool is_private = (path.size() == 1 && (first == "session" || first == "shares")) ||
                          (path.size() == 2 && first == "searches") ||
                          (path.size() >= 2 && first == "files");
  if (!is_private) return PageReply(setup_.web_dir, path);
  Answer refusal;
  if (!Authenticate(request, &refusal)) return refusal;
  if (first == "session") {
    return SessionReply(kOk, *sessions_.Find(Cookie(*request, setup_.cookie), std::time(nullptr)));
  }
  if (first == "shares") {
    return Run(*request, "shares", [&] { return StartListShares(request->user); });
  }
  if (first == "searches") {
    return Run(*request, "searches", [&] { return StartReadSearch(request->user, path[1]); });
  }
  return GetFile(request, path);
}

Answer Service::Run(const HttpRequest& request, const std::string& method,
                    const std::function<nas::RunningCall()>& start) {
  const int limit = setup_.settings.max_calls;
  int& of_user = running_[request.user];
  // With logins nobody may take all of it, so that others get through.
  const int user_limit = setup_.single_user.empty() ? (limit + 1) / 2 : limit;
  if (setup_.counts().children >= static_cast<size_t>(limit) || of_user >= user_limit) {
    return BusyReply(kUnavailable, "The server is busy; try again in a moment.", kRetrySeconds);
  }
  ChildAnswer answer;
  answer.child = start();
  if (answer.child.pid < 0) {
    return BusyReply(kUnavailable, "The machine has no room for another request; try again.",
                     kRetrySeconds);
  }
  ++of_user;
  answer.token = std::shared_ptr<void>(nullptr, [this, user = request.user](void*) {
    if (--running_[user] == 0) running_.erase(user);
  });
  const auto begun = Clock::now();
  answer.make_reply = [this, method, begun](const ChildHead* head) {
    const std::chrono::duration<double> spent = Clock::now() - begun;
    metrics_.CountCall(method, head == nullptr ? nas::kCodeUnknownFailure : head->code,
                       spent.count());
    return ChildsReply(head);
  };
  return answer;
}

Answer Service::CallApi(HttpRequest* request, const Path& path) {
  Json::Value params;
  Answer answer;
  if (!Authenticate(request, &answer) || !ParseBody(*request, &params, &answer)) return answer;
  int version = 0;
  const std::string& text = path[2];
  const auto parsed = std::from_chars(text.data(), text.data() + text.size(), version);
  const bool is_number = parsed.ec == std::errc() && parsed.ptr == text.data() + text.size();
  const NUVA::APIMethod* row = is_number ? module_.Find(path[1], version, path[3]) : nullptr;
  if (row == nullptr) return NoSuchRow(path);
  const std::string session = Cookie(*request, setup_.cookie);
  answer = Run(*request, std::string(row->api) + "/" + row->method, [&] {
    // The id is the key to the account, which no log line of the module needs to hold whole.
    constexpr size_t kShown = 8;
    return nas::StartCall(*row, {path[3], params, request->user, session.substr(0, kShown)},
                          EncodeApiReply);
  });
  if (auto* child = std::get_if<ChildAnswer>(&answer)) {
    child->make_reply = [make = std::move(child->make_reply)](const ChildHead* head) {
      HttpReply reply = make(head);
      if (head != nullptr) return reply;
      return JsonReply(kOk, nas::EncodeJsonReply(nas::kCodeUnknownFailure, Json::Value()));
    };
  }
  return answer;
}

HttpReply Service::NoSuchRow(const Path& path) const {
  bool has_api = false;
  bool has_version = false;
  for (const NUVA::APIMethod* row = module_.table(); row->api != nullptr; ++row) {
    if (row->api != path[1]) continue;
    has_api = true;
    has_version = has_version || std::to_string(row->version) == path[2];
  }
  const std::string hint = "; GET /api lists what there is.";
  if (!has_api) return ErrorReply(kNotFound, kNoSuchApi, "There is no API " + path[1] + hint);
  if (!has_version) {
    return ErrorReply(kNotFound, kNoSuchVersion, path[1] + " has no version " + path[2] + hint);
  }
  return ErrorReply(kNotFound, kNoSuchMethod,
                    path[1] + " " + path[2] + " has no method " + path[3] + hint);
}

Answer Service::GetFile(HttpRequest* request, const Path& path) {
  if (path.size() < 3) return ErrorReply(kNotFound, "Name a file: /files/SHARE/PATH.");
  FileRequest file;
  file.user = request->user;
  file.share = path[1];
  file.path.assign(path.begin() + 2, path.end());
  file.preview = QueryValue(request->query(), "preview").value_or("") == "1";
  const std::string* range = request->Field("range");
  if (range != nullptr) file.range = *range;
  file.head_only = request->method == "HEAD";
  return Run(*request, "files", [&] { return StartFile(file); });
}

bool Service::ParseBody(const HttpRequest& request, Json::Value* params, Answer* refusal) {
  *params = Json::Value(Json::objectValue);
  if (request.body.empty()) return true;
  if (nas::ParseJson(request.body, params, nas::kRequestMaxDepth) && params->isObject()) {
    return true;
  }
  *refusal = ErrorReply(kBadRequest, "The body must be one JSON object.");
  return false;
}

}  // namespace arbory
