#include "arbory/server/service/user_calls.h"

#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <climits>
#include <ctime>
#include <vector>

#include "arbory/comparators.h"
#include "arbory/nothing_found.h"
#include "arbory/options.h"
#include "arbory/running_search.h"
#include "arbory/search_request.h"
#include "arbory/server/service/query_help.h"
#include "arbory/server/service/row_addresses.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/json_text.h"
#include "nas/fleet/asker.h"
#include "nas/match/meant_query.h"
#include "nas/search/criteria.h"
#include "nas/search/instant.h"
#include "nas/search/location.h"
#include "nas/system/identity.h"
#include "nas/system/shares.h"
#include "platform/system.h"
#include "platform/webfm.h"

namespace arbory {
namespace {

constexpr char kTaskId[] = "taskid";
constexpr char kCaret[] = "caret";
// A person reads the first few.
constexpr size_t kInstantRows = 100;
// Each is a question of its own.
constexpr size_t kMostInstantLocations = 64;
constexpr char kNoSearch[] = "There is no such search; start a new one.";

Json::Value ListShares(const std::string& user) {
  Json::Value body;
  body["shares"] = Json::Value(Json::arrayValue);
  for (const nas::Share& share : nas::ListShares()) {
    if (!CanList(share.root)) continue;
    Json::Value entry;
    entry["name"] = share.name;
    entry["indexed"] = FILEIDXIsShareIndexed(share.name.c_str()) != 0;
    body["shares"].append(entry);
  }
  char home[PATH_MAX];
  body["homes"] = NUVAServiceHomePathGet(user.c_str(), home, sizeof home) == 0 && CanList(home);
  return body;
}

void ListSharesEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  if (BecomeCaller(request, response))
    response->SetError(kOk, ListShares(request->GetLoginUserName()));
}

void ListFleetSharesEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  if (!BecomeCaller(request, response)) return;
  Json::Value body = ListShares(request->GetLoginUserName());
  body["boxes"] = Json::Value(Json::objectValue);
  nas::AppendFleetShares(&body["shares"], &body["boxes"]);
  response->SetError(kOk, body);
}

void ReadSearchEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  if (!BecomeCaller(request, response)) return;
  const std::string id = request->GetParam(kTaskId, "").asString();
  const RunningSearch search = ReadSearch(request->GetLoginUserName(), id);
  if (!search.exists) {
    response->SetError(kNotFound, OwnError(kNotFound, kNoSearch));
    return;
  }
  Json::Value body;
  body[kTaskId] = id;
  body["finished"] = search.finished;
  body["progress"] = search.progress;
  if (search.progress < 0) body["errno"] = search.error;
  body["location"] = search.location;
  body["walk"] = search.walk;
  response->SetError(kOk, body);
}

SearchQuery TypedQuery(const NUVA::APIRequest& request) {
  const auto text = [&](const char* name) { return request.GetParam(name, "").asString(); };
  SearchQuery query;
  query.pattern = text("pattern");
  if (const std::string list = text("extension"); !list.empty()) query.extensions = {list};
  query.type = text("filetype");
  query.size_from = text("size_from");
  query.size_to = text("size_to");
  query.mtime.within = text("mtime");
  query.crtime.within = text("crtime");
  query.atime.within = text("atime");
  query.owner = text("owner");
  query.group = text("group");
  query.recursive = request.GetParam("recursive", true).asBool();
  query.content = request.GetParam("search_content", false).asBool();
  return query;
}

void ReadQueryEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) try {
  if (!BecomeCaller(request, response)) return;
  Json::Value body;
  const SearchQuery typed = TypedQuery(*request);
  const std::time_t now = std::time(nullptr);
  body["spans"] = SpansJson(typed.pattern, now);
  if (request->HasParam(kCaret)) {
    const Json::UInt64 caret = request->GetParam(kCaret, Json::Value()).asUInt64();
    Json::Value completion = CompletionJson(typed.pattern, caret, now);
    if (!completion.isNull()) body["completion"] = std::move(completion);
  }
  try {
    Json::Value& params = body["params"] = SearchRequest(typed, {}, now);
    for (const char* as_given : {"folder_path", "search_type", "list"}) {
      if (request->HasParam(as_given))
        params[as_given] = request->GetParam(as_given, Json::Value());
    }
  } catch (const CriterionError& error) {
    body["wrong"]["criterion"] = error.criterion();
    body["wrong"]["sentence"] = error.what();
  }
  response->SetError(kOk, body);
} catch (const Json::Exception&) {
  response->SetError(kBadRequest, OwnError(kBadRequest, kWrongType));
}

