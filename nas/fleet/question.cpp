#include "nas/fleet/question.h"

#include <cerrno>
#include <limits>
#include <utility>

#include "nas/base/json_text.h"
#include "nas/match/query_json.h"

namespace nas {
namespace {

constexpr char kProtocol[] = "protocol";
constexpr char kQuery[] = "query";
constexpr char kContents[] = "contents";
constexpr char kRecursive[] = "recursive";
constexpr char kLocations[] = "locations";
constexpr char kLimit[] = "limit";
constexpr char kWait[] = "wait_ms";
constexpr char kAfter[] = "after";
constexpr char kSortBy[] = "sort_by";
constexpr char kDescending[] = "descending";
constexpr char kBehind[] = "behind";

// As many as a search may have.
constexpr unsigned kMostLocations = 65'535;
constexpr Json::ArrayIndex kRowParts = 11;
constexpr size_t kMostNameBytes = 255;  // of every file system
constexpr size_t kMostPathBytes = 64 << 10;

const Error kIllegal{kErrorIllegal, EINVAL, "fleet"};

// Of an account that this machine does not have no file is.
constexpr Bounds kNobody{-1, -1};

// Turns numbers of accounts into names, all through the tree.
void NameAccounts(Json::Value& node) {
  const bool owner = node[0] == "owner";
  if (!owner && node[0] != "group") {
    for (Json::Value& child : node) {
      if (child.isArray() && !child.empty() && child[0].isString()) NameAccounts(child);
    }
    return;
  }
  for (Json::ArrayIndex i = 1; i < node.size(); ++i) {
    const auto id = static_cast<uid_t>(node[i][0].asInt64());
    node[i] = owner ? UserText(id) : GroupText(id);
  }
}

Bounds BoundsOf(const std::string& name, bool owner) {
  if (owner) {
    const auto account = FindAccount(name);
    return account ? Bounds{account->uid, account->uid} : kNobody;
  }
  const auto group = FindGroup(name);
  return group ? Bounds{group->gid, group->gid} : kNobody;
}

// The other way round. False for what cannot be that.
bool NumberAccounts(Json::Value& node, int depth = 0) {
  if (!node.isArray() || node.empty() || depth > kJsonMaxDepth) return false;
  const bool owner = node[0] == "owner";
  if (!owner && node[0] != "group") {
    for (Json::Value& child : node) {
      const bool is_node = child.isArray() && !child.empty() && child[0].isString();
      if (is_node && !NumberAccounts(child, depth + 1)) return false;
    }
    return true;
  }
  for (Json::ArrayIndex i = 1; i < node.size(); ++i) {
    if (!node[i].isString()) return false;
    const Bounds bounds = BoundsOf(node[i].asString(), owner);
    Json::Value pair(Json::arrayValue);
    pair.append(Json::Int64{bounds.from});
    pair.append(Json::Int64{bounds.to});
    node[i] = pair;
  }
  return true;
}

bool ReadLocations(const Json::Value& json, std::vector<std::string>* locations) {
  if (!json.isArray() || json.empty() || json.size() > kMostLocations) return false;
  for (const Json::Value& text : json) {
    if (!text.isString()) return false;
    locations->push_back(text.asString());
  }
  return true;
}

// Whether it may stand between two "/" of a path.
bool IsEntryName(std::string_view name) {
  return !name.empty() && name.size() <= kMostNameBytes && name != "." && name != ".." &&
         name.find('/') == std::string_view::npos && name.find('\0') == std::string_view::npos;
}

bool IsFolderPath(std::string_view path) {
  if (path.size() > kMostPathBytes) return false;
  while (!path.empty()) {
    const size_t end = path.find('/');
    if (!IsEntryName(path.substr(0, end))) return false;
    if (end == std::string_view::npos) return true;
    path.remove_prefix(end + 1);
    if (path.empty()) return false;
  }
  return true;
}

// Takes a page's rows apart. Each part says false for what is not in order.
class RowsReader {
 public:
  explicit RowsReader(const Json::Value& page) : page_(page) {}

  bool Read(std::vector<FleetRow>* rows) {
    for (const char* list : {"users", "groups", "folders", "rows"}) {
      if (!page_[list].isArray()) return false;
    }
    if (page_["rows"].size() > kMostFleetRows) return false;
    for (const Json::Value& row : page_["rows"]) {
      if (!ReadRow(row, &rows->emplace_back())) return false;
    }
    return true;
  }

