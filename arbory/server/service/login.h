#pragma once
// Checking of a password against the machine's own accounts, by PAM, in a child: a module may wait
// for a directory server, start programs or leave things in the process.

#include <string>

#include "arbory/server/transport/http.h"

namespace arbory {

struct Credentials {
  std::string user;
  std::string password;
};

struct PamService {
  std::string name;
  std::string folder;  // of its file; empty: the system's
};

// Forks the child; the pid is -1 when that fails. Its reply has status 200 and the field
// kLoginUser, the account's name encoded, when PAM lets the user in, and 403 when it does not, for
// whatever reason: the log says why.
nas::Child StartLogin(const Credentials& credentials, const PamService& service);
inline constexpr char kLoginUser[] = "User";

}  // namespace arbory
