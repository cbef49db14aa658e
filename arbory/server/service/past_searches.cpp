#include "arbory/server/service/past_searches.h"

#include <fcntl.h>

#include <algorithm>
#include <ctime>
#include <vector>

#include "arbory/server/service/user_calls.h"
#include "arbory/server/transport/http.h"
#include "nas/base/file_io.h"
#include "nas/base/file_lock.h"
#include "nas/base/json_text.h"
#include "nas/base/system_call.h"
#include "nas/base/unique_fd.h"

namespace arbory {
namespace {

constexpr char kFile[] = "/page_searches.json";
constexpr char kLock[] = "/page_searches.lock";
// As many as somebody looks through; pins have a number of their own, so that neither kind
// displaces the other.
constexpr std::ptrdiff_t kMostSearches = 100;
constexpr std::ptrdiff_t kMostPinned = 50;
constexpr size_t kMostSearchBytes = 4096;
constexpr size_t kMostNameBytes = 200;
constexpr size_t kMostFileBytes = size_t{2} << 20;  // several times all that is kept
constexpr mode_t kMode = 0600;

struct Past {
  std::int64_t at = 0;
  std::string search;
  std::string name;  // empty: not pinned
};
using List = std::vector<Past>;

List ReadList(const std::string& path) {
  List list;
  const auto text = nas::ReadWholeFile(AT_FDCWD, path, kMostFileBytes);
  Json::Value stored;
  if (!text || !nas::ParseJson(*text, &stored) || !stored.isObject()) return list;
  const Json::Value& searches = stored["searches"];
  if (!searches.isArray()) return list;
  for (const Json::Value& one : searches) {
    if (!one.isObject() || !one["search"].isString()) continue;
    list.push_back({one["at"].isInt64() ? one["at"].asInt64() : 0, one["search"].asString(),
                    one["name"].isString() ? one["name"].asString() : ""});
  }
  return list;
}

Json::Value ListJson(const List& list) {
  Json::Value body;
  Json::Value& searches = body["searches"] = Json::Value(Json::arrayValue);
  for (const Past& past : list) {
    Json::Value& one = searches.append(Json::Value());
    one["at"] = Json::Int64{past.at};
    one["search"] = past.search;
    if (!past.name.empty()) one["name"] = past.name;
  }
  return body;
}

bool IsPinned(const Past& past) { return !past.name.empty(); }

// The oldest go that are not pinned.
void Trim(List* list) {
  std::ptrdiff_t kept = 0;
  std::erase_if(*list, [&](const Past& past) { return !IsPinned(past) && ++kept > kMostSearches; });
}

struct Change {
  enum class Kind { kNone, kAdd, kPin, kRemove, kClear } kind = Kind::kNone;
  std::string search;
  std::string name;
};

// Throws Json::Exception for a text that is none.
Change ReadChange(const NUVA::APIRequest& request) {
  static constexpr std::pair<const char*, Change::Kind> kKinds[] = {
      {"add", Change::Kind::kAdd}, {"pin", Change::Kind::kPin}, {"remove", Change::Kind::kRemove}};
  for (const auto& [word, kind] : kKinds) {
    if (!request.HasParam(word)) continue;
    return {kind, request.GetParam(word, "").asString(), request.GetParam("name", "").asString()};
  }
  const bool clears = request.GetParam("clear", false).asBool();
  return {clears ? Change::Kind::kClear : Change::Kind::kNone, "", ""};
}

// A sentence where the change cannot be made.
const char* Apply(const Change& change, List* list) {
  using Kind = Change::Kind;
  if (change.search.size() > kMostSearchBytes) return "This search is too long to be kept.";
  if (change.name.size() > kMostNameBytes) return "Choose a shorter name.";
  if (change.kind == Kind::kClear) {
    std::erase_if(*list, [](const Past& past) { return !IsPinned(past); });
    return nullptr;
  }
  const auto found = std::find_if(list->begin(), list->end(),
                                  [&](const Past& past) { return past.search == change.search; });
  const bool is_new = found == list->end();
  Past past = is_new ? Past{std::time(nullptr), change.search, ""} : *found;
  if (change.kind == Kind::kPin) {
    const bool more = !IsPinned(past) && !change.name.empty();
    if (more && std::count_if(list->begin(), list->end(), IsPinned) >= kMostPinned) {
      return "There are too many pinned searches; remove one first.";
    }
    past.name = change.name;
    if (!is_new)
      *found = past;
    else
      list->insert(list->begin(), past);
    Trim(list);
    return nullptr;
  }
  if (!is_new) list->erase(found);
  if (change.kind == Kind::kRemove) return nullptr;
  past.at = std::time(nullptr);
  list->insert(list->begin(), past);
  Trim(list);
  return nullptr;
}

void Answer(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  const std::string path = request->GetPreferenceDir() + kFile;
  const Change change = ReadChange(*request);
  if (change.kind == Change::Kind::kNone) return response->SetError(kOk, ListJson(ReadList(path)));

  const nas::UniqueFd lock(
      open((request->GetPreferenceDir() + kLock).c_str(), O_RDWR | O_CREAT | O_CLOEXEC, kMode));
  struct flock whole = nas::WriteLockOn(0);
  const bool locked =
      lock && nas::Uninterrupted([&] { return fcntl(lock.get(), F_OFD_SETLKW, &whole); }) == 0;
  List list = ReadList(path);
  if (const char* sentence = Apply(change, &list)) {
    return response->SetError(kBadRequest, OwnError(kBadRequest, sentence));
  }
  const Json::Value body = ListJson(list);
  const std::string text = nas::JsonText(body, nas::JsonBytes::kRaw);
  if (!locked || !nas::ReplaceFile(AT_FDCWD, path, text, kMode, nas::Durability::kAtomic)) {
    return response->SetError(kUnavailable,
                              OwnError(kUnavailable, "The list of searches cannot be written."));
  }
  response->SetError(kOk, body);
}

void PastSearchesEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) try {
  if (BecomeCaller(request, response)) Answer(request, response);
} catch (const Json::Exception&) {
  response->SetError(kBadRequest, OwnError(kBadRequest, kWrongType));
}

}  // namespace

nas::Child StartPastSearches(const nas::ApiCall& call) { return StartOwn(PastSearchesEntry, call); }

}  // namespace arbory
