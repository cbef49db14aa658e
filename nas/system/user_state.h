#pragma once
// Names on disk of what is kept per user below the state directory, and their making:
//
//   STATE/users/USER/             0700, the user's own
//   STATE/users/USER/preference/  settings and histories: usersettings, search_history.db, ...
//   STATE/users/USER/tasks/       task records (nas/tasks)
//   STATE/volume0/@tmp/...        the scratch volume (volumes.h)

#include <string>

#include "nas/base/error.h"

namespace nas {

std::string PreferenceFolder(const std::string& user);
std::string TaskFolder(const std::string& user);

// Makes the process the user's (BecomeUser) and sees that the folders above are there and nobody
// else's. A user's first call also makes a "usersettings" that holds {}; one that is removed later
// is not made anew. What is made survives a power cut. It looks as the user, and goes back to root
// only to make what is missing. Fails with the identity changed or not: no such user, a user other
// than the caller when not root, no space, or a folder that is not the user's own and closed to
// others (EPERM). For the one thread of a process that is the user's from then on.
Status EnterUserState(const std::string& user);

}  // namespace nas