 private:
  bool ReadRow(const Json::Value& json, FleetRow* row) {
    if (!json.isArray() || json.size() != kRowParts || !json[1].isString()) return false;
    row->name = json[1].asString();
    const Json::Value* folder = Named("folders", json[0]);
    if (folder == nullptr || !folder->isArray() || folder->size() != 2 ||
        !(*folder)[0].isString() || !(*folder)[1].isString()) {
      return false;
    }
    row->share = (*folder)[0].asString();
    row->folder = (*folder)[1].asString();
    return IsEntryName(row->name) && IsEntryName(row->share) && IsFolderPath(row->folder) &&
           ReadOwner("users", json[3], &row->user) && ReadOwner("groups", json[4], &row->group) &&
           ReadNumbers(json, &row->attributes) && ReadNumber(json[kRowParts - 1], &row->number);
  }

  static bool ReadNumber(const Json::Value& json, std::uint32_t* number) {
    if (!json.isUInt()) return false;
    *number = json.asUInt();
    return true;
  }

  bool ReadOwner(const char* list, const Json::Value& place, std::string* name) {
    const Json::Value* text = Named(list, place);
    if (text == nullptr || !text->isString()) return false;
    *name = text->asString();
    return name->size() <= kMostNameBytes && name->find('\0') == std::string::npos;
  }

  static bool ReadNumbers(const Json::Value& json, FileAttributes* file) {
    if (!json[2].isUInt() || !json[5].isUInt64()) return false;
    file->mode = json[2].asUInt();
    file->size = json[5].asUInt64();
    if (file->size > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
      return false;
    }
    std::int64_t* const times[] = {&file->mtime, &file->atime, &file->ctime, &file->crtime};
    for (Json::ArrayIndex i = 0; i < std::size(times); ++i) {
      const Json::Value& time = json[6 + i];
      if (time.isInt64()) {
        *times[i] = time.asInt64();
      } else if (times[i] != &file->crtime || !time.isNull()) {
        return false;
      }
    }
    return true;
  }

  const Json::Value* Named(const char* list, const Json::Value& place) const {
    return place.isUInt() && place.asUInt() < page_[list].size() ? &page_[list][place.asUInt()]
                                                                 : nullptr;
  }

