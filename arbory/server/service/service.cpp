#include "arbory/server/service/service.h"
#include "arbory/server/service/index_metrics.h"

#include <unistd.h>

#include <algorithm>
#include <charconv>

#include "arbory/caller.h"
#include "arbory/server/service/archives.h"
#include "arbory/server/service/begin_search.h"
#include "arbory/server/service/fleet_search.h"
#include "arbory/server/service/gzip.h"
#include "arbory/server/service/openapi.h"
#include "arbory/server/service/pages.h"
#include "arbory/server/service/past_searches.h"
#include "arbory/server/service/row_addresses.h"
#include "arbory/server/service/user_calls.h"
#include "arbory/server/transport/children.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/file_io.h"
#include "nas/base/json_text.h"
#include "nas/base/utf8.h"
#include "nas/fleet/question.h"
#include "nas/system/child.h"

namespace arbory {
namespace {

// What callers of the API are told when no row of the table serves them.
constexpr int kNoSuchApi = 102;
constexpr int kNoSuchMethod = 103;
constexpr int kNoSuchVersion = 104;
constexpr char kRetrySeconds[] = "1";
constexpr char kStartMethod[] = "start";
constexpr char kRoot[] = "root";

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

// Reads the parameters in a child, from its own copy of the body.
auto ReaderOf(const std::string& body) {
  return [&body](Json::Value* params) -> std::optional<nas::Reply> {
    auto read = JsonBody(body);
    if (!read) return AsChildsReply(BadBodyReply());
    *params = std::move(*read);
    return std::nullopt;
  };
}

constexpr char kBadAddress[] = "This address is not well-formed; check its path.";

// A file's name may hold any bytes but NUL; nothing else that is named here has such names.
bool NamesFile(const Route& route) {
  return std::string_view(route.pattern).ends_with("{path...}");
}

bool HasControls(const RequestPath& path) {
  return std::ranges::any_of(path, [](const std::string& part) {
    return std::ranges::any_of(part, [](char byte) { return nas::IsControl(byte); });
  });
}

bool IsLeased(const HttpRequest& request) { return request.Field("arbory-lease") != nullptr; }

nas::ApiCall ForSharesOf(const std::string& user) {
  nas::ApiCall call = {"", {}, user, "server"};
  call.asks_fleet = true;
  return call;
}

// Of the machine alone, so nobody need be looked up for it. How many files there are would tell a
// user how much is hidden: that is for the front's root, for whom a box does nothing else.
HttpReply FrontStatusReply(const std::string& user) {
  Json::Value body;
  body["version"] = ARBORY_VERSION;
  body["protocol"] = nas::kFleetProtocol;
  body["now"] = Json::Int64{std::time(nullptr)};
  if (user == kRoot) AddIndexState(&body);
  return JsonReply(kOk, nas::JsonText(body, nas::JsonBytes::kClean));
}

// So many of the largest bodies: a person's page sends small ones, one after the other.
constexpr std::uint64_t kLargestOfOneUser = 2;
constexpr std::uint64_t kLargestOfAll = 8;

Bodies::Limits BodyLimitsOf(const Service::Setup& setup) {
  const auto largest = static_cast<std::uint64_t>(setup.settings.body_bytes);
  return {kLargestOfAll * largest, kLargestOfOneUser * largest};
}

Entrance::Rules RulesOf(const Service::Setup& setup) {
  const nas::ServerSettings& settings = setup.settings;
  return {setup.single_user,
          setup.cookie,
          setup.site.behind_tls,
          settings.session_minutes,
          settings.logins_per_minute,
          {{settings.pam_service, settings.pam_dir},
           std::chrono::seconds(settings.account_check_seconds),
           settings.access_log}};
}

}  // namespace

std::span<const Route> Service::Routes() {
  constexpr auto kGet = RouteMethod::kGet;
  constexpr auto kPost = RouteMethod::kPost;
  static constexpr char kJson[] = "application/json";
  using Self = Service&;
  using Request = HttpRequest*;
  using Path = const RequestPath&;
  static const Route kRoutes[] = {
      {kPost, kCallPattern, Access::kLoggedIn,
       [](Self self, Request request, Path path) { return self.CallApi(*request, path); },
       "Make a call", kJson},
      {kPost, "/login", Access::kEverybody,
       [](Self self, Request request, Path) { return self.entrance_.Login(*request); },
       R"(Begin a session with {"user", "password"})", kJson},
      {kPost, "/logout", Access::kLoggedIn,
       [](Self self, Request request, Path) { return self.entrance_.Logout(*request); },
       R"(End the session; {"stop_searches": true} stops the user's searches)", kJson},
      {kGet, "/open", Access::kEverybody,
       [](Self self, Request request, Path) { return self.entrance_.OpenByToken(*request); },
       nullptr, nullptr},
      {kGet, "/session", Access::kLoggedIn,
       [](Self self, Request request, Path) -> Answer { return self.entrance_.Describe(*request); },
       "Who is logged in and until when", kJson},
      {kGet, "/shares", Access::kLoggedIn,
       [](Self self, Request request, Path) {
         return self.calls_.Run(Calls::Kind::kCall, request->user, "shares",
                                [&] { return StartListShares(ForSharesOf(request->user)); });
       },
       "The shares the user can enter", kJson},
      {kPost, "/searches", Access::kLoggedIn,
       [](Self self, Request request, Path) { return self.BeginSearch(*request); },
       "Begin a search of what was typed, and list what it finds at once", kJson},
      {kGet, "/searches/{taskid}", Access::kLoggedIn,
       [](Self self, Request request, Path path) {
         return self.calls_.Run(Calls::Kind::kCall, request->user, "searches",
                                [&] { return StartReadSearch(request->user, path[1]); });
       },
       "How far a search has come", kJson},
      {kPost, "/searches/{taskid}/misses", Access::kLoggedIn,
       [](Self self, Request request, Path path) {
         return self.Ask(*request, "misses",
                         [&](const nas::ApiCall& call) { return StartNearMisses(call, path[1]); });
       },
       "What a search that found nothing came close to", kJson},
      {kGet, "/searches/{taskid}/zip", Access::kLoggedIn,
       [](Self self, Request request, Path path) { return self.GetArchive(*request, path[1]); },
       "Rows of what a search has found, ?rows=0-9,12 or all, as one archive", "application/zip"},
      {kGet, "/instant", Access::kLoggedIn,
       [](Self self, Request request, Path) { return self.AskInstantly(*request); },
       "The best that the index knows of ?params=, at once", kJson},
      {kPost, "/query", Access::kLoggedIn,
       [](Self self, Request request, Path) { return self.Ask(*request, "query", StartReadQuery); },
       "What was typed, as the parameters of a search", kJson},
      {kGet, "/past", Access::kLoggedIn,
       [](Self self, Request request, Path) {
         return self.Ask(*request, "past", StartPastSearches);
       },
       "The searches made on the page, the newest first", kJson},
      {kPost, "/past", Access::kLoggedIn,
       [](Self self, Request request, Path) {
         return self.Ask(*request, "past", StartPastSearches);
       },
       "Add, pin or remove one of them, or clear them", kJson},
      {kGet, "/files/{share}/{path...}", Access::kLoggedIn,
       [](Self self, Request request, Path path) { return self.GetFile(*request, path); },
       "One file, as a download or with preview=1 to look at", "application/octet-stream"},
      {kGet, "/lines/{share}/{path...}", Access::kLoggedIn,
       [](Self self, Request request, Path path) { return self.GetFirstLine(*request, path); },
       "The first line of a file that holds what ?pattern= asks for", kJson},
      {kPost, "/fleet/search", Access::kFront,
       [](Self self, Request request, Path) {
         return self.AskForFront(
             *request, "fleet/search", /*leased=*/true,
             [&](const nas::ApiCall& call) { return StartFleetSearch(request->front, call); });
       },
       nullptr, nullptr},
      {kPost, "/fleet/rows", Access::kFront,
       [](Self self, Request request, Path) {
         return self.AskForFront(*request, "fleet/rows", /*leased=*/false, StartFleetRows);
       },
       nullptr, nullptr},
      {kPost, "/fleet/end", Access::kFront,
       [](Self self, Request request, Path) { return self.EndForFront(*request); }, nullptr,
       nullptr},
      {kGet, "/fleet/files/{share}/{path...}", Access::kFront,
       [](Self self, Request request, Path path) { return self.GetFile(*request, path); }, nullptr,
       nullptr},
      {kGet, "/fleet/lines/{share}/{path...}", Access::kFront,
       [](Self self, Request request, Path path) { return self.GetFirstLine(*request, path); },
       nullptr, nullptr},
      {kGet, "/fleet/shares", Access::kFront,
       [](Self self, Request request, Path) {
         return self.AskForFront(*request, "fleet/shares", /*leased=*/false, StartListShares);
       },
       nullptr, nullptr},
      {kGet, "/fleet/status", Access::kFront,
       [](Self, Request request, Path) -> Answer { return FrontStatusReply(request->user); },
       nullptr, nullptr},
      {kGet, "/api", Access::kEverybody,
       [](Self self, Request, Path) -> Answer { return JsonReply(kOk, self.api_list_); },
       "The rows of the method table", kJson},
      {kGet, "/api/openapi.json", Access::kEverybody,
       [](Self self, Request, Path) -> Answer { return JsonReply(kOk, self.openapi_); }, nullptr,
       nullptr},
      {kGet, "/health", Access::kEverybody,
       [](Self, Request, Path) -> Answer { return JsonReply(kOk, R"({"status":"ok"})"); },
       "Whether the server answers", kJson},
      {kGet, "/metrics", Access::kThisMachine,
       [](Self self, Request, Path) { return self.MetricsReply(); },
       "Counts, in the Prometheus text format", "text/plain"},
      {kGet, "/{page...}", Access::kEverybody,
       [](Self self, Request request, Path path) -> Answer {
         return PageReply(self.setup_.web_dir, path, TakesGzip(*request));
       },
       nullptr, nullptr},
  };
  return kRoutes;
}

Service::Service(Setup setup, const nas::Module& module)
    : setup_(std::move(setup)),
      module_(module),
      calls_(setup_.settings.max_calls, setup_.single_user.empty(), &metrics_),
      bodies_(BodyLimitsOf(setup_)),
      entrance_(RulesOf(setup_), module, &calls_, &metrics_),
      fronts_(nas::CurrentConfig().box),
      api_list_(ListRows(module)),
      openapi_(OpenApiText(module, Routes(), setup_.cookie)) {}

void Service::Finished(const HttpRequest& request, int status, std::uint64_t bytes) {
  metrics_.CountReply(status, bytes);
  if (setup_.settings.access_log) {
    (void)nas::WriteAll(STDERR_FILENO, AccessLine(request, status, bytes));
  }
}

std::shared_ptr<BodyRoom> Service::RoomFor(const HttpRequest& request) {
  return request.method == "POST" ? bodies_.RoomOf(entrance_.UserOf(request)) : nullptr;
}

Answer Service::Handle(HttpRequest* request) {
  if (request->CountOf("host") != 1) {
    return ErrorReply(kBadRequest, "Send exactly one Host field.");
  }
  const std::string host_trouble = TroubleWithHost(*request, setup_.site);
  if (!host_trouble.empty()) return ErrorReply(kForbidden, host_trouble);
  const auto path = SplitPath(request->path());
  if (!path) {
    return ErrorReply(kBadRequest, kBadAddress);
  }
  const FoundRoute found = FindRoute(Routes(), request->method, *path);
  const bool by_bytes = found.route != nullptr && NamesFile(*found.route);
  if (!by_bytes && HasControls(*path)) return ErrorReply(kBadRequest, kBadAddress);
  if (found.route == nullptr) return NotAllowedReply(found.allowed);
  if (auto refusal = Refusal(*found.route, request)) return std::move(*refusal);
  return found.route->handler(*this, request, *path);
}

std::optional<HttpReply> Service::Refusal(const Route& route, HttpRequest* request) {
  if (route.method == RouteMethod::kPost) {
    const std::string origin_trouble = TroubleWithOrigin(*request, setup_.site);
    if (!origin_trouble.empty()) return ErrorReply(kForbidden, origin_trouble);
    if (request->body_bytes != 0 && !IsJson(*request)) {
      return ErrorReply(kNotJson, "Send the parameters as Content-Type: application/json.");
    }
  }
  if (route.access == Access::kLoggedIn) return entrance_.LetIn(request);
  if (route.access == Access::kFront) return fronts_.LetIn(request, std::time(nullptr));
  if (route.access == Access::kThisMachine && !request->from_loopback) {
    return ErrorReply(kForbidden, "Read the metrics on the machine itself.");
  }
  return std::nullopt;
}

Answer Service::MetricsReply() {
  const ServerCounts counts = setup_.counts();
  const size_t all = ChildrenOfThisProcess().size();
  HttpReply reply = JsonReply(kOk, metrics_.Text({counts.connections, counts.children,
                                                  all > counts.children ? all - counts.children : 0,
                                                  entrance_.SessionCount()}) +
                                       IndexMetrics());
  reply.fields[0].second = "text/plain; version=0.0.4; charset=utf-8";
  return reply;
}

Answer Service::CallApi(const HttpRequest& request, const RequestPath& path) {
  return WithRoom(request, [&] { return StartCall(request, path); });
}

Answer Service::Ask(const HttpRequest& request, const std::string& name,
                    const std::function<nas::Child(const nas::ApiCall&)>& start) {
  const nas::ApiCall call = OwnCall(request, &request.body);
  return WithRoom(request, [&] {
    return calls_.Run(Calls::Kind::kCall, request.user, name, [&] { return start(call); });
  });
}

nas::ApiCall Service::OwnCall(const HttpRequest& request, const std::string* body) {
  nas::ApiCall call = {"", Json::Value(Json::objectValue), request.user, "server",
                       IsLeased(request)};
  if (body != nullptr && !body->empty()) call.read_params = ReaderOf(*body);
  if (TakesGzip(request)) call.finish = Gzipped;
  return call;
}

Answer Service::BeginSearch(const HttpRequest& request) {
  const NUVA::APIMethod* start = module_.Find(kSearchApi, kSearchVersion, "start");
  const NUVA::APIMethod* list = module_.Find(kSearchApi, kSearchVersion, "list");
  if (start == nullptr || list == nullptr) {
    return ErrorReply(kNotFound, "This server has no searches; GET /api lists what there is.");
  }
  return Ask(request, "begin",
             [&](const nas::ApiCall& call) { return StartBegin(call, *start, *list); });
}

nas::ApiCall Service::CallOfFront(const HttpRequest& request, bool leased) {
  nas::ApiCall call = {"", Json::Value(Json::objectValue), request.user, "server", leased};
  if (!request.body.empty()) call.read_params = ReaderOf(request.body);
  call.admit = [front = request.front, user = request.user] { return Admit(front, user); };
  return call;
}

Answer Service::AskForFront(const HttpRequest& request, const std::string& name, bool leased,
                            const std::function<nas::Child(const nas::ApiCall&)>& start) {
  return WithRoom(request, [&] {
    return calls_.Run(Calls::Kind::kFront, request.front, name,
                      [&] { return start(CallOfFront(request, leased)); });
  });
}

// As people end theirs.
Answer Service::EndForFront(const HttpRequest& request) {
  const NUVA::APIMethod* clean = module_.Find(kSearchApi, kSearchVersion, "clean");
  if (clean == nullptr) return ErrorReply(kUnavailable, "Searches cannot be ended here.");
  return AskForFront(request, "fleet/end", /*leased=*/false, [&](nas::ApiCall call) {
    call.method = clean->method;
    return nas::StartCall(*clean, call, nas::EncodeJsonReply);
  });
}

Answer Service::WithRoom(const HttpRequest& request, const std::function<Answer()>& answer_of) {
  if (request.body.size() != request.body_bytes) {
    return BusyReply(kUnavailable, "Other requests of this size are being answered; try again.",
                     kRetrySeconds);
  }
  Answer answer = answer_of();
  if (auto* child = std::get_if<ChildAnswer>(&answer)) {
    // The child holds the body as long as it runs.
    child->token = std::make_shared<std::pair<std::shared_ptr<void>, std::shared_ptr<BodyRoom>>>(
        std::move(child->token), request.room);
  }
  return answer;
}

Answer Service::StartCall(const HttpRequest& request, const RequestPath& path) {
  int version = 0;
  const std::string& text = path[2];
  const auto parsed = std::from_chars(text.data(), text.data() + text.size(), version);
  const bool is_number = parsed.ec == std::errc() && parsed.ptr == text.data() + text.size();
  const NUVA::APIMethod* row = is_number ? module_.Find(path[1], version, path[3]) : nullptr;
  nas::ApiCall call = OwnCall(request, &request.body);
  call.method = path[3];
  if (row == nullptr) return NoSuchRow(path, call);
  const std::string session = entrance_.SessionId(request);
  Answer answer =
      calls_.Run(Calls::Kind::kCall, request.user, std::string(row->api) + "/" + row->method, [&] {
        // The id is the key to the account, which no log line of the module needs to hold whole.
        constexpr size_t kShown = 8;
        call.session = session.substr(0, kShown);
        call.asks_fleet = row->method == std::string(kStartMethod);
        return nas::StartCall(*row, call, EncodeWithAddresses);
      });
  if (auto* child = std::get_if<ChildAnswer>(&answer)) {
    child->make_reply = [make = std::move(child->make_reply)](const nas::ReplyHead* head) {
      HttpReply reply = make(head);
      if (head != nullptr) return reply;
      return JsonReply(kOk, nas::EncodeJsonReply(nas::kCodeUnknownFailure, Json::Value()).body);
    };
  }
  return answer;
}

// A body that is no object is told of first, and only a child looks into one.
Answer Service::NoSuchRow(const RequestPath& path, const nas::ApiCall& call) {
  HttpReply reply = NoSuchRowReply(path);
  if (!call.read_params) return reply;
  return calls_.Run(Calls::Kind::kCall, call.user, "",
                    [&] { return StartReply(call, AsChildsReply(reply)); });
}

HttpReply Service::NoSuchRowReply(const RequestPath& path) const {
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

// Of an address /ROUTE/SHARE/PATH, or /fleet/ROUTE/SHARE/PATH.
std::optional<FileRequest> Service::FileOf(const HttpRequest& request, const RequestPath& path) {
  const size_t share = request.front.empty() ? 1 : 2;
  if (path.size() <= share + 1) return std::nullopt;
  FileRequest file;
  file.user = request.user;
  file.share = path[share];
  file.path.assign(path.begin() + static_cast<std::ptrdiff_t>(share) + 1, path.end());
  if (!request.front.empty()) {
    file.admit = [front = request.front, user = request.user] { return Admit(front, user); };
  }
  return file;
}

// The parameters are those that a POST of them has as its body.
Answer Service::AskInstantly(const HttpRequest& request) {
  const auto params = QueryValue(request.query(), "params");
  const nas::ApiCall call = OwnCall(request, params ? &*params : nullptr);
  return calls_.Run(Calls::Kind::kCall, request.user, "instant",
                    [&] { return StartInstant(call); });
}

Answer Service::GetFirstLine(const HttpRequest& request, const RequestPath& path) {
  const auto file = FileOf(request, path);
  if (!file) return ErrorReply(kNotFound, "Name a file: /lines/SHARE/PATH.");
  const std::string pattern = QueryValue(request.query(), "pattern").value_or("");
  const bool with_text = QueryValue(request.query(), "text").value_or("") == "1";
  const auto start = [&] { return StartFirstLine(*file, pattern, with_text); };
  if (!request.front.empty()) {
    return calls_.Run(Calls::Kind::kFront, request.front, "fleet/lines", start);
  }
  return calls_.Run(Calls::Kind::kCall, request.user, "lines", start);
}

Answer Service::GetArchive(const HttpRequest& request, const std::string& task_id) {
  const auto value = [&](const char* name) {
    return QueryValue(request.query(), name).value_or("");
  };
  const auto rows = ParseRowRanges(QueryValue(request.query(), "rows").value_or("all"));
  if (!rows) {
    return ErrorReply(kBadRequest, "Say which rows: rows=0-9,12 in ascending order.");
  }
  ArchiveRequest archive;
  archive.user = request.user;
  archive.task_id = task_id;
  archive.rows = *rows;
  archive.sort_by = value("sort_by");
  archive.descending = LowerCase(value("sort_direction")) == "desc";
  archive.pattern = value("pattern");
  archive.head_only = request.method == "HEAD";
  return calls_.Run(Calls::Kind::kDownload, request.user, "zip",
                    [&] { return StartArchive(archive); });
}

Answer Service::GetFile(const HttpRequest& request, const RequestPath& path) {
  auto named = FileOf(request, path);
  if (!named) return ErrorReply(kNotFound, "Name a file: /files/SHARE/PATH.");
  FileRequest& file = *named;
  file.preview = QueryValue(request.query(), "preview").value_or("") == "1";
  file.head_only = request.method == "HEAD";
  const bool of_front = !request.front.empty();
  // A front says it in the address, which it has signed.
  if (of_front) {
    file.range = QueryValue(request.query(), "range");
  } else if (const std::string* range = request.Field("range")) {
    file.range = *range;
  }
  // One user's places, whichever way they come.
  return calls_.Run(Calls::Kind::kDownload, request.user, of_front ? "fleet/files" : "files",
                    [&] { return StartFile(file); });
}

}  // namespace arbory
