#pragma once
// Users of the machine, through its name service.

#include <sys/types.h>

#include <optional>
#include <string>

namespace nas {

struct Account {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;
  std::string home;  // the login's home directory, not the home share's
};

// Nothing with errno (ENOENT when there is no such user) and the last error set.
std::optional<Account> FindAccount(const std::string& name);
std::optional<Account> FindAccount(uid_t uid);

// For a process that makes calls: their children would each load the libraries of the name service
// anew, which is a third of what a short call takes; what this process has loaded they inherit.
void LoadNameService();

}  // namespace nas
