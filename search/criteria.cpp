// Turns the parameters of a request into comparators, and copies them into the criteria object that
// the history and the walk options are made of. The order below is the order of the comparators.

#include <cstdint>
#include <limits>
#include <memory>

#include "search/account_record.h"
#include "search/find_handler.h"
#include "search/owned_list.h"

namespace {

using FileSearch::FindComp;
using FileSearch::FindFactory;
using Comps = std::vector<FindComp*>;

constexpr std::int64_t kNoUpperBound = std::numeric_limits<std::int64_t>::max();

// The factory wants the name; the criteria object gets the id, which survives a renaming.
template <class Record, class Id>
bool AddAccount(const char* key, FindFactory::_tag_FIND_FIELD_ field, const std::string& name,
                const Record& record, Id id, Comps& comps, Json::Value& criteria) {
  if (!record) return true;  // an unknown name drops the criterion
  criteria[key] = std::to_string(id(*record));
  return FindFactory::createFindOp(field, nullptr, name.c_str(), comps) != 0;
}

std::unique_ptr<FindComp> MakeSize(const char* op, std::int64_t bytes) {
  return std::make_unique<FileSearch::FindSizeComp>(op, bytes);
}

// Times are 32 bits wide wherever the module runs: one past 2038 wraps.
template <class TimeComp>
std::unique_ptr<FindComp> MakeTime(const char* op, std::int64_t seconds) {
  return std::make_unique<TimeComp>(op, static_cast<std::int32_t>(seconds));
}

struct NumberCriterion {
  const char* key;
  std::int64_t copy_fallback;
  std::int64_t fallback;
  const char* op;
  std::unique_ptr<FindComp> (*make)(const char* op, std::int64_t value);
};

constexpr NumberCriterion kNumberCriteria[] = {
    {"size_from", 0, 0, "greater", MakeSize},
    {"size_to", kNoUpperBound, 0, "less", MakeSize},
    {"mtime_from", 0, 0, "after", MakeTime<FileSearch::FindMTimeComp>},
    {"crtime_from", 0, 0, "after", MakeTime<FileSearch::FindCRTimeComp>},
    {"atime_from", 0, 0, "after", MakeTime<FileSearch::FindATimeComp>},
    {"mtime_to", kNoUpperBound, kNoUpperBound, "before", MakeTime<FileSearch::FindMTimeComp>},
    {"crtime_to", kNoUpperBound, kNoUpperBound, "before", MakeTime<FileSearch::FindCRTimeComp>},
    {"atime_to", kNoUpperBound, kNoUpperBound, "before", MakeTime<FileSearch::FindATimeComp>},
};

void AddNumber(const NUVA::APIRequest& request, const NumberCriterion& criterion, Comps& comps,
               Json::Value& criteria) {
  if (!request.HasParam(criterion.key)) return;
  criteria[criterion.key] =
      request.GetParam(criterion.key, static_cast<Json::Int64>(criterion.copy_fallback));
  const std::int64_t value =
      request.GetParam(criterion.key, static_cast<Json::Int64>(criterion.fallback)).asInt64();
  AppendOwned(comps, criterion.make(criterion.op, value));
}

struct TextCriterion {
  const char* key;
  FindFactory::_tag_FIND_FIELD_ field;
};

constexpr TextCriterion kTextCriteria[] = {
    {"filetype", FindFactory::FIND_FILETYPE},
    {"pattern", FindFactory::FIND_PATTERN},
    {"extension", FindFactory::FIND_EXTENSION},
};

bool AddText(const NUVA::APIRequest& request, const TextCriterion& criterion, Comps& comps,
             Json::Value& criteria) {
  if (!request.HasParam(criterion.key)) return true;
  criteria[criterion.key] = request.GetParam(criterion.key, "");
  const Json::Value value = request.GetParam(criterion.key, "");
  const char* text = value.asCString();
  // The factory reads the file type from its first text argument, every other field from its
  // second.
  const bool first = criterion.field == FindFactory::FIND_FILETYPE;
  return FindFactory::createFindOp(criterion.field, first ? text : nullptr, first ? nullptr : text,
                                   comps) != 0;
}

}  // namespace

bool ArboryFindHandler::CreateFindOp(std::vector<FindComp*>& comps, Json::Value& criteria) {
  UserRecord user;
  GroupRecord group;
  if (request()->HasParam("owner")) {
    const std::string name = request()->GetParam("owner", "").asString();
    user = GetUser(name.c_str());
    const auto id = [](const NUVAUSER& record) { return record.nUid; };
    if (!AddAccount("owner", FindFactory::FIND_OWNER, name, user, id, comps, criteria))
      return false;
  }
  if (request()->HasParam("group")) {
    const std::string name = request()->GetParam("group", "").asString();
    group = GetGroup(name.c_str());
    const auto id = [](const NUVAGROUP& record) { return record.nGid; };
    if (!AddAccount("group", FindFactory::FIND_GROUP, name, group, id, comps, criteria)) {
      return false;
    }
  }
  for (const NumberCriterion& criterion : kNumberCriteria) {
    AddNumber(*request(), criterion, comps, criteria);
  }
  for (const TextCriterion& criterion : kTextCriteria) {
    if (!AddText(*request(), criterion, comps, criteria)) return false;
  }
  return !comps.empty();
}
