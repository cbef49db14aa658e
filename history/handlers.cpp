#include "history/handlers.h"

#include <syslog.h>

#include <algorithm>
#include <limits>
#include <string>
#include <vector>

#include "api/codes.h"
#include "api/log.h"
#include "history/history_store.h"

namespace {

// A count as the client meant it, as far as there are counts that large; 0 for what is no number.
int CountOf(const Json::Value& value) {
  using Limits = std::numeric_limits<int>;
  if (!value.isNumeric()) return value == true ? 1 : 0;
  return static_cast<int>(std::clamp<double>(value.asDouble(), Limits::min(), Limits::max()));
}

// Right after the store's own test: %m is the reason that the store left.
void LogUnusable(const std::string& path, int line) {
  syslog(LOG_ERR, "%s:%d db is not good, %s, %m", kLogSource, line, path.c_str());
}

}  // namespace

void SearchHistortGet::Process() {
  NUVA::WEBFM::FileDB::Condition all;
  all.offset = CountOf(request()->GetParam("offset", 0));
  all.limit = CountOf(request()->GetParam("limit", 0));
  const std::string path = HistoryDBPath(*request());
  Json::Value reply;
  Json::Value& history = reply["history"] = Json::Value(Json::arrayValue);
  std::vector<Json::Value> records;
  const NUVA::WEBFM::FileDB store(path);
  if (store.IsGood()) {
    store.Select(all, records);
    for (const Json::Value& record : records) history.append(record);
  } else {
    LogUnusable(path, log_line::kHistoryGet);
  }
  // The records of this reply, not those stored.
  reply["total"] = static_cast<Json::UInt>(records.size());
  SetResponse(reply);
}

void SearchHistortSet::Process() {
  const std::string pattern = TextOf(request()->GetParam("pattern", ""));
  const std::string path = HistoryDBPath(*request());
  if (pattern.empty()) {
    SetError(kCodeFailed);
    return;
  }
  NUVA::WEBFM::FileDB store(path);
  if (!store.IsGood()) {
    LogUnusable(path, log_line::kHistorySet);
    SetError(kCodeFailed);
    return;
  }
  ConfigureForWriting(store);
  Json::Value record;
  record["pattern"] = pattern;
  record["folder_path"] = request()->GetParam("folder_path", "");
  record["recursive"] = request()->GetParam("recursive", false);
  if (!store.Insert(record)) {
    SetError(kCodeFailed);
    return;
  }
  Json::Value nothing;
  SetResponse(nothing);
}

void SearchHistortDelete::Process() {
  const std::string path = HistoryDBPath(*request());
  NUVA::WEBFM::FileDB store(path);
  if (!store.IsGood()) {
    LogUnusable(path, log_line::kHistoryDelete);
    SetError(kCodeFailed);
    return;
  }
  if (!store.Delete(NUVA::WEBFM::FileDB::Condition())) {
    SetError(kCodeFailed);
    return;
  }
  Json::Value nothing;
  SetResponse(nothing);
}
