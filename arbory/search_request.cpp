#include "arbory/search_request.h"

#include "arbory/comparators.h"
#include "arbory/locate.h"
#include "arbory/parse.h"
#include "arbory/search_terms.h"
#include "nas/base/accounts.h"
#include "nas/match/query.h"
#include "nas/search/fleet_search.h"
#include "nas/system/shares.h"
#include "platform/filesearch.h"

namespace arbory {
namespace {

void CheckOwner(const std::string& name) {
  if (!nas::FindAccount(name)) throw UsageError("there is no user '" + name + "'");
}

void CheckGroup(const std::string& name) {
  if (!nas::FindGroup(name)) throw UsageError("there is no group '" + name + "'");
}

// Asks the engine itself, so that what is refused here and there is the same.
void CheckText(FileSearch::FindFactory::_tag_FIND_FIELD_ field, const std::string& text,
               const char* what) {
  std::vector<FileSearch::FindComp*> comps;
  const bool made = AppendComparator(field, text, &comps);
  for (const FileSearch::FindComp* comp : comps) delete comp;
  if (!made) throw UsageError("'" + text + "' is no " + what);
}

void SetBounds(const nas::Bounds& bounds, const std::string& name, Json::Value* params) {
  if (bounds.from != nas::Bounds::kLeast) (*params)[name + "_from"] = Json::Int64{bounds.from};
  if (bounds.to != nas::Bounds::kMost) (*params)[name + "_to"] = Json::Int64{bounds.to};
}

void SetTimes(const TimeRange& range, const std::string& name, std::time_t now,
              Json::Value* params) {
  nas::Bounds bounds;
  if (!range.within.empty()) bounds = ParseTimeBounds(range.within, now);
  if (!range.from.empty()) bounds.from = ParseTime(range.from, Bound::kFrom, now);
  if (!range.to.empty()) bounds.to = ParseTime(range.to, Bound::kTo, now);
  if (bounds.from > bounds.to) {
    throw UsageError("the latest time '" + range.to + "' is before the earliest, '" + range.from +
                     "'");
  }
  SetBounds(bounds, name, params);
}

// What `set` throws is said of this criterion.
template <class Set>
void Of(const char* criterion, const Set& set) {
  try {
    set();
  } catch (const UsageError& error) {
    throw CriterionError(criterion, error.what());
  }
}

std::string Joined(const std::vector<std::string>& words) {
  std::string text;
  for (const std::string& word : words) text += (text.empty() ? "" : ",") + word;
  return text;
}

void SetSizes(const SearchQuery& query, Json::Value* params) {
  nas::Bounds bounds;
  Of("size_from", [&] {
    if (!query.size_from.empty()) bounds.from = ParseSize(query.size_from);
  });
  Of("size_to", [&] {
    if (!query.size_to.empty()) bounds.to = ParseSize(query.size_to);
    if (bounds.from <= bounds.to) return;
    throw UsageError("the largest size '" + query.size_to + "' is less than the smallest, '" +
                     query.size_from + "'");
  });
  SetBounds(bounds, "size", params);
}

void SetWords(const SearchQuery& query, Json::Value* params) {
  using Factory = FileSearch::FindFactory;
  const std::string extensions = Joined(query.extensions);
  Of("extension", [&] {
    if (extensions.empty()) return;
    CheckText(Factory::FIND_EXTENSION, extensions, "list of extensions");
    (*params)["extension"] = extensions;
  });
  const std::string type = TypeParameter(query);
  Of("filetype", [&] {
    if (type.empty()) return;
    CheckText(Factory::FIND_FILETYPE, type,
              "file type; there are file, dir, image, video, audio, document and archive");
    (*params)["filetype"] = type;
  });
  Of("owner", [&] {
    if (query.owner.empty()) return;
    CheckOwner(query.owner);
    (*params)["owner"] = query.owner;
  });
  Of("group", [&] {
    if (query.group.empty()) return;
    CheckGroup(query.group);
    (*params)["group"] = query.group;
  });
}

}  // namespace

Json::Value SearchRequest(const SearchQuery& query, const std::vector<std::string>& locations,
                          std::time_t now) {
  Json::Value params(Json::objectValue);
  for (const std::string& location : locations) params["folder_path"].append(location);
  const std::string pattern = PatternWithTerms(query);
  Of("pattern", [&] {
    const auto parsed = nas::Query::Parse(pattern, now);
    if (!parsed) throw UsageError(parsed.error().path);
  });
  params["pattern"] = pattern;
  SetWords(query, &params);
  SetSizes(query, &params);
  Of("mtime", [&] { SetTimes(query.mtime, "mtime", now, &params); });
  Of("crtime", [&] { SetTimes(query.crtime, "crtime", now, &params); });
  Of("atime", [&] { SetTimes(query.atime, "atime", now, &params); });
  params["recursive"] = query.recursive;
  params["search_content"] = query.content;
  return params;
}

Json::Value PrepareSearch(const SearchQuery& query, Caller* caller) {
  std::vector<std::string> here;
  std::vector<std::string> elsewhere;
  for (const std::string& folder : query.folders) {
    (nas::FindFleetLocation(folder) ? elsewhere : here).push_back(folder);
  }
  Locations locations = LocateFolders(here, nas::ListShares(), query.recursive, query.ignore_files);
  caller->AddShares(locations.added);
  locations.paths.insert(locations.paths.end(), elsewhere.begin(), elsewhere.end());
  return SearchRequest(query, locations.paths, std::time(nullptr));
}

}  // namespace arbory
