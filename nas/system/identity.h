#pragma once
// Who the process is. A process that started as root keeps root as its saved user id only: its
// real and effective ids are the user's, so that access(2) and kill(2) judge it as the user and no
// process id read from a user's record can reach a process of somebody else.
//
// All of these change the whole process, its threads included. Use them before threads start.

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

#include "nas/base/accounts.h"
#include "nas/base/error.h"

namespace nas {

// Whether the process is root or could become root again.
bool CanBeRoot();

// Makes the process `user`'s, with the user's groups; root stays its saved user id where it had it.
// Only root's processes can become anybody; others are told EPERM unless they are that user
// already. Fails with the identity unchanged: kErrorUnknownUser, or what the system said. The
// process and its forks remember whom they have become, so that asking again costs no look-up.
Result<Account> BecomeUser(const std::string& user);
// EPERM unless the process acts as `user` now; kErrorUnknownUser when there is none.
Status CheckActsAs(const std::string& user);

// Whom BecomeUser has made the process, as it was found then; nobody yet without a value.
const std::optional<Account>& ActingAccount();

// Gives up for good the root that the process could go back to. For whoever is about to read what
// the user can write, once no folder is left to be made. A process that cannot says so and
// aborts; one whose user is root stays root.
void GiveUpRoot();

// Root for the time of a few system calls, then the identity before it. Does nothing where root
// was never there. A process that cannot step down again aborts.
class ScopedRoot {
 public:
  ScopedRoot();
  ~ScopedRoot();
  ScopedRoot(const ScopedRoot&) = delete;
  ScopedRoot& operator=(const ScopedRoot&) = delete;

 private:
  uid_t user_;
  gid_t group_;
  bool raised_ = false;
};

// Sets the umask for a time, where the exact mode of what is made matters.
class ScopedUmask {
 public:
  explicit ScopedUmask(mode_t mask);
  ~ScopedUmask();
  ScopedUmask(const ScopedUmask&) = delete;
  ScopedUmask& operator=(const ScopedUmask&) = delete;

 private:
  mode_t before_;
};

}  // namespace nas
