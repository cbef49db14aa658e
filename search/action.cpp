// What a search worker does once it has the user's identity.

#include <syslog.h>

#include "api/codes.h"
#include "api/log.h"
#include "history/recording.h"
#include "platform/system.h"
#include "search/find_handler.h"
#include "search/owned_list.h"
#include "search/search_state.h"

namespace {

// The codes that a failed walk is reported with, by the platform's error number.
int WalkErrorCode(int platform_error) {
  switch (platform_error) {
    case platform_error::kPermission:
      return web_code::kPermission;
    case platform_error::kNoSuchFolder:
      return web_code::kNoSuchFolder;
    case platform_error::kNoSuchUser:
    case platform_error::kNoSuchGroup:
      return web_code::kNoSuchAccount;
    case platform_error::kIllegal:
      return web_code::kIllegal;
    default:
      return web_code::kFailed;
  }
}

}  // namespace

// The search is remembered before the walk, so that one that is stopped or finds nothing counts
// too. A walk that ended because the worker was told to stop is no failure.
bool ArboryFindHandler::WebFMFindAction(const std::vector<std::string>& folders,
                                        Json::Value& result) {
  OwnedList<FileSearch::FindComp> comps;
  if (!CreateFindOp(comps.items(), result)) {
    SetError(WfmLibGetErr());
    syslog(LOG_ERR, "%s:%d Failed To parse the find parameters, reason=[%X]", kLogSource,
           log_line::kBadCriteria, static_cast<unsigned>(WfmLibGetErr()));
    return false;
  }
  SetSearchHistory(result);
  SetSearchCount();
  if (Recursive_Find(folders, comps.items(), result) || StopRequested()) return true;
  SetError(WalkErrorCode(NLIBCErrGet()));
  syslog(LOG_ERR, "%s:%d Failed To parse the find parameters, reason=[%X]", kLogSource,
         log_line::kWalkFailed, static_cast<unsigned>(NLIBCErrGet()));
  return false;
}

void ArboryFindHandler::SetSearchHistory(const Json::Value& criteria) {
  RecordSearch(*request(), criteria);
}

void ArboryFindHandler::SetSearchCount() { CountSearch(*request()); }
