#include "arbory/search_request.h"

#include "arbory/comparators.h"
#include "arbory/locate.h"
#include "arbory/parse.h"
#include "nas/base/accounts.h"
#include "nas/match/query.h"
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

void SetTimes(const TimeRange& range, const std::string& name, std::time_t now,
              Json::Value* params) {
  if (!range.from.empty()) {
    (*params)[name + "_from"] = Json::Int64{ParseTime(range.from, Bound::kFrom, now)};
  }
  if (!range.to.empty()) {
    (*params)[name + "_to"] = Json::Int64{ParseTime(range.to, Bound::kTo, now)};
  }
}

std::string Joined(const std::vector<std::string>& words) {
  std::string text;
  for (const std::string& word : words) text += (text.empty() ? "" : ",") + word;
  return text;
}

}  // namespace

Json::Value SearchRequest(const SearchQuery& query, const std::vector<std::string>& locations,
                          std::time_t now) {
  using Factory = FileSearch::FindFactory;
  Json::Value params(Json::objectValue);
  for (const std::string& location : locations) params["folder_path"].append(location);
  if (const auto parsed = nas::Query::Parse(query.pattern, now); !parsed) {
    throw UsageError(parsed.error().path);
  }
  params["pattern"] = query.pattern;
  const std::string extensions = Joined(query.extensions);
  if (!extensions.empty()) {
    CheckText(Factory::FIND_EXTENSION, extensions, "list of extensions");
    params["extension"] = extensions;
  }
  if (!query.type.empty()) {
    CheckText(Factory::FIND_FILETYPE, query.type,
              "file type; there are file, dir, image, video, audio, document and archive");
    params["filetype"] = query.type;
  }
  if (!query.size_from.empty()) params["size_from"] = Json::Int64{ParseSize(query.size_from)};
  if (!query.size_to.empty()) params["size_to"] = Json::Int64{ParseSize(query.size_to)};
  SetTimes(query.mtime, "mtime", now, &params);
  SetTimes(query.crtime, "crtime", now, &params);
  SetTimes(query.atime, "atime", now, &params);
  if (!query.owner.empty()) {
    CheckOwner(query.owner);
    params["owner"] = query.owner;
  }
  if (!query.group.empty()) {
    CheckGroup(query.group);
    params["group"] = query.group;
  }
  params["recursive"] = query.recursive;
  params["search_content"] = query.content;
  return params;
}

Json::Value PrepareSearch(const SearchQuery& query, Caller* caller) {
  const Locations locations = LocateFolders(query.folders, nas::ListShares(), query.recursive);
  caller->AddShares(locations.added);
  return SearchRequest(query, locations.paths, std::time(nullptr));
}

}  // namespace arbory
