#include "arbory/server/service/fronts.h"

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <vector>

#include "arbory/server/transport/http_text.h"
#include "nas/base/accounts.h"
#include "nas/base/file_lock.h"
#include "nas/base/json_text.h"
#include "nas/base/unique_fd.h"
#include "nas/fleet/library.h"
#include "nas/fleet/token.h"
#include "nas/system/identity.h"

namespace arbory {
namespace {

constexpr std::string_view kScheme = "Arbory-Fleet ";
constexpr char kRetrySeconds[] = "1";
constexpr char kNoAccount[] = "There is no account here for which this front may ask.";
constexpr int kFirstGroups = 64;

const nas::FrontSetting* FrontNamed(const nas::BoxSettings& box, const std::string& name) {
  const auto found = std::ranges::find(box.fronts, name, &nas::FrontSetting::name);
  return found == box.fronts.end() ? nullptr : &*found;
}

HttpReply Refused(const char* why, std::time_t now, const char* sentence) {
  Json::Value body;
  body["code"] = kUnauthorized;
  body["why"] = why;
  body["now"] = Json::Int64{now};
  body["error"] = sentence;
  return JsonReply(kUnauthorized, nas::JsonText(body, nas::JsonBytes::kClean));
}

HttpReply BadToken(std::time_t now) {
  return Refused("token", now, "This is no token for this request.");
}

// "ann" of "ann@OFFICE"; nothing where the realm is another.
std::optional<std::string> NameIn(const std::string& realm, const std::string& user) {
  if (realm.empty()) return user;
  const std::string end = "@" + realm;
  if (user.size() <= end.size() || !user.ends_with(end)) return std::nullopt;
  return user.substr(0, user.size() - end.size());
}

bool IsInOneOf(const std::vector<std::string>& groups, const nas::Account& account) {
  if (groups.empty()) return false;
  std::vector<gid_t> its(kFirstGroups);
  auto count = static_cast<int>(its.size());
  while (getgrouplist(account.name.c_str(), account.gid, its.data(), &count) < 0) {
    its.resize(std::max<size_t>(2 * its.size(), static_cast<size_t>(count)));
    count = static_cast<int>(its.size());
  }
  its.resize(static_cast<size_t>(count));
  return std::ranges::any_of(groups, [&](const std::string& name) {
    const auto group = nas::FindGroup(name);
    return group && std::ranges::find(its, group->gid) != its.end();
  });
}

nas::Reply NoAccount() { return AsChildsReply(ErrorReply(kForbidden, kNoAccount)); }

// Held open for good, as the lock is this process's and its worker's.
nas::Result<bool> TakePlace(const nas::FrontSetting& front) {
  const std::string folder = nas::CurrentConfig().state_dir + "/fleet";
  const nas::ScopedRoot root;  // the places are the machine's, not the user's
  if (mkdir(folder.c_str(), S_IRWXU) != 0 && errno != EEXIST) return nas::ErrnoError(folder);
  const std::string path = folder + "/" + front.name;
  nas::UniqueFd places(
      open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
  if (!places) return nas::ErrnoError(path);
  for (int byte = 0; byte < front.searches; ++byte) {
    struct flock lock = nas::WriteLockOn(byte);
    if (fcntl(places.get(), F_OFD_SETLK, &lock) != 0) continue;
    (void)places.Release();
    return true;
  }
  return false;
}

}  // namespace

Fronts::Fronts(const nas::BoxSettings& box) : box_(box) {
  if (!box_.fronts.empty()) nas::LoadFleetLibrary();
}

std::optional<HttpReply> Fronts::LetIn(HttpRequest* request, std::time_t now) {
  if (box_.fronts.empty()) return ErrorReply(kNotFound, "This machine is asked by no front.");
  const std::string* field = request->Field("authorization");
  if (field == nullptr || !field->starts_with(kScheme)) return BadToken(now);
  const auto token = nas::ReadToken(std::string_view(*field).substr(kScheme.size()));
  if (!token || token->said.box != box_.name) return BadToken(now);
  const nas::FrontSetting* front = FrontNamed(box_, token->said.front);
  const auto key = front == nullptr ? std::nullopt : nas::FromHex(front->key);
  if (!key || !nas::IsGenuine(*token, *key)) return BadToken(now);
  // From here on the front itself has said so.
  if (token->said.issued < now - nas::kTokenSeconds ||
      token->said.issued > now + nas::kTokenFutureSeconds) {
    return Refused("clock", now, "The token is too old, or of a time that has not come.");
  }
  if (nas::RequestHash(request->method, request->target, request->body) != token->said.hash) {
    return BadToken(now);
  }
  bool full = false;
  if (!UseOnce(front->name, token->said.nonce, token->said.issued, now, &full)) {
    if (!full) return BadToken(now);
    return BusyReply(kUnavailable, "This front asks too often; try again.", kRetrySeconds);
  }
  const auto name = NameIn(front->realm, token->said.user);
  if (!name) return ErrorReply(kForbidden, kNoAccount);
  request->user = *name;
  request->front = front->name;
  return std::nullopt;
}

bool Fronts::UseOnce(const std::string& front, const std::string& nonce, std::time_t issued,
                     std::time_t now, bool* full) {
  Used& used = used_[front];
  if (used.swept != now) {
    std::erase_if(used.by_nonce,
                  [now](const auto& use) { return use.second < now - nas::kTokenSeconds; });
    used.swept = now;
  }
  *full = used.by_nonce.size() >= kMostUsed;
  return !*full && used.by_nonce.emplace(nonce, issued).second;
}

std::optional<nas::Reply> Admit(const std::string& front, const std::string& user) {
  const nas::BoxSettings& box = nas::CurrentConfig().box;
  const nas::FrontSetting* setting = FrontNamed(box, front);
  const auto account = nas::FindAccount(user);
  if (setting == nullptr || !account) return NoAccount();
  const bool system = account->uid == 0 || account->uid < static_cast<uid_t>(box.lowest_uid);
  // Names that the name service takes for the same would pass by a list of users.
  if (system || account->name != user) return NoAccount();
  // A box that is one user's speaks for nobody else.
  if (!nas::CanBeRoot() && account->uid != geteuid()) return NoAccount();
  const bool named = std::ranges::find(setting->users, user) != setting->users.end();
  return named || IsInOneOf(setting->groups, *account) ? std::nullopt : std::optional(NoAccount());
}

std::optional<HttpReply> TakeSearchPlace(const std::string& front) {
  const nas::FrontSetting* setting = FrontNamed(nas::CurrentConfig().box, front);
  if (setting == nullptr) return ErrorReply(kForbidden, kNoAccount);
  const auto place = TakePlace(*setting);
  if (place && *place) return std::nullopt;
  if (!place) syslog(LOG_ERR, "fleet: %s", place.error().Text().c_str());
  return BusyReply(kUnavailable, "This front has as many searches as it may; try again.",
                   kRetrySeconds);
}

}  // namespace arbory