// Of those that can be opened.
std::vector<nas::Location> InstantLocations(const NUVA::APIRequest& request) {
  const Json::Value asked = request.GetParam("folder_path", Json::Value());
  std::vector<std::string> texts;
  if (asked.isString()) texts.push_back(asked.asString());
  if (asked.isArray()) {
    for (const Json::Value& text : asked) texts.push_back(text.asString());
  } else if (asked.isNull()) {
    for (const nas::Share& share : nas::ListShares()) {
      if (CanList(share.root)) texts.push_back("/" + share.name);
    }
  }
  std::vector<nas::Location> locations;
  for (const std::string& text : texts) {
    if (locations.size() == kMostInstantLocations) break;
    auto location = nas::OpenLocation(text);
    if (location) locations.push_back(std::move(*location));
  }
  return locations;
}

void InstantEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) try {
  if (!BecomeCaller(request, response)) return;
  Json::Value body;
  try {
    const Comparators comps(SearchRequest(TypedQuery(*request), {}, std::time(nullptr)));
    const nas::Criteria criteria(comps.get());
    const auto locations = InstantLocations(*request);
    const bool recursive = request->GetParam("recursive", true).asBool();
    const auto answer = nas::AskInstantly(locations, criteria.root, recursive, kInstantRows);
    if (answer) {
      body = nas::InstantJson(*answer, locations);
      AddAddresses(&body["rows"]);
    } else {
      body["wrong"]["criterion"] = "pattern";
      body["wrong"]["sentence"] = answer.error().path;
    }
  } catch (const CriterionError& error) {
    body["wrong"]["criterion"] = error.criterion();
    body["wrong"]["sentence"] = error.what();
  }
  response->SetError(kOk, body);
} catch (const UsageError& error) {
  response->SetError(kBadRequest, OwnError(kBadRequest, error.what()));
} catch (const Json::Exception&) {
  response->SetError(kBadRequest, OwnError(kBadRequest, kWrongType));
}

Json::Value MissesJson(const nas::NearMisses& near) {
  Json::Value body;
  body["complete"] = near.complete;
  body["entries"] = Json::UInt64{near.entries};
  body["folders"] = Json::UInt64{near.folders};
  body["left_out"] = Json::UInt64{near.left_out};
  body["terms"] = Json::Value(Json::arrayValue);
  for (const nas::NearMisses::Term& term : near.terms) {
    Json::Value& told = body["terms"].append(Json::Value());
    told["written"] = term.written;
    told["without"] = Json::UInt64{term.without};
    told["names"] = Json::Value(Json::arrayValue);
    for (const std::string& name : term.names) told["names"].append(name);
  }
  return body;
}

void NearMissesEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) try {
  // A person reads meanwhile that nothing was found.
  constexpr std::chrono::milliseconds kMost{1000};
  if (!BecomeCaller(request, response)) return;
  const RunningSearch search =
      ReadSearch(request->GetLoginUserName(), request->GetParam(kTaskId, "").asString());
  if (!search.exists) {
    response->SetError(kNotFound, OwnError(kNotFound, kNoSearch));
    return;
  }
  Json::Value params;
  for (const char* name :
       {"pattern", "filetype", "extension", "owner", "group", "size_from", "size_to", "mtime_from",
        "mtime_to", "crtime_from", "crtime_to", "atime_from", "atime_to"}) {
    if (request->HasParam(name)) params[name] = request->GetParam(name, Json::Value());
  }
  params["recursive"] = request->GetParam("recursive", true).asBool();
  params["folder_path"] = search.location;
  const auto near = NearMissesOf(params, kMost);
  Json::Value body = MissesJson(near.value_or(nas::NearMisses()));
  body["meant"] = nas::MeantQuery(params["pattern"].asString());
  response->SetError(kOk, body);
} catch (const UsageError& error) {
  response->SetError(kBadRequest, OwnError(kBadRequest, error.what()));
} catch (const Json::Exception&) {
  response->SetError(kBadRequest, OwnError(kBadRequest, kWrongType));
}

// The same request as one for the method "stop" of these searches.
class StopRequest : public NUVA::APIRequest {
 public:
  StopRequest(const NUVA::APIRequest& outer, const NUVA::APIMethod& row, Json::Value ids)
      : outer_(outer), row_(row), ids_(std::move(ids)) {}
  std::string GetLoginUserName() const override { return outer_.GetLoginUserName(); }
  std::string GetSessionID() const override { return outer_.GetSessionID(); }
  std::string GetPreferenceDir() const override { return outer_.GetPreferenceDir(); }
  std::string GetAPIMethod() const override { return row_.method; }
  int GetAPIVersion() const override { return row_.version; }
  bool HasParam(const std::string& name) const override { return name == kTaskId; }
  Json::Value GetParam(const std::string& name, const Json::Value& fallback) const override {
    return HasParam(name) ? ids_ : fallback;
  }

