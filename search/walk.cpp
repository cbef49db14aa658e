// Sets the platform's walker up over the locations, records in the task where its results will be
// found, and walks.

#include <syslog.h>

#include <cstdint>
#include <limits>
#include <memory>

#include "api/log.h"
#include "platform/task_record.h"
#include "search/find_handler.h"
#include "search/owned_list.h"
#include "search/search_state.h"

namespace {

using FileSearch::FindATimeComp;

constexpr std::int64_t kNoUpperBound = std::numeric_limits<std::int64_t>::max();

void AddAccessTime(const NUVA::APIRequest& request, const char* key, std::int64_t fallback,
                   const char* op, std::vector<FindATimeComp*>& comps) {
  if (!request.HasParam(key)) return;
  const std::int64_t value = request.GetParam(key, static_cast<Json::Int64>(fallback)).asInt64();
  AppendOwned(comps, std::make_unique<FindATimeComp>(op, static_cast<std::int32_t>(value)));
}

}  // namespace

bool ArboryFindHandler::Recursive_Find(const std::vector<std::string>& paths,
                                       const std::vector<FileSearch::FindComp*>& comps,
                                       Json::Value& options) {
  const std::string user = request()->GetLoginUserName();
  const std::string session = request()->GetSessionID();
  FileSearch::WfmSearchWalker walker(user.c_str(), session.c_str(), pTask, &termination_flag);
  OwnedList<FindATimeComp> access_times;  // deleted before the walker that was lent them
  if (!walker.init(paths, comps)) return false;

  const bool recursive = request()->GetParam("recursive", true).asBool();
  walker.setSearchCurrentDir(!recursive);
  AddAccessTime(*request(), "atime_from", 0, "after", access_times.items());
  AddAccessTime(*request(), "atime_to", kNoUpperBound, "before", access_times.items());
  if (!WriteWalkRecord(walker)) return false;

  options["recursive"] = recursive;
  options["search_content"] = request()->GetParam("search_content", true).asBool();
  return walker.Walk(access_times.items(), options);
}

// Without this record no listing could find the results, so no walk starts without it.
bool ArboryFindHandler::WriteWalkRecord(FileSearch::WfmSearchWalker& walker) {
  pTask->reload();
  Json::Value data = pTask->getProperty(task_record::kData);
  if (data.isNull()) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, log_line::kWalkNoTaskData);
    return false;
  }
  data[task_record::kDatabaseId] = walker.getDBTaskId();
  data[task_record::kDatabaseVolume] = walker.getDBVol();
  // As the user typed them, unlike the ids in the criteria object.
  for (const char* key : {"owner", "group", "pattern", "extension"}) {
    if (request()->HasParam(key)) data[key] = request()->GetParam(key, "");
  }
  if (pTask->setProperty(task_record::kData, data)) return true;
  syslog(LOG_ERR, "%s:%d Failed to write progress.", kLogSource, log_line::kWalkTaskWrite);
  return false;
}