  const Json::Value& page_;
};

// False for what is no order.
bool ReadOrder(const Json::Value& json, FleetPageRequest* page) {
  const Json::Value& word = json[kSortBy];
  if (word.isNull()) return json[kBehind].isNull() && json[kDescending].isNull();
  const auto column = word.isString() ? ParseSortColumn(word.asString()) : std::nullopt;
  if (!column || !json[kDescending].isBool()) return false;
  page->column = *column;
  page->ascending = !json[kDescending].asBool();
  if (json[kBehind].isUInt()) page->behind = json[kBehind].asUInt();
  return json[kBehind].isUInt() || json[kBehind].isNull();
}

// What a name takes in JSON.
size_t TextBytes(std::string_view name) {
  constexpr size_t kEscapeBytes = 6;
  size_t bytes = 0;
  for (const char byte : name) {
    const bool plain = (byte < 0 || byte >= ' ') && byte != '"' && byte != '\\';
    bytes += plain ? 1 : kEscapeBytes;
  }
  return bytes;
}

std::string TextOf(const Json::Value& value) { return value.isString() ? value.asString() : ""; }

}  // namespace

Json::Value FleetPageRequestJson(const FleetPageRequest& page) {
  Json::Value json;
  json[kLimit] = page.limit;
  json[kWait] = page.wait_ms;
  json[kAfter] = Json::UInt64{page.after};
  for (const auto& known : kSortColumns) {
    if (known.column != page.column) continue;
    json[kSortBy] = std::string(known.word);
    json[kDescending] = !page.ascending;
  }
  if (page.behind) json[kBehind] = *page.behind;
  return json;
}

Result<FleetPageRequest> ReadFleetPageRequest(const Json::Value& json) {
  if (!json[kLimit].isUInt() || !json[kWait].isInt() || !json[kAfter].isUInt64()) return kIllegal;
  FleetPageRequest page;
  page.limit = json[kLimit].asUInt();
  page.wait_ms = json[kWait].asInt();
  page.after = json[kAfter].asUInt64();
  if (page.limit > kMostFleetRows || page.wait_ms < 0 || page.wait_ms > kMostFleetWaitMs ||
      !ReadOrder(json, &page)) {
    return kIllegal;
  }
  return page;
}

std::string FleetQuestionText(const FleetQuestion& question) {
  Json::Value json = FleetPageRequestJson(question.page);
  json[kProtocol] = kFleetProtocol;
  json[kQuery] = QueryToJson(question.query);
  NameAccounts(json[kQuery]);
  json[kContents] = question.contents;
  json[kRecursive] = question.recursive;
  for (const std::string& location : question.locations) json[kLocations].append(location);
  return JsonText(json, JsonBytes::kRaw);
}

Result<FleetQuestion> ReadFleetQuestion(const Json::Value& json) {
  FleetQuestion question;
  if (json[kProtocol] != kFleetProtocol || !json[kContents].isBool() ||
      !json[kRecursive].isBool() || !ReadLocations(json[kLocations], &question.locations)) {
    return kIllegal;
  }
  const auto page = ReadFleetPageRequest(json);
  if (!page) return page.error();
  Json::Value tree = json[kQuery];
  if (!NumberAccounts(tree)) return kIllegal;
  auto query = QueryFromJson(tree);
  if (!query) return query.error();
  question.query = std::move(*query);
  question.contents = json[kContents].asBool();
  question.recursive = json[kRecursive].asBool();
  question.page = *page;
  return question;
}

unsigned FleetPageWriter::Place(Json::Value& names, std::map<std::string, unsigned>& known,
                                const std::string& name) {
  const auto [place, added] = known.try_emplace(name, names.size());
  if (added) names.append(name);
  return place->second;
}

void FleetPageWriter::Add(const ResultRow& row, std::uint32_t number) {
  std::string folder(row.share_name);
  folder.append(1, '\0').append(row.folder);
  if (folders_.empty() || folder != last_folder_) {
    Json::Value& pair = folders_.append(Json::arrayValue);
    pair.append(std::string(row.share_name));
    pair.append(std::string(row.folder));
    bytes_ += TextBytes(folder);
    last_folder_ = std::move(folder);
  }
  const FileAttributes& file = *row.attributes;
  Json::Value& told = rows_.append(Json::arrayValue);
  told.append(folders_.size() - 1);
  told.append(std::string(row.name));
  told.append(file.mode);
  told.append(Place(users_, known_users_, accounts_.User(file.uid)));
  told.append(Place(groups_, known_groups_, accounts_.Group(file.gid)));
  told.append(Json::UInt64{file.size});
  for (const std::int64_t time : {file.mtime, file.atime, file.ctime}) {
    told.append(Json::Int64{time});
  }
  told.append(file.crtime == FileAttributes::kNoTime ? Json::Value()
                                                     : Json::Value(Json::Int64{file.crtime}));
  told.append(number);
  constexpr size_t kNumbersBytes = 100;
  bytes_ += TextBytes(row.name) + kNumbersBytes;
}

void FleetPageWriter::Finish(Json::Value* page) {
  (*page)["users"].swap(users_);
  (*page)["groups"].swap(groups_);
  (*page)["folders"].swap(folders_);
  (*page)["rows"].swap(rows_);
}

Result<FleetPage> ReadFleetPage(std::string_view text) {
  Json::Value json;
  if (!ParseJson(text, &json) || !json.isObject() || json[kProtocol] != kFleetProtocol ||
      !json["finished"].isBool() || !json["total"].isUInt64() || !json["next"].isUInt64() ||
      !json["error"].isInt()) {
    return kIllegal;
  }
  FleetPage page;
  page.version = TextOf(json["version"]);
  page.task = TextOf(json["task"]);
  page.index = TextOf(json["index"]);
  page.source = TextOf(json["source"]);
  page.finished = json["finished"].asBool();
  page.error = json["error"].asInt();
  page.total = json["total"].asUInt64();
  page.next = json["next"].asUInt64();
  if (!RowsReader(json).Read(&page.rows)) return kIllegal;
  return page;
}

}  // namespace nas
