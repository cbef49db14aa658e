#pragma once
// Checking of a password against the machine's own accounts, and later whether the account may
// still log in: by PAM, in a child, as a module may wait for a directory server, start programs or
// leave things in the process.

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

// Each forks a child, whose pid is -1 when that fails.

// The reply has status 200, the account's name, encoded, and its stamp as fields, in this order,
// when PAM lets the user in, and 403 when it does not, for whatever reason: the log says why. The
// stamp changes with the account's password and when it is locked; it is empty for accounts whose
// password is not this machine's to know.
nas::Child StartLogin(const Credentials& credentials, const PamService& service);

// Asks PAM's account phase alone. The reply has status 200 and the same fields, 403 where the
// account may not log in any more, and 503 where that cannot be told now.
nas::Child StartAccountCheck(const std::string& user, const PamService& service);

}  // namespace arbory
