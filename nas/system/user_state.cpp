#include "nas/system/user_state.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "nas/base/error.h"
#include "nas/base/file_io.h"
#include "nas/base/utf8.h"
#include "nas/system/accounts.h"
#include "nas/system/config.h"
#include "nas/system/folders.h"
#include "nas/system/identity.h"

namespace nas {
namespace {

constexpr size_t kMaxUserNameBytes = 255;  // it names a folder
constexpr char kUsers[] = "users";
constexpr char kPreference[] = "preference";
constexpr char kTasks[] = "tasks";
constexpr char kUserSettings[] = "usersettings";
constexpr mode_t kPrivateMode = 0700;
constexpr mode_t kOpenMode = 0755;

std::string UserFolder(const std::string& user) {
  return CurrentConfig().state_dir + "/" + kUsers + "/" + user;
}

bool Fail() {
  SetLastError(ErrorFromErrno(errno));
  return false;
}

// STATE/users/USER, made where missing. Root's state directory is open to all to pass through, as
// each user reaches only their own folder in it; a user's own one is closed.
UniqueFd MakeUserFolder(const std::string& user, const Account& account) {
  const ScopedRoot root;
  const uid_t maker = geteuid();
  const std::string& state_dir = CurrentConfig().state_dir;
  const mode_t mode = maker == 0 ? kOpenMode : kPrivateMode;
  if (!MakeFolders(state_dir, mode)) return {};
  const UniqueFd state(open(state_dir.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!state || !IsSafeFrom(state.get(), maker)) return {};
  const UniqueFd users = OpenOrMakeFolder(state.get(), kUsers, kOpenMode);
  if (!users || !IsSafeFrom(users.get(), maker)) return {};
  UniqueFd folder = OpenOrMakeFolder(users.get(), user, kPrivateMode);
  struct stat info;
  if (!folder || fstat(folder.get(), &info) != 0) return {};
  // Nobody but root can put anything here, so a folder of root's is one just being made.
  if (maker == 0 && info.st_uid == 0 && account.uid != 0 &&
      fchownat(folder.get(), "", account.uid, account.gid, AT_EMPTY_PATH) != 0) {
    return {};
  }
  return folder;
}

bool MakeContents(int folder_fd, uid_t uid) {
  const UniqueFd tasks = OpenOrMakeFolder(folder_fd, kTasks, kPrivateMode);
  const UniqueFd preference = OpenOrMakeFolder(folder_fd, kPreference, kPrivateMode);
  if (!tasks || !preference) return false;
  if (!IsPrivateTo(tasks.get(), uid) || !IsPrivateTo(preference.get(), uid)) return false;
  struct stat info;
  if (fstatat(preference.get(), kUserSettings, &info, AT_SYMLINK_NOFOLLOW) == 0) return true;
  return CreateFile(preference.get(), kUserSettings, "{}\n", S_IRUSR | S_IWUSR) || errno == EEXIST;
}

}  // namespace

bool IsUserName(const std::string& name) {
  if (name.empty() || name == "." || name == ".." || name.size() > kMaxUserNameBytes) return false;
  return std::none_of(name.begin(), name.end(),
                      [](unsigned char byte) { return byte == '/' || IsControl(byte); });
}

std::string PreferenceFolder(const std::string& user) {
  return UserFolder(user) + "/" + kPreference;
}

std::string TaskFolder(const std::string& user) { return UserFolder(user) + "/" + kTasks; }

bool PrepareUserState(const std::string& user) {
  const auto account = FindAccount(user);
  if (!account) return false;
  if (!CanBeRoot() && account->uid != geteuid()) {
    errno = EPERM;
    return Fail();
  }
  const UniqueFd folder = MakeUserFolder(user, *account);
  if (!folder) return Fail();
  const ScopedUser as(user);
  if (!as.ok()) return false;
  if (!IsPrivateTo(folder.get(), account->uid)) return Fail();
  return MakeContents(folder.get(), account->uid) || Fail();
}

}  // namespace nas
