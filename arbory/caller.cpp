#include "arbory/caller.h"

#include <poll.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "arbory/parse.h"
#include "nas/base/accounts.h"
#include "nas/base/system_call.h"
#include "platform/webfm.h"

namespace arbory {
namespace {

std::string ActingUser(const std::string& wanted) {
  const auto caller = nas::FindAccount(getuid());
  if (wanted.empty()) {
    if (!caller) throw UsageError("the user " + std::to_string(getuid()) + " has no name here");
    return caller->name;
  }
  const auto account = nas::FindAccount(wanted);
  if (!account) throw UsageError("there is no user '" + wanted + "'");
  if (geteuid() != 0 && account->uid != getuid()) {
    throw UsageError("only root may act for another user (--user " + wanted + ")");
  }
  return account->name;
}

}  // namespace

Caller::Caller(const CommonOptions& options) : config_(nas::LoadConfig(options.config)) {
  for (const std::string& share : options.shares) config_.shares.push_back(ParseShare(share));
  config_.index_use = options.index_use;
  config_.search_threads = options.threads;
  config_.list_unread = options.show_errors;
  nas::Configure(config_);
  user_ = ActingUser(options.user);
}

void Caller::AddShares(const std::vector<nas::ShareSetting>& shares) {
  if (shares.empty()) return;
  config_.shares.insert(config_.shares.end(), shares.begin(), shares.end());
  nas::Configure(config_);
}

void Caller::AskFleet(nas::FleetSettings fleet) {
  config_.fleet = std::move(fleet);
  nas::Configure(config_);
}

void Caller::LeaveUnsorted() {
  config_.keep_orderings = false;
  nas::Configure(config_);
}

void Caller::LeaveAttributes() {
  config_.keep_attributes = false;
  nas::Configure(config_);
}

const nas::Module& Caller::module() {
  if (!module_) module_ = std::make_unique<nas::Module>(std::string());
  return *module_;
}

const NUVA::APIMethod& Caller::Method(const char* method) {
  const NUVA::APIMethod* row = module().Find(kSearchApi, kSearchVersion, method);
  if (row == nullptr) throw std::runtime_error(std::string("the module has no ") + method);
  return *row;
}

void Caller::BecomeUser() const {
  if (WfmLibUGIDSet(nullptr, user_.c_str()) == 0) return;
  throw std::runtime_error("cannot act for the user '" + user_ + "': " + std::strerror(errno));
}

nas::ApiCall Caller::CallOf(const std::string& method, const Json::Value& params) const {
  // The session's name only shows in log lines.
  nas::ApiCall call{method, params, user_, "terminal", leased_};
  call.asks_fleet = !config_.fleet.boxes.empty() && method == "start";
  return call;
}

nas::Reply Caller::Call(const NUVA::APIMethod& row, const std::string& method,
                        const Json::Value& params, const nas::ReplyEncoder& encode) const {
  return nas::RunCall(row, CallOf(method, params), encode);
}

void Caller::Begin(const NUVA::APIMethod& row, const std::string& method, const Json::Value& params,
                   const nas::ReplyEncoder& encode) const {
  const nas::Child child = nas::StartCall(row, CallOf(method, params), encode);
}

nas::Child Caller::BeginAtEnd(const NUVA::APIMethod& row, const std::string& method,
                              const Json::Value& params, const nas::ReplyEncoder& encode) const {
  return nas::StartChild([&](int pipe) {
    pollfd reader{pipe, 0, 0};
    nas::Uninterrupted([&] { return poll(&reader, 1, -1); });
    Call(row, method, params, encode);
  });
}

}  // namespace arbory
