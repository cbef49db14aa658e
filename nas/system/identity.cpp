#include "nas/system/identity.h"

#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <string_view>

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

// Whom this process has become last. Guard: single-threaded use, as identity.h demands.
std::optional<Account> g_self;

// Whether it still is: somebody else may have changed the process's ids since.
bool IsSelf(const std::string& user, const Ids& ids) {
  return g_self && g_self->name == user && ids.user[0] == g_self->uid &&
         ids.user[1] == g_self->uid &&
         (!HasRoot(ids) || (ids.group[0] == g_self->gid && ids.group[1] == g_self->gid));
}

// The group ids need no saved root: whoever regains user id 0 can set any group.
bool TakeIds(const Account& account) {
  if (seteuid(kRoot) != 0) return false;
  return initgroups(account.name.c_str(), account.gid) == 0 &&
         setresgid(account.gid, account.gid, account.gid) == 0 &&
         setresuid(account.uid, account.uid, kRoot) == 0;
}

[[noreturn]] void EndInstead() {
  constexpr std::string_view kWords =
      "arbory: ended, as this process cannot take its user's identity\n";
  (void)write(STDERR_FILENO, kWords.data(), kWords.size());
  std::abort();
}

// Returns to an identity the process had. Going on with another one would be worse than ending.
void Restore(const uid_t (&users)[3], const gid_t (&groups)[3], const std::vector<gid_t>& list) {
  if (seteuid(kRoot) != 0 || setgroups(list.size(), list.data()) != 0 ||
      setresgid(groups[0], groups[1], groups[2]) != 0 ||
      setresuid(users[0], users[1], users[2]) != 0) {
    EndInstead();
  }
}

}  // namespace

bool CanBeRoot() { return HasRoot(CurrentIds()); }

Result<Account> BecomeUser(const std::string& user) {
  const Ids ids = CurrentIds();
  if (IsSelf(user, ids)) return *g_self;
  Result<Account> account = FindAccount(user);
  if (!account) return account;
  if (!HasRoot(ids)) {
    if (ids.user[0] != account->uid || ids.user[1] != account->uid) return ErrnoError(EPERM, user);
  } else {
    const std::vector<gid_t> groups = CurrentGroups();
    g_self.reset();
    if (!TakeIds(*account)) {
      const Error cause = ErrnoError(user);
      // In a user namespace root may be unable to become anybody: then it stays what it was.
      if (seteuid(kRoot) == 0) Restore(ids.user, ids.group, groups);
      return cause;
    }
  }
  g_self = *account;
  return account;
}

Status CheckActsAs(const std::string& user) {
  if (IsSelf(user, CurrentIds())) return {};
  const Result<Account> account = FindAccount(user);
  if (!account) return account.error();
  return account->uid == geteuid() ? Status() : ErrnoError(EPERM, user);
}

const std::optional<Account>& ActingAccount() { return g_self; }

void GiveUpRoot() {
  const gid_t group = getegid();
  const uid_t user = geteuid();
  if (setresgid(group, group, group) != 0 || setresuid(user, user, user) != 0) EndInstead();
}

ScopedRoot::ScopedRoot() : user_(geteuid()), group_(getegid()) {
  if (user_ == kRoot || !CanBeRoot() || seteuid(kRoot) != 0) return;
  raised_ = true;
  if (setegid(0) != 0) EndInstead();
}

ScopedRoot::~ScopedRoot() {
  if (!raised_) return;
  const int saved = errno;
  if (setegid(group_) != 0 || seteuid(user_) != 0) EndInstead();
  errno = saved;
}

ScopedUmask::ScopedUmask(mode_t mask) : before_(umask(mask)) {}
ScopedUmask::~ScopedUmask() { umask(before_); }

}  // namespace nas

unsigned int WfmLibUmask() { return umask(nas::kFileManagerUmask); }

void WfmLibRestoreUmask(unsigned int mask) { umask(mask); }

int WfmLibUGIDSet(const char* /*session*/, const char* user) {
  const auto account = nas::BecomeUser(user == nullptr ? "" : user);
  if (account) return 0;
  nas::Report(account.error());
  return -1;
}