 private:
  const NUVA::APIRequest& outer_;
  const NUVA::APIMethod& row_;
  const Json::Value ids_;
};

class NoResponse : public NUVA::APIResponse {
 public:
  void SetError(int /*code*/, const Json::Value& /*data*/) override {}
};

// Table rows carry plain functions, so what the stopping needs waits here for the child, which is
// forked at once.
const NUVA::APIMethod* g_stop = nullptr;

void StopSearchesEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  if (!BecomeCaller(request, response)) return;
  Json::Value ids(Json::arrayValue);
  for (const std::string& id : UnfinishedSearches(request->GetLoginUserName())) ids.append(id);
  Json::Value body;
  body["stopped"] = ids.size();
  if (!ids.empty()) {
    StopRequest stop(*request, *g_stop, ids);
    NoResponse unheard;
    g_stop->entry(&stop, &unheard);
  }
  response->SetError(kOk, body);
}

nas::Child Start(NUVA::APIEntry entry, const std::string& user, const Json::Value& params) {
  return StartOwn(entry, {"", params, user, "server"});
}

}  // namespace

bool CanList(const std::string& folder) {
  return faccessat(AT_FDCWD, folder.empty() ? "/" : folder.c_str(), R_OK | X_OK, AT_EACCESS) == 0;
}

nas::Reply EncodeOwnReply(int code, const Json::Value& data) {
  if (!data.isNull() && code >= kOk)
    return {{code, code}, nas::JsonText(data, nas::JsonBytes::kClean)};
  // The runner answers by itself when the call could not even begin, or came to no end.
  return {
      {kUnavailable, kUnavailable},
      ErrorReply(kUnavailable, "The user's state folder cannot be used; the system log says why.")
          .body};
}

nas::Child StartOwn(NUVA::APIEntry entry, const nas::ApiCall& call) {
  return nas::StartCall({"arbory", 1, "", entry}, call, EncodeOwnReply);
}

Json::Value OwnError(int status, const char* sentence) {
  Json::Value body;
  body["code"] = status;
  body["error"] = sentence;
  return body;
}

// For good, as these calls make no folders.
bool BecomeCaller(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  if (WfmLibUGIDSet(nullptr, request->GetLoginUserName().c_str()) >= 0) {
    nas::GiveUpRoot();
    return true;
  }
  response->SetError(kUnavailable, OwnError(kUnavailable, "The server cannot act as this user."));
  return false;
}

void RefuseOwn(NUVA::APIResponse* response, int status, const char* sentence) {
  response->SetError(status, OwnError(status, sentence));
}

nas::Child StartReply(const nas::ApiCall& call, const nas::Reply& reply) {
  const NUVA::APIMethod row = {"arbory", 1, "",
                               [](NUVA::APIRequest* /*request*/, NUVA::APIResponse* response) {
                                 response->SetError(kOk, Json::Value());
                               }};
  return nas::StartCall(row, call,
                        [&](int /*code*/, const Json::Value& /*data*/) { return reply; });
}

nas::Child StartListShares(const nas::ApiCall& call) {
  const bool all = call.asks_fleet && !nas::CurrentConfig().fleet.boxes.empty();
  return StartOwn(all ? ListFleetSharesEntry : ListSharesEntry, call);
}

nas::Child StartReadSearch(const std::string& user, const std::string& task_id) {
  Json::Value params;
  params[kTaskId] = task_id;
  return Start(ReadSearchEntry, user, params);
}

nas::Child StartReadQuery(const nas::ApiCall& call) { return StartOwn(ReadQueryEntry, call); }

nas::Reply ReadQuery(const nas::ApiCall& call) {
  return nas::FinishCall(StartReadQuery(call), EncodeOwnReply, nas::ChildsEnd::kLeft);
}

nas::Child StartInstant(const nas::ApiCall& call) { return StartOwn(InstantEntry, call); }

nas::Child StartNearMisses(const nas::ApiCall& call, const std::string& task_id) {
  nas::ApiCall named = call;
  // Which search it is, the address tells.
  named.read_params = [&](Json::Value* params) {
    std::optional<nas::Reply> wrong;
    if (call.read_params) wrong = call.read_params(params);
    if (!wrong) (*params)[kTaskId] = task_id;
    return wrong;
  };
  return StartOwn(NearMissesEntry, named);
}

nas::Child StartStopSearches(const std::string& user, const NUVA::APIMethod& stop) {
  g_stop = &stop;
  return Start(StopSearchesEntry, user, Json::Value());
}

}  // namespace arbory
