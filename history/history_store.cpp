#include "history/history_store.h"

namespace {

constexpr char kAdvancedKind[] = "advance";
constexpr char kAdvancedFile[] = "adv_search_history.db";
constexpr char kSimpleFile[] = "search_history.db";
constexpr int kMaxRecords = 10;  // a short list to choose from
constexpr char kPrimaryKey[] = "pattern";

}  // namespace

std::string HistoryDBFileName(const std::string& kind) {
  return kind == kAdvancedKind ? kAdvancedFile : kSimpleFile;
}

std::string TextOf(const Json::Value& value) {
  return value.isArray() || value.isObject() ? std::string() : value.asString();
}

std::string HistoryDBPath(const NUVA::APIRequest& request) {
  const std::string kind = TextOf(request.GetParam("search_type", "simple"));
  return request.GetPreferenceDir() + "/" + HistoryDBFileName(kind);
}

void ConfigureForWriting(NUVA::WEBFM::FileDB& store) {
  store.SetMaxRecordNum(kMaxRecords);
  store.SetPrimaryKey(kPrimaryKey);
}
