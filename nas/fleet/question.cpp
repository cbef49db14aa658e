#include "nas/fleet/question.h"

#include <cerrno>
#include <optional>
#include <set>
#include <tuple>
#include <utility>

#include "nas/base/json_pull.h"
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

// Takes a page apart. Its lists may stand behind the rows that name places in them, so what a row
// says is looked up last. Each part says false for what is not in order.
class PageReader {
 public:
  explicit PageReader(std::string_view text) : text_(std::string(text)) {}

  bool Read(FleetPage* page) {
    const auto member = [this, page](const std::string& name) { return TakeMember(name, page); };
    if (!text_.TakeObject(member) || !text_.AtEnd() || seen_.size() != kNeeded) return false;
    for (size_t i = 0; i < page->rows.size(); ++i) {
      if (!LookUp(places_[i], &page->rows[i])) return false;
    }
    return true;
  }

 private:
  // In a page's lists.
  struct Places {
    size_t folder = 0;
    size_t user = 0;
    size_t group = 0;
  };
  static constexpr size_t kNeeded = 9;  // members, of those that TakeNeeded takes

  bool TakeMember(const std::string& name, FleetPage* page) {
    if (name == "version") return text_.TakeString(&page->version);
    if (name == "task") return text_.TakeString(&page->task);
    if (name == "index") return text_.TakeString(&page->index);
    if (name == "source") return text_.TakeString(&page->source);
    const auto taken = TakeNeeded(name, page);
    if (!taken) return text_.Skip();  // of a later version
    return *taken && seen_.insert(name).second;
  }

  // Nothing for a name that is not known.
  std::optional<bool> TakeNeeded(const std::string& name, FleetPage* page) {
    int protocol = 0;
    if (name == kProtocol) return text_.TakeNumber(&protocol) && protocol == kFleetProtocol;
    if (name == "finished") return text_.TakeBool(&page->finished);
    if (name == "error") return text_.TakeNumber(&page->error);
    if (name == "total") return text_.TakeNumber(&page->total);
    if (name == "next") return text_.TakeNumber(&page->next);
    if (name == "users") return TakeNames(&users_);
    if (name == "groups") return TakeNames(&groups_);
    if (name == "folders") return text_.TakeArray([this] { return TakeFolder(); });
    if (name == "rows") return text_.TakeArray([this, page] { return TakeRow(&page->rows); });
    return std::nullopt;
  }

  bool TakeNames(std::vector<std::string>* names) {
    return text_.TakeArray([&] { return text_.TakeString(&names->emplace_back()); });
  }

  bool TakeFolder() {
    auto& [share, path] = folders_.emplace_back();
    return text_.EnterArray() && text_.TakeString(&share) && text_.TakeString(&path) &&
           text_.LeaveArray() && IsEntryName(share) && IsFolderPath(path);
  }

  bool TakeRow(std::vector<FleetRow>* rows) {
    if (rows->size() == kMostFleetRows) return false;
    FleetRow& row = rows->emplace_back();
    Places& places = places_.emplace_back();
    FileAttributes& file = row.attributes;
    const bool taken = text_.EnterArray() && text_.TakeNumber(&places.folder) &&
                       text_.TakeString(&row.name) && text_.TakeNumber(&file.mode) &&
                       text_.TakeNumber(&places.user) && text_.TakeNumber(&places.group) &&
                       text_.TakeNumber(&file.size) && text_.TakeNumber(&file.mtime) &&
                       text_.TakeNumber(&file.atime) && text_.TakeNumber(&file.ctime) &&
                       (text_.TakeNull() || text_.TakeNumber(&file.crtime)) &&
                       text_.TakeNumber(&row.number) && text_.LeaveArray();
    return taken && IsEntryName(row.name) && std::in_range<std::int64_t>(file.size);
  }

  bool LookUp(const Places& places, FleetRow* row) const {
    if (places.folder >= folders_.size()) return false;
    std::tie(row->share, row->folder) = folders_[places.folder];
    return LookUp(users_, places.user, &row->user) && LookUp(groups_, places.group, &row->group);
  }

  static bool LookUp(const std::vector<std::string>& names, size_t place, std::string* name) {
    if (place >= names.size()) return false;
    *name = names[place];
    return name->size() <= kMostNameBytes && name->find('\0') == std::string::npos;
  }

  JsonPull text_;
  std::set<std::string> seen_;
  std::vector<std::string> users_;
  std::vector<std::string> groups_;
  std::vector<std::pair<std::string, std::string>> folders_;
  std::vector<Places> places_;  // of each row
};

// Whatever else it may hold.
bool IsOfAnotherProtocol(std::string_view text) {
  JsonPull pull{std::string(text)};
  int protocol = kFleetProtocol;
  const auto member = [&](const std::string& name) {
    return name == kProtocol ? pull.TakeNumber(&protocol) : pull.Skip();
  };
  return pull.TakeObject(member) && protocol != kFleetProtocol;
}

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
  FleetPage page;
  if (PageReader(text).Read(&page)) return page;
  return IsOfAnotherProtocol(text) ? Error{kErrorIllegal, EPROTONOSUPPORT} : kIllegal;
}

}  // namespace nas
