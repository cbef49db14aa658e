#pragma once
// Users and groups of the machine, through its name service. Any thread may call; nothing is
// remembered here, since a server lives longer than an answer stays true. A directory on the
// network can take seconds to answer.

#include <sys/types.h>

#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "nas/base/error.h"

namespace nas {

struct Account {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;
  std::string home;  // the login's home directory, not the home share's
};

// Whether `name` can be a user's: not empty, not "." or "..", no "/", control character, at most
// 255 bytes. Such a name can name a folder.
bool IsUserName(const std::string& name);

// kErrorUnknownUser with ENOENT when there is no such user; kErrorOther when the name service
// fails.
Result<Account> FindAccount(const std::string& name);
Result<Account> FindAccount(uid_t uid);

struct Group {
  std::string name;
  gid_t gid = 0;
};

// The same of groups, with kErrorUnknownGroup.
Result<Group> FindGroup(const std::string& name);
Result<Group> FindGroup(gid_t gid);

// Names that begin with these letters, in any letter case, sorted: at most `most`, those of people
// first. Looks only so long as a person who types can wait, so a large directory is known in part,
// and not at all where it lists nobody. For one thread.
std::vector<std::string> UsersLike(std::string_view beginning, size_t most);
std::vector<std::string> GroupsLike(std::string_view beginning, size_t most);

// For showing: the name, or the number where the machine knows none for it.
std::string UserText(uid_t uid);
std::string GroupText(gid_t gid);

// The same of one list of files, where few accounts own many: each is asked for once. For one
// thread.
class AccountTexts {
 public:
  const std::string& User(uid_t uid);
  const std::string& Group(gid_t gid);
  // Says what a number stands for, of a user and of a group, that is none of this machine's.
  void Know(std::uint32_t id, const std::string& name) { users_[id] = groups_[id] = name; }

 private:
  std::map<uid_t, std::string> users_;
  std::map<gid_t, std::string> groups_;
};

// For a process that makes calls: their children would each load the libraries of the name service
// anew, which is a third of what a short call takes; what this process has loaded they inherit.
void LoadNameService();

}  // namespace nas
