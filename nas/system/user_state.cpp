#include "nas/system/user_state.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "nas/base/accounts.h"
#include "nas/base/file_io.h"
#include "nas/system/config.h"
#include "nas/system/folders.h"
#include "nas/system/identity.h"

namespace nas {
namespace {

constexpr char kUsers[] = "users";
constexpr char kPreference[] = "preference";
constexpr char kTasks[] = "tasks";
constexpr char kUserSettings[] = "usersettings";
constexpr mode_t kPrivateMode = 0700;
constexpr mode_t kOpenMode = 0755;

std::string UserFolder(const std::string& user) {
  return CurrentConfig().state_dir + "/" + kUsers + "/" + user;
}

// Goes on to the folder `name` and demands of it what `check` does.
template <typename Check>
Status Enter(Result<UniqueFd> next, Check check, uid_t user, UniqueFd* folder) {
  if (!next) return next.error();
  *folder = std::move(*next);
  return check(folder->get(), user);
}

// Looks at what there is, by descriptor, so that nothing can be put in its place meanwhile.
// `maker` made what lies above the user's folder.
Status CheckFolders(const Account& account, uid_t maker) {
  UniqueFd folder;
  Status good = Enter(OpenTopFolder(CurrentConfig().state_dir), CheckSafeFrom, maker, &folder);
  if (good) good = Enter(OpenFolder(folder.get(), kUsers), CheckSafeFrom, maker, &folder);
  if (good) {
    good = Enter(OpenFolder(folder.get(), account.name), CheckPrivateTo, account.uid, &folder);
  }
  UniqueFd below;
  if (good) good = Enter(OpenFolder(folder.get(), kTasks), CheckPrivateTo, account.uid, &below);
  if (good) {
    good = Enter(OpenFolder(folder.get(), kPreference), CheckPrivateTo, account.uid, &below);
  }
  return good;
}

// STATE/users/USER, made where missing. Root's state directory is open to all to pass through, as
// each user reaches only their own folder in it; a user's own one is closed.
Result<UniqueFd> MakeUserFolder(const Account& account, uid_t maker) {
  const ScopedRoot root;
  const std::string& state_dir = CurrentConfig().state_dir;
  const Status made = MakeFolders(state_dir, maker == 0 ? kOpenMode : kPrivateMode);
  if (!made) return made.error();
  UniqueFd above;
  Status good = Enter(OpenTopFolder(state_dir), CheckSafeFrom, maker, &above);
  if (good) {
    good = Enter(OpenOrMakeFolder(above.get(), kUsers, kOpenMode), CheckSafeFrom, maker, &above);
  }
  if (!good) return good.error();
  return OpenOrMakeFolderFor(account.uid, account.gid, above.get(), account.name, kPrivateMode);
}

Status MakeFoldersOf(const Account& account, uid_t maker) {
  const Result<UniqueFd> folder = MakeUserFolder(account, maker);
  if (!folder) return folder.error();
  const Status good = CheckPrivateTo(folder->get(), account.uid);
  if (!good) return good;
  const Result<UniqueFd> preference = OpenOrMakeFolder(folder->get(), kPreference, kPrivateMode);
  if (!preference) return preference.error();
  // The folder of tasks comes last: as long as it is missing this is the user's first call.
  // Settings that are gone later are the user's to miss.
  if (!OpenFolder(folder->get(), kTasks)) {
    const Status made = CreateFile(preference->get(), kUserSettings, "{}\n", S_IRUSR | S_IWUSR);
    if (!made && made.error().error_number != EEXIST) return made.error();
  }
  const Result<UniqueFd> tasks = OpenOrMakeFolder(folder->get(), kTasks, kPrivateMode);
  return tasks ? Status() : tasks.error();
}

}  // namespace

std::string PreferenceFolder(const std::string& user) {
  return UserFolder(user) + "/" + kPreference;
}

std::string TaskFolder(const std::string& user) { return UserFolder(user) + "/" + kTasks; }

Status EnterUserState(const std::string& user) {
  const Result<Account> account = BecomeUser(user);
  if (!account) return account.error();
  const uid_t maker = CanBeRoot() ? 0 : account->uid;
  const Status found = CheckFolders(*account, maker);
  // Not the user's own is also the folder that another call is just about to hand over.
  if (found || (found.error().error_number != ENOENT && found.error().error_number != EPERM)) {
    return found;
  }
  const Status made = MakeFoldersOf(*account, maker);
  return made ? CheckFolders(*account, maker) : made;
}

}  // namespace nas
