#include "nas/system/accounts.h"

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "nas/base/error.h"
#include "nas/system/user_state.h"
#include "platform/system.h"

namespace nas {
namespace {

constexpr size_t kFirstRecordBytes = 1024;
// A group of a large directory service lists all its members; beyond this it is taken as broken.
constexpr size_t kMaxRecordBytes = size_t{16} << 20;

// The name service's reentrant calls want a buffer of unknown size: asks again with more room
// until the record fits. Returns null with errno and the last error set.
template <typename Record, typename Ask>
Record* Lookup(Ask ask, Record* record, std::vector<char>* buffer, PlatformError unknown) {
  for (size_t room = kFirstRecordBytes; room <= kMaxRecordBytes; room *= 2) {
    buffer->resize(room);
    Record* found = nullptr;
    const int error = ask(record, buffer->data(), room, &found);
    if (found != nullptr) return found;
    if (error == ERANGE) continue;
    if (error == EINTR) {
      room /= 2;
      continue;
    }
    // Several services report an unknown name as an error of their own.
    const bool absent =
        error == 0 || error == ENOENT || error == ESRCH || error == EBADF || error == EPERM;
    SetLastError(absent ? unknown : kErrorOther);
    errno = absent ? ENOENT : error;
    return nullptr;
  }
  SetLastError(kErrorOther);
  errno = ERANGE;
  return nullptr;
}

template <typename Ask>
std::optional<Account> AccountOf(Ask ask) {
  passwd record;
  std::vector<char> buffer;
  const passwd* found = Lookup(ask, &record, &buffer, kErrorUnknownUser);
  if (found == nullptr) return std::nullopt;
  return Account{found->pw_name, found->pw_uid, found->pw_gid, found->pw_dir};
}

template <typename Record>
Record* Allocate() {
  auto* record = static_cast<Record*>(std::calloc(1, sizeof(Record)));
  if (record == nullptr) SetLastError(kErrorOther);
  return record;
}

}  // namespace

std::optional<Account> FindAccount(const std::string& name) {
  if (!IsUserName(name)) {
    SetLastError(kErrorUnknownUser);
    errno = ENOENT;
    return std::nullopt;
  }
  return AccountOf([&](passwd* record, char* buffer, size_t room, passwd** found) {
    return getpwnam_r(name.c_str(), record, buffer, room, found);
  });
}

std::optional<Account> FindAccount(uid_t uid) {
  return AccountOf([&](passwd* record, char* buffer, size_t room, passwd** found) {
    return getpwuid_r(uid, record, buffer, room, found);
  });
}

void LoadNameService() {
  constexpr char kRoot[] = "root";
  if (geteuid() != 0) return;  // only root's calls look up groups, to become their user
  int count = 0;
  getpwnam(kRoot);
  getgrouplist(kRoot, 0, nullptr, &count);
}

}  // namespace nas

int NUVAUserGet(const char* name, NUVAUSER** out) {
  if (out == nullptr) return -1;
  *out = nullptr;
  const auto account = nas::FindAccount(std::string(name == nullptr ? "" : name));
  if (!account) return -1;
  auto* user = nas::Allocate<NUVAUSER>();
  if (user == nullptr) return -1;
  user->szName = strdup(account->name.c_str());
  user->szHome = strdup(account->home.c_str());
  user->nUid = account->uid;
  user->nGid = account->gid;
  if (user->szName == nullptr || user->szHome == nullptr) {
    NUVAUserFree(user);
    nas::SetLastError(nas::kErrorOther);
    return -1;
  }
  *out = user;
  return 0;
}

void NUVAUserFree(NUVAUSER* user) {
  if (user == nullptr) return;
  std::free(user->szName);
  std::free(user->szHome);
  std::free(user);
}

int NUVAGroupGet(const char* name, NUVAGROUP** out) {
  if (out == nullptr) return -1;
  *out = nullptr;
  struct group record;
  std::vector<char> buffer;
  const auto ask = [&](struct group* entry, char* bytes, size_t room, struct group** found) {
    return getgrnam_r(name == nullptr ? "" : name, entry, bytes, room, found);
  };
  const struct group* found = nas::Lookup(ask, &record, &buffer, nas::kErrorUnknownGroup);
  if (found == nullptr) return -1;
  auto* result = nas::Allocate<NUVAGROUP>();
  if (result == nullptr) return -1;
  result->szName = strdup(found->gr_name);
  result->nGid = found->gr_gid;
  if (result->szName == nullptr) {
    NUVAGroupFree(result);
    nas::SetLastError(nas::kErrorOther);
    return -1;
  }
  *out = result;
  return 0;
}

void NUVAGroupFree(NUVAGROUP* group) {
  if (group == nullptr) return;
  std::free(group->szName);
  std::free(group);
}
