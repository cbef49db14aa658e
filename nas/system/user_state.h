#pragma once
// Names on disk of what is kept per user below the state directory, and their making:
//
//   STATE/users/USER/             0700, the user's own
//   STATE/users/USER/preference/  settings and histories: usersettings, search_history.db, ...
//   STATE/users/USER/tasks/       task records (nas/tasks)
//   STATE/volume0/@tmp/...        the scratch volume (shares.h)

#include <string>

namespace nas {

// Whether `name` can be a user's: not empty, not "." or "..", no "/", control character, at most
// 255 bytes.
bool IsUserName(const std::string& name);

std::string PreferenceFolder(const std::string& user);
std::string TaskFolder(const std::string& user);

// Makes the folders above and a "usersettings" holding {} where they are missing. To be called with
// the identity the process started with, before it switches to the user. False with the last error
// and errno set: no such user, a user other than the caller when not root, no space, or a folder
// that is not the user's own and closed to others.
bool PrepareUserState(const std::string& user);

}  // namespace nas
