// Listing: one page of what a search has found so far, and whether it has finished. Runs beside the
// worker that fills the result database; two bounded waits are all that ties them.

#include <strings.h>
#include <syslog.h>

#include <utility>

#include "api/codes.h"
#include "api/log.h"
#include "platform/task_record.h"
#include "search/find_handler.h"
#include "search/search_state.h"

namespace {

// Tenths of a second: opening the locations of a busy machine takes time, a first page little more.
constexpr int kDatabaseBound = 500;
constexpr int kResultReadyBound = 100;

struct AttributeName {
  const char* name;
  AdditionalAttribute bit;
};

constexpr AttributeName kAttributeNames[] = {
    {"real_path", kRealPath}, {"size", kSize}, {"owner", kOwner},
    {"time", kTime},          {"perm", kPerm}, {"type", kType},
};

// Of a record that was tampered with: nothing that names a database.
std::string TextOf(const Json::Value& value) { return value.isString() ? value.asString() : ""; }

bool SameIgnoringCase(const std::string& text, const char* word) {
  return strcasecmp(text.c_str(), word) == 0;
}

}  // namespace

int ArboryFindHandler::ParseFileAdditional() {
  const Json::Value names =
      StringExplodeEx(request()->GetParam("additional", ""), ",", request()->GetAPIVersion(), true);
  int mask = 0;
  for (const Json::Value& name : names) {
    for (const AttributeName& attribute : kAttributeNames) {
      if (SameIgnoringCase(name.asString(), attribute.name)) mask |= attribute.bit;
    }
  }
  return mask;
}

bool ArboryFindHandler::WebFMFindRemainResultHandler() {
  const int additional = ParseFileAdditional();
  const Json::Value id = request()->GetParam("taskid", "");
  // An object or an array names no task any more than a missing id does.
  if (!request()->HasParam("taskid") || !id.isConvertibleTo(Json::stringValue)) {
    SetError(kCodeBadParameter);
    return false;
  }
  const std::string user = request()->GetLoginUserName();
  const OKT::TaskMgr tasks(user.c_str());
  const std::string task_id = id.asString();
  try {
    pTask = tasks.getTaskWithThrow(task_id.c_str());
  } catch (...) {
    Json::Value response;
    response["finished"] = true;  // cleaned: nothing more will come
    SetResponse(response);
    return true;
  }
  const std::string session = request()->GetSessionID();
  if (WfmLibUGIDSet(session.c_str(), user.c_str()) < 0) {
    syslog(LOG_ERR, "%s:%d Failed to set UGID for user=%s, sid=%s.", kLogSource,
           log_line::kListIdentity, user.c_str(), session.c_str());
    SetError(kCodeFailed);
    return false;
  }
  return AnswerPage(additional, task_id);
}

bool ArboryFindHandler::AnswerPage(int additional, const std::string& task_id) {
  Json::Value response;
  Json::Value task_data;
  const std::string direction = request()->GetParam("sort_direction", "").asString();
  const bool ascending = !SameIgnoringCase(direction, "DESC");
  const std::string sort_by = request()->GetParam("sort_by", "").asString();
  if (!WaitForDatabase(task_id, task_data)) return false;

  const _tag_dir_entry_type_ type = RequestedType();
  if (task_data.isMember(task_record::kDatabaseId) &&
      task_data.isMember(task_record::kDatabaseVolume)) {
    const std::string pattern = request()->GetParam("pattern", "").asString();
    const std::string volume = TextOf(task_data[task_record::kDatabaseVolume]);
    const std::string database = TextOf(task_data[task_record::kDatabaseId]);
    if (!WebFMQueryResult(additional, volume.c_str(), database.c_str(), response, task_data,
                          sort_by.empty() ? nullptr : sort_by.c_str(), &ascending, &type,
                          pattern.c_str())) {
      SetError(kCodeNoResults);
      return false;
    }
  }
  response["finished"] = pTask->isFinished();
  SetResponse(std::move(response));
  return true;
}

// The codes of the two failures are what clients know them by: a database that is not there yet may
// be asked for again, a record without data may not.
bool ArboryFindHandler::WaitForDatabase(const std::string& task_id, Json::Value& task_data) {
  if (WaitForTaskDataKeyReady(pTask, task_record::kData, task_record::kDatabaseId,
                              kDatabaseBound) == 0) {
    SetError(kCodeNoResults);
    syslog(LOG_ERR, "%s:%d Failed to get json data, %s.", kLogSource, log_line::kListNotReady,
           task_id.c_str());
    return false;
  }
  task_data = pTask->getProperty(task_record::kData);
  if (task_data.isNull()) {
    SetError(kCodeFailed);
    syslog(LOG_ERR, "%s:%d Failed to get json data, %s.", kLogSource, log_line::kListNoTaskData,
           task_id.c_str());
    return false;
  }
  WaitForTaskDataReady(pTask, task_record::kResultReady, kResultReadyBound);
  return true;
}

_tag_dir_entry_type_ ArboryFindHandler::RequestedType() const {
  const std::string type = request()->GetParam("filetype", "").asString();
  if (SameIgnoringCase(type, "dir")) return DIR_ENTRY_DIR;
  return SameIgnoringCase(type, "file") ? DIR_ENTRY_FILE : DIR_ENTRY_ALL;
}
