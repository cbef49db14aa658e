#include "nas/index/table_folders.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>

#include "nas/base/paths.h"
#include "nas/base/unique_fd.h"
#include "nas/system/config.h"

namespace nas {
namespace {

constexpr std::time_t kDay = std::time_t{24} * 60 * 60;
constexpr std::time_t kKept = 30 * kDay;

void Note(int folder, time_t last, std::time_t now) {
  // Also where the clock was ahead.
  if (last > now - kDay && last <= now) return;
  const std::array<timespec, 2> times = {timespec{0, UTIME_OMIT}, timespec{now, 0}};
  futimens(folder, times.data());
}

}  // namespace

std::string TablesFolder() { return CurrentConfig().state_dir + "/index"; }

std::string TableFolder(const FileSystem& file_system) {
  return TablesFolder() + "/" + file_system.id;
}

void SweepTableFolders(const Plan& plan, std::time_t now) {
  constexpr int kFolder = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
  const std::string tables = TablesFolder();
  const UniqueFd all(open(tables.c_str(), kFolder));
  const auto names = NamesIn(AT_FDCWD, tables);
  if (!all || !names) return;
  for (const std::string& name : *names) {
    const UniqueFd folder(openat(all.get(), name.c_str(), kFolder));
    struct stat status;
    if (!folder || fstat(folder.get(), &status) != 0) continue;
    const auto has_id = [&](const FileSystem& found) { return found.id == name; };
    if (std::ranges::any_of(plan.file_systems, has_id)) {
      Note(folder.get(), status.st_mtime, now);
      continue;
    }
    if (status.st_mtime < now - kKept) {
      unlinkat(folder.get(), kTableName, 0);
      unlinkat(folder.get(), (std::string(kTableName) + kUnfinished).c_str(), 0);
    }
    unlinkat(all.get(), name.c_str(), AT_REMOVEDIR);
  }
}

}  // namespace nas
