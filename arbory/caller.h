#pragma once
// What every command needs before it can call the module: the configuration, the user it acts for
// and the module itself.

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "arbory/options.h"
#include "nas/system/config.h"
#include "nas/webapi/module.h"
#include "nas/webapi/runner.h"

namespace arbory {

inline constexpr char kSearchApi[] = "NUVA.Arbory.Search";
inline constexpr int kSearchVersion = 2;

// For one thread. Calls run in children of this process, forked by each.
class Caller {
 public:
  // Reads the configuration and makes it the process's. Throws UsageError or nas::ConfigError, also
  // for a user that the caller may not act for.
  explicit Caller(const CommonOptions& options);

  // Offers more shares, for this run; calls begun before do not know them.
  void AddShares(const std::vector<nas::ShareSetting>& shares);
  // Searches other machines too, in this run.
  void AskFleet(nas::FleetSettings fleet);

  const std::string& user() const { return user_; }
  // Loads the module when first asked for. Throws std::runtime_error.
  const nas::Module& module();

  // The search API's row for `method`. Throws std::runtime_error when the module has none.
  const NUVA::APIMethod& Method(const char* method);

  // Makes the process the user's: what it then looks at is what the user may see. Root
  // stays the saved identity, with which calls make folders where users may not. Throws
  // std::runtime_error.
  void BecomeUser() const;

  // Searches begun from here on end when this program is gone (nas::ApiCall::leased).
  void LeaseSearches() { leased_ = true; }

  // Nobody will ask for the results of searches begun from here on in the order of a column.
  void LeaveUnsorted();
  // Nobody will ask for more of the results of searches begun from here on than names and types.
  void LeaveAttributes();

  // Makes one call as this user; see nas::RunCall.
  nas::Reply Call(const NUVA::APIMethod& row, const std::string& method, const Json::Value& params,
                  const nas::ReplyEncoder& encode) const;
  // The same without its reply: the call goes on by itself, also when this program has ended.
  void Begin(const NUVA::APIMethod& row, const std::string& method, const Json::Value& params,
             const nas::ReplyEncoder& encode) const;
  // The same once this program has ended, or closed the child's descriptor; until then the child
  // waits, and can be killed.
  nas::Child BeginAtEnd(const NUVA::APIMethod& row, const std::string& method,
                        const Json::Value& params, const nas::ReplyEncoder& encode) const;

 private:
  nas::ApiCall CallOf(const std::string& method, const Json::Value& params) const;

  nas::Config config_;
  std::string user_;
  bool leased_ = false;
  std::unique_ptr<nas::Module> module_;
};

}  // namespace arbory
