#include "nas/webapi/request_child.h"

#include <syslog.h>

#include <cerrno>
#include <exception>
#include <new>
#include <optional>
#include <utility>

#include "nas/base/error.h"
#include "nas/fleet/signer.h"
#include "nas/system/lease.h"
#include "nas/system/request_bounds.h"
#include "nas/system/user_state.h"
#include "platform/webfm.h"

namespace nas {
namespace {

class Request : public NUVA::APIRequest {
 public:
  Request(const NUVA::APIMethod& row, const ApiCall& call, const Json::Value& params)
      : row_(row), call_(call), params_(params) {}

  std::string GetLoginUserName() const override { return call_.user; }
  std::string GetSessionID() const override { return call_.session; }
  std::string GetPreferenceDir() const override { return PreferenceFolder(call_.user); }
  std::string GetAPIMethod() const override { return call_.method; }
  int GetAPIVersion() const override { return row_.version; }

  bool HasParam(const std::string& name) const override {
    return params_.isObject() && params_.isMember(name);
  }
  Json::Value GetParam(const std::string& name, const Json::Value& fallback) const override {
    return HasParam(name) ? params_[name] : fallback;
  }

 private:
  const NUVA::APIMethod& row_;
  const ApiCall& call_;
  const Json::Value& params_;
};

class Response : public NUVA::APIResponse {
 public:
  explicit Response(const ReplyEncoder& encode) : encode_(encode) {}

  void SetError(int code, const Json::Value& data) override { reply_ = encode_(code, data); }
  // Once.
  std::optional<Reply> TakeReply() { return std::exchange(reply_, std::nullopt); }

 private:
  const ReplyEncoder& encode_;
  std::optional<Reply> reply_;
};

std::string g_spool_folder;

}  // namespace

const std::string& SpoolFolder() { return g_spool_folder; }

Reply ServeCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode) {
  if (call.admit) {
    if (auto refusal = call.admit()) return std::move(*refusal);
  }
  if (call.asks_fleet) StartFleetSigner(call.user);
  if (const Status entered = EnterUserState(call.user); !entered) {
    Report(entered.error());
    return encode(WfmLibGetErr(), Json::Value());
  }
  // What failed before is not this call's, whose failures may have no number of their own.
  errno = 0;
  g_spool_folder = TaskFolder(call.user);
  if (call.leased) LeaseNewTasks();
  Response response(encode);
  try {
    Json::Value read;
    if (call.read_params) {
      if (auto trouble = call.read_params(&read)) return std::move(*trouble);
    }
    Request request(row, call, call.read_params ? read : call.params);
    row.entry(&request, &response);
    if (auto reply = response.TakeReply()) return std::move(*reply);
    syslog(LOG_ERR, "%s %s gave no reply", row.api, row.method);
  } catch (const TooManyPieces& error) {
    syslog(LOG_ERR, "%s %s refused: %s", row.api, row.method, error.what());
    return encode(kCodeBadRequest, Json::Value());
  } catch (const std::bad_alloc&) {
    // What the entry function held is free again.
    syslog(LOG_ERR, "%s %s ran out of the memory of a call", row.api, row.method);
    Json::Value data;
    data["error"] = "The reply takes more memory than a call may have; ask for fewer rows.";
    return encode(kCodeUnknownFailure, data);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s %s failed: %s", row.api, row.method, error.what());
  } catch (...) {
    syslog(LOG_ERR, "%s %s failed", row.api, row.method);
  }
  return encode(kCodeUnknownFailure, Json::Value());
}

}  // namespace nas
