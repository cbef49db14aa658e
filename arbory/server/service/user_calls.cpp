#include "arbory/server/service/user_calls.h"

#include <fcntl.h>
#include <unistd.h>

#include <climits>
#include <vector>

#include "arbory/running_search.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/json_text.h"
#include "nas/system/identity.h"
#include "nas/system/shares.h"
#include "platform/system.h"
#include "platform/webfm.h"

namespace arbory {
namespace {

constexpr char kTaskId[] = "taskid";

Json::Value Error(int status, const char* sentence) {
  Json::Value body;
  body["code"] = status;
  body["error"] = sentence;
  return body;
}

// Steps down to the user for good, as these calls make no folders; answers itself when that fails.
bool Become(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  if (WfmLibUGIDSet(nullptr, request->GetLoginUserName().c_str()) >= 0) {
    nas::GiveUpRoot();
    return true;
  }
  response->SetError(kUnavailable, Error(kUnavailable, "The server cannot act as this user."));
  return false;
}

bool CanList(const std::string& folder) {
  return faccessat(AT_FDCWD, folder.empty() ? "/" : folder.c_str(), R_OK | X_OK, AT_EACCESS) == 0;
}

void ListSharesEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  if (!Become(request, response)) return;
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
  const std::string user = request->GetLoginUserName();
  body["homes"] = NUVAServiceHomePathGet(user.c_str(), home, sizeof home) == 0 && CanList(home);
  response->SetError(kOk, body);
}

void ReadSearchEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  if (!Become(request, response)) return;
  const std::string id = request->GetParam(kTaskId, "").asString();
  const RunningSearch search = ReadSearch(request->GetLoginUserName(), id);
  if (!search.exists) {
    response->SetError(kNotFound, Error(kNotFound, "There is no such search; start a new one."));
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
  if (!Become(request, response)) return;
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

// The code is the HTTP status and the data its JSON body.
nas::Reply EncodeOwnReply(int code, const Json::Value& data) {
  if (!data.isNull() && code >= kOk)
    return {{code, code}, nas::JsonText(data, nas::JsonBytes::kClean)};
  // The runner answers by itself when the call could not even begin, or came to no end.
  return {
      {kUnavailable, kUnavailable},
      ErrorReply(kUnavailable, "The user's state folder cannot be used; the system log says why.")
          .body};
}

nas::Child Start(NUVA::APIEntry entry, const std::string& user, const Json::Value& params) {
  const NUVA::APIMethod row = {"arbory", 1, "", entry};
  return nas::StartCall(row, {"", params, user, "server"}, EncodeOwnReply);
}

}  // namespace

nas::Child StartReply(const nas::ApiCall& call, const nas::Reply& reply) {
  const NUVA::APIMethod row = {"arbory", 1, "",
                               [](NUVA::APIRequest* /*request*/, NUVA::APIResponse* response) {
                                 response->SetError(kOk, Json::Value());
                               }};
  return nas::StartCall(row, call,
                        [&](int /*code*/, const Json::Value& /*data*/) { return reply; });
}

nas::Child StartListShares(const std::string& user) {
  return Start(ListSharesEntry, user, Json::Value());
}

nas::Child StartReadSearch(const std::string& user, const std::string& task_id) {
  Json::Value params;
  params[kTaskId] = task_id;
  return Start(ReadSearchEntry, user, params);
}

nas::Child StartStopSearches(const std::string& user, const NUVA::APIMethod& stop) {
  g_stop = &stop;
  return Start(StopSearchesEntry, user, Json::Value());
}

}  // namespace arbory
