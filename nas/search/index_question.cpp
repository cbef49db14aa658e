#include "nas/search/index_question.h"

#include <json/value.h>

#include <cerrno>
#include <utility>

#include "nas/base/json_text.h"
#include "nas/match/query_json.h"
#include "nas/match/query_match.h"

namespace nas {
namespace {

constexpr char kQuery[] = "query";
constexpr char kTextsToo[] = "texts_too";
constexpr char kRecursive[] = "recursive";
constexpr char kShare[] = "share";
constexpr char kMounts[] = "mounts";
constexpr char kTemporary[] = "temporary";
constexpr char kLocations[] = "locations";
constexpr char kUnread[] = "unread";
constexpr char kNamesAlone[] = "names";
constexpr char kBest[] = "best";

Json::Value IdsToJson(const FolderGate::FolderIds& ids) {
  Json::Value json(Json::arrayValue);
  for (const auto& [device, inode] : ids) {
    json.append(Json::UInt64{device});
    json.append(Json::UInt64{inode});
  }
  return json;
}

bool ReadIds(const Json::Value& json, FolderGate::FolderIds& ids) {
  if (!json.isArray() || json.size() % 2 != 0) return false;
  for (Json::ArrayIndex i = 0; i < json.size(); i += 2) {
    if (!json[i].isUInt64() || !json[i + 1].isUInt64()) return false;
    ids.emplace(json[i].asUInt64(), json[i + 1].asUInt64());
  }
  return true;
}

bool ReadTexts(const Json::Value& json, std::vector<std::string>& texts) {
  if (!json.isArray()) return false;
  for (const Json::Value& text : json) {
    if (!text.isString() || text.asString().find('\0') != std::string::npos) return false;
    texts.push_back(text.asString());
  }
  return true;
}

bool ReadAll(const Json::Value& json, IndexQuestion& question) {
  std::vector<std::string> share;
  for (const char* flag : {kTextsToo, kRecursive, kUnread, kNamesAlone}) {
    if (!json[flag].isBool()) return false;
  }
  if (!ReadTexts(json[kShare], share) || share.size() != 3) return false;
  if (!ReadTexts(json[kMounts], question.mounts)) return false;
  if (!json[kBest].isUInt() || json[kBest].asUInt() > kMostBest) return false;
  question.texts_too = json[kTextsToo].asBool();
  question.unread = json[kUnread].asBool();
  question.names_alone = json[kNamesAlone].asBool();
  question.share = {share[0], share[1], {}};
  question.path = share[2];
  question.rules.recursive = json[kRecursive].asBool();
  question.best = json[kBest].asUInt();
  return ReadIds(json[kTemporary], question.rules.temporary) &&
         ReadIds(json[kLocations], question.rules.locations);
}

}  // namespace

bool AsksTimes(const QueryNode& query) {
  return AnyLeaf(query,
                 [](const QueryNode& leaf) { return leaf.kind == QueryNode::Kind::kModified; });
}

std::string QuestionText(const IndexQuestion& question) {
  Json::Value json;
  json[kQuery] = QueryToJson(question.query);
  json[kTextsToo] = question.texts_too;
  json[kUnread] = question.unread;
  json[kNamesAlone] = question.names_alone;
  json[kRecursive] = question.rules.recursive;
  for (const std::string& text : {question.share.name, question.share.root, question.path}) {
    json[kShare].append(text);
  }
  json[kMounts] = Json::arrayValue;
  for (const std::string& mount : question.mounts) json[kMounts].append(mount);
  json[kTemporary] = IdsToJson(question.rules.temporary);
  json[kLocations] = IdsToJson(question.rules.locations);
  json[kBest] = Json::UInt{static_cast<unsigned>(question.best)};
  return JsonText(json, JsonBytes::kRaw);
}

Result<IndexQuestion> ReadQuestion(std::string_view text) {
  const Error illegal{kErrorIllegal, EINVAL, "question"};
  Json::Value json;
  IndexQuestion question;
  if (!ParseJson(text, &json) || !json.isObject() || !ReadAll(json, question)) return illegal;
  auto query = QueryFromJson(json[kQuery]);
  if (!query) return query.error();
  question.query = std::move(*query);
  return question;
}

}  // namespace nas
