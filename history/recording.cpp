#include "history/recording.h"

#include <syslog.h>

#include <cstdint>

#include "api/log.h"
#include "history/history_store.h"
#include "platform/json_file.h"

namespace {

constexpr char kSettingsFile[] = "/usersettings";
constexpr char kSettingsKey[] = "NUVA.VTX.App.PersonalSettings.Instance";
constexpr char kCountKey[] = "search_count";
constexpr long kRecentSlots = 3;  // how far back a store that sorts by time looks

// The old record is found by the request's pattern; the new one carries that of the criteria.
void WriteRecord(const NUVA::APIRequest& request, const Json::Value& criteria) {
  NUVA::WEBFM::FileDB store(HistoryDBPath(request));
  const std::string pattern = TextOf(request.GetParam("pattern", ""));
  if (!store.IsGood() || pattern.empty()) return;
  ConfigureForWriting(store);
  Json::Value record = criteria;
  record["folder_path"] = request.GetParam("folder_path", "");
  record["recursive"] = request.GetParam("recursive", false);
  NUVA::WEBFM::FileDB::Condition same_pattern;
  same_pattern.SetCondition("pattern", pattern);
  store.Delete(same_pattern);
  store.UpdateLastByTime(record, kRecentSlots);
}

void AddToCount(const NUVA::APIRequest& request) {
  const std::string path = request.GetPreferenceDir() + kSettingsFile;
  Json::Value settings;
  if (!Json::fromFile(path, settings)) {
    syslog(LOG_ERR, "%s:%d Failed to load usersettings, %m", kLogSource,
           log_line::kSettingsUnreadable);
    return;
  }
  if (!settings.isMember(kSettingsKey)) settings[kSettingsKey] = Json::Value(Json::objectValue);
  Json::Value& personal = settings[kSettingsKey];
  const std::uint32_t count = personal.get(kCountKey, 0).asUInt();
  personal[kCountKey] = static_cast<Json::UInt>(count + 1);  // wraps to 0
  Json::toFile(path, settings);
}

}  // namespace

void RecordSearch(const NUVA::APIRequest& request, const Json::Value& criteria) {
  try {
    WriteRecord(request, criteria);
  } catch (...) {
    // No memory for it.
  }
}

void CountSearch(const NUVA::APIRequest& request) {
  try {
    AddToCount(request);
  } catch (...) {
    // Settings of another shape than ours are left as they are.
  }
}
