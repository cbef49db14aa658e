#include "nas/base/accounts.h"

#include <grp.h>
#include <pwd.h>
#include <strings.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <iterator>
#include <vector>

#include "nas/base/utf8.h"

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
    int error;
    do {
      error = ask(record, buffer->data(), room, &found);
    } while (error == EINTR);  // returned, not set in errno
    if (found != nullptr) return {};
    if (error == ERANGE) continue;
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

template <typename Ask>
Result<Group> GroupOf(Ask ask) {
  group record;
  std::vector<char> buffer;
  const Status found = Lookup(ask, kErrorUnknownGroup, &record, &buffer);
  if (!found) return found.error();
  return Group{record.gr_name, record.gr_gid};
}

struct Known {
  const char* name = nullptr;  // null behind the last
  id_t id = 0;
};

// `next` gives one after the other.
template <typename Next>
std::vector<std::string> NamesLike(std::string_view beginning, size_t most, Next next) {
  constexpr std::chrono::milliseconds kMostTime{100};
  // As distributions have it.
  constexpr id_t kFirstPerson = 1000;
  constexpr id_t kNobody = 65534;
  const auto end = std::chrono::steady_clock::now() + kMostTime;
  std::vector<std::string> people;
  std::vector<std::string> others;
  for (Known one = next(); one.name != nullptr; one = next()) {
    if (strncasecmp(one.name, beginning.data(), beginning.size()) == 0) {
      const bool person = one.id >= kFirstPerson && one.id != kNobody;
      (person ? people : others).emplace_back(one.name);
    }
    if (people.size() >= most || std::chrono::steady_clock::now() > end) break;
  }
  std::ranges::sort(people);
  std::ranges::sort(others);
  std::ranges::move(others, std::back_inserter(people));
  people.erase(std::unique(people.begin(), people.end()), people.end());
  if (people.size() > most) people.resize(most);
  return people;
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

std::vector<std::string> UsersLike(std::string_view beginning, size_t most) {
  setpwent();
  auto names = NamesLike(beginning, most, [] {
    const passwd* record = getpwent();
    return record == nullptr ? Known{} : Known{record->pw_name, record->pw_uid};
  });
  endpwent();
  return names;
}

std::vector<std::string> GroupsLike(std::string_view beginning, size_t most) {
  setgrent();
  auto names = NamesLike(beginning, most, [] {
    const group* record = getgrent();
    return record == nullptr ? Known{} : Known{record->gr_name, record->gr_gid};
  });
  endgrent();
  return names;
}

Result<Group> FindGroup(const std::string& name) {
  return GroupOf([&](group* record, char* buffer, size_t room, group** found) {
    return getgrnam_r(name.c_str(), record, buffer, room, found);
  });
}

Result<Group> FindGroup(gid_t gid) {
  return GroupOf([&](group* record, char* buffer, size_t room, group** found) {
    return getgrgid_r(gid, record, buffer, room, found);
  });
}

std::string UserText(uid_t uid) {
  const auto account = FindAccount(uid);
  return account ? account->name : std::to_string(uid);
}

std::string GroupText(gid_t gid) {
  const auto found = FindGroup(gid);
  return found ? found->name : std::to_string(gid);
}

const std::string& AccountTexts::User(uid_t uid) {
  const auto [text, added] = users_.try_emplace(uid);
  if (added) text->second = UserText(uid);
  return text->second;
}

const std::string& AccountTexts::Group(gid_t gid) {
  const auto [text, added] = groups_.try_emplace(gid);
  if (added) text->second = GroupText(gid);
  return text->second;
}

void LoadNameService() {
  constexpr char kRoot[] = "root";
  if (geteuid() != 0) return;  // only root's calls look up groups, to become their user
  int count = 0;
  getpwnam(kRoot);
  getgrouplist(kRoot, 0, nullptr, &count);
}

}  // namespace nas
