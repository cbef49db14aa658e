#include "nas/system/identity.h"

#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>

#include "nas/base/error.h"
#include "nas/system/accounts.h"
#include "platform/webfm.h"

namespace nas {
namespace {

constexpr mode_t kFileManagerUmask = 077;
constexpr uid_t kRoot = 0;

struct Ids {
  uid_t user[3];
  gid_t group[3];
};

Ids CurrentIds() {
  Ids ids;
  getresuid(&ids.user[0], &ids.user[1], &ids.user[2]);
  getresgid(&ids.group[0], &ids.group[1], &ids.group[2]);
  return ids;
}

bool HasRoot(const Ids& ids) {
  return std::any_of(std::begin(ids.user), std::end(ids.user),
                     [](uid_t id) { return id == kRoot; });
}

int Fail(PlatformError error, int error_number) {
  SetLastError(error);
  errno = error_number;
  return -1;
}

std::vector<gid_t> CurrentGroups() {
  for (;;) {
    const int count = getgroups(0, nullptr);
    if (count <= 0) return {};
    std::vector<gid_t> groups(static_cast<size_t>(count));
    const int got = getgroups(count, groups.data());
    if (got < 0) continue;  // grew in between
    groups.resize(static_cast<size_t>(got));
    return groups;
  }
}

// The user whose groups this process was given last, so that a second switch to the same user
// costs no look-up of groups. Guard: single-threaded use, as identity.h demands.
std::string g_switched_to;

bool IsAlready(const Account& account, const Ids& ids) {
  return g_switched_to == account.name && ids.user[0] == account.uid &&
         ids.user[1] == account.uid && ids.group[0] == account.gid && ids.group[1] == account.gid;
}

// The group ids need no saved root: whoever regains user id 0 can set any group.
bool Become(const Account& account) {
  if (seteuid(kRoot) != 0) return false;
  return initgroups(account.name.c_str(), account.gid) == 0 &&
         setresgid(account.gid, account.gid, account.gid) == 0 &&
         setresuid(account.uid, account.uid, kRoot) == 0;
}

// Returns to an identity the process had. Going on with another one would be worse than ending.
void Restore(const uid_t (&users)[3], const gid_t (&groups)[3], const std::vector<gid_t>& list) {
  if (seteuid(kRoot) != 0 || setgroups(list.size(), list.data()) != 0 ||
      setresgid(groups[0], groups[1], groups[2]) != 0 ||
      setresuid(users[0], users[1], users[2]) != 0) {
    std::abort();
  }
}

}  // namespace

bool CanBeRoot() { return HasRoot(CurrentIds()); }

ScopedRoot::ScopedRoot() : user_(geteuid()), group_(getegid()) {
  if (user_ == kRoot || !CanBeRoot() || seteuid(kRoot) != 0) return;
  raised_ = true;
  if (setegid(0) != 0) std::abort();
}

ScopedRoot::~ScopedRoot() {
  if (!raised_) return;
  const int saved = errno;
  if (setegid(group_) != 0 || seteuid(user_) != 0) std::abort();
  errno = saved;
}

ScopedUser::ScopedUser(const std::string& user) {
  const Ids ids = CurrentIds();
  std::copy(std::begin(ids.user), std::end(ids.user), users_);
  std::copy(std::begin(ids.group), std::end(ids.group), group_ids_);
  groups_ = CurrentGroups();
  ok_ = WfmLibUGIDSet(nullptr, user.c_str()) == 0;
}

ScopedUser::~ScopedUser() {
  if (!ok_ || !CanBeRoot()) return;
  const int saved = errno;
  Restore(users_, group_ids_, groups_);
  g_switched_to.clear();
  errno = saved;
}

ScopedUmask::ScopedUmask(mode_t mask) : before_(umask(mask)) {}
ScopedUmask::~ScopedUmask() { umask(before_); }

}  // namespace nas

unsigned int WfmLibUmask() { return umask(nas::kFileManagerUmask); }

void WfmLibRestoreUmask(unsigned int mask) { umask(mask); }

int WfmLibUGIDSet(const char* /*session*/, const char* user) {
  using namespace nas;
  if (user == nullptr) return Fail(kErrorUnknownUser, ENOENT);
  const std::optional<Account> account = FindAccount(user);
  if (!account) return -1;
  const Ids ids = CurrentIds();
  if (!HasRoot(ids)) {
    const bool own = ids.user[0] == account->uid && ids.user[1] == account->uid;
    return own ? 0 : Fail(kErrorPermission, EPERM);
  }
  if (IsAlready(*account, ids)) return 0;
  const std::vector<gid_t> groups = CurrentGroups();
  g_switched_to.clear();
  if (!Become(*account)) {
    const int cause = errno;
    // In a user namespace root may be unable to become anybody: then it stays what it was.
    if (seteuid(kRoot) == 0) Restore(ids.user, ids.group, groups);
    return Fail(ErrorFromErrno(cause), cause);
  }
  g_switched_to = account->name;
  return 0;
}
