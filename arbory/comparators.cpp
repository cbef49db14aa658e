#include "arbory/comparators.h"

#include <cstdint>
#include <memory>
#include <utility>

#include "arbory/options.h"

namespace arbory {

using FileSearch::FindFactory;

bool AppendComparator(FindFactory::_tag_FIND_FIELD_ field, const std::string& text,
                      std::vector<FileSearch::FindComp*>* comps) {
  const bool is_type = field == FindFactory::FIND_FILETYPE;
  return FindFactory::createFindOp(field, is_type ? text.c_str() : nullptr,
                                   is_type ? nullptr : text.c_str(), *comps) != 0;
}

Comparators::Comparators(const Json::Value& params) {
  AddText(params, "pattern", FindFactory::FIND_PATTERN);
  AddText(params, "filetype", FindFactory::FIND_FILETYPE);
  AddText(params, "extension", FindFactory::FIND_EXTENSION);
  AddText(params, "owner", FindFactory::FIND_OWNER);
  AddText(params, "group", FindFactory::FIND_GROUP);
  AddBounds<FileSearch::FindSizeComp, long long>(params, "size", "greater", "less");
  // Times are 32 bits wide in a search: one past 2038 wraps.
  AddBounds<FileSearch::FindMTimeComp, std::int32_t>(params, "mtime", "after", "before");
  AddBounds<FileSearch::FindCRTimeComp, std::int32_t>(params, "crtime", "after", "before");
  AddBounds<FileSearch::FindATimeComp, std::int32_t>(params, "atime", "after", "before");
}

Comparators::~Comparators() {
  for (const FileSearch::FindComp* comp : comps_) delete comp;
}

void Comparators::AddText(const Json::Value& params, const char* name,
                          FindFactory::_tag_FIND_FIELD_ field) {
  if (!params.isMember(name)) return;
  const std::string text = params[name].asString();
  if (!AppendComparator(field, text, &comps_)) {
    throw UsageError("'" + text + "' cannot be searched for");
  }
}

template <class Comp, class Number>
void Comparators::AddBounds(const Json::Value& params, const std::string& name, const char* least,
                            const char* most) {
  for (const auto& [key, op] : {std::pair(name + "_from", least), {name + "_to", most}}) {
    if (!params.isMember(key)) continue;
    auto comp = std::make_unique<Comp>(op, static_cast<Number>(params[key].asInt64()));
    comps_.push_back(comp.get());
    comp.release();
  }
}

}  // namespace arbory
