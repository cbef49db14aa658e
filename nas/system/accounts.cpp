#include "nas/system/accounts.h"

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "nas/base/utf8.h"
#include "platform/system.h"

namespace nas {
namespace {

constexpr size_t kFirstRecordBytes = 1024;
// A group of a large directory service lists all its members; beyond this it is taken as broken.
constexpr size_t kMaxRecordBytes = size_t{16} << 20;

constexpr size_t kMaxUserNameBytes = 255;  // it names a folder

// The name service's reentrant calls want a buffer of unknown size: asks again with more room
// until the record fits. `record` then points into `buffer`.
template <typename Record, typename Ask>
Status Lookup(Ask ask, PlatformError unknown, Record* record, std::vector<char>* buffer) {
  for (size_t room = kFirstRecordBytes; room <= kMaxRecordBytes; room *= 2) {
    buffer->resize(room);
    Record* found = nullptr;
    const int error = ask(record, buffer->data(), room, &found);
    if (found != nullptr) return {};
    if (error == ERANGE) continue;
    if (error == EINTR) {
      room /= 2;
      continue;
    }
    // Several services report an unknown name as an error of their own.
    const bool absent =
        error == 0 || error == ENOENT || error == ESRCH || error == EBADF || error == EPERM;
    return absent ? Error{unknown, ENOENT} : Error{kErrorOther, error};
  }
  return Error{kErrorOther, ERANGE};
}

template <typename Ask>
Result<Account> AccountOf(Ask ask) {
  passwd record;
  std::vector<char> buffer;
  const Status found = Lookup(ask, kErrorUnknownUser, &record, &buffer);
  if (!found) return found.error();
  return Account{record.pw_name, record.pw_uid, record.pw_gid, record.pw_dir};
}

int ReportFailure(const Error& error) {
  Report(error);
  return -1;
}

}  // namespace

bool IsUserName(const std::string& name) {
  if (name.empty() || name == "." || name == ".." || name.size() > kMaxUserNameBytes) return false;
  return std::none_of(name.begin(), name.end(),
                      [](unsigned char byte) { return byte == '/' || IsControl(byte); });
}

Result<Account> FindAccount(const std::string& name) {
  if (!IsUserName(name)) return Error{kErrorUnknownUser, ENOENT, name};
  return AccountOf([&](passwd* record, char* buffer, size_t room, passwd** found) {
    return getpwnam_r(name.c_str(), record, buffer, room, found);
  });
}

Result<Account> FindAccount(uid_t uid) {
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
  if (!account) return nas::ReportFailure(account.error());
  auto* user = static_cast<NUVAUSER*>(std::calloc(1, sizeof(NUVAUSER)));
  if (user == nullptr) return nas::ReportFailure(nas::ErrnoError());
  user->szName = strdup(account->name.c_str());
  user->szHome = strdup(account->home.c_str());
  user->nUid = account->uid;
  user->nGid = account->gid;
  if (user->szName == nullptr || user->szHome == nullptr) {
    NUVAUserFree(user);
    return nas::ReportFailure(nas::ErrnoError(ENOMEM, {}));
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
  const nas::Status found = nas::Lookup(ask, nas::kErrorUnknownGroup, &record, &buffer);
  if (!found) return nas::ReportFailure(found.error());
  auto* result = static_cast<NUVAGROUP*>(std::calloc(1, sizeof(NUVAGROUP)));
  if (result == nullptr) return nas::ReportFailure(nas::ErrnoError());
  result->szName = strdup(record.gr_name);
  result->nGid = record.gr_gid;
  if (result->szName == nullptr) {
    NUVAGroupFree(result);
    return nas::ReportFailure(nas::ErrnoError(ENOMEM, {}));
  }
  *out = result;
  return 0;
}

void NUVAGroupFree(NUVAGROUP* group) {
  if (group == nullptr) return;
  std::free(group->szName);
  std::free(group);
}
