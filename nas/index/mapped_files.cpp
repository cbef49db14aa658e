#include "nas/index/mapped_files.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <string_view>

#include "nas/base/paths.h"
#include "nas/base/unique_fd.h"

namespace nas {
namespace {

// Newer than some headers (Linux 6.11): asks /proc/PID/maps for one mapping that is as the flags
// say, without a line of text for each of the others.
struct MappingQuery {
  std::uint64_t size = sizeof(MappingQuery);
  std::uint64_t flags = 0;
  std::uint64_t address = 0;  // of the mapping, or of one before it
  std::uint64_t begin = 0;
  std::uint64_t end = 0;
  std::uint64_t mapping_flags = 0;
  std::uint64_t page_size = 0;
  std::uint64_t offset = 0;
  std::uint64_t inode = 0;
  std::uint32_t device_major = 0;
  std::uint32_t device_minor = 0;
  std::uint32_t name_size = 0;
  std::uint32_t build_id_size = 0;
  std::uint64_t name = 0;
  std::uint64_t build_id = 0;
};
constexpr auto kQueryMapping = _IOWR('f', 17, MappingQuery);
constexpr std::uint64_t kShared = 0x08;
constexpr std::uint64_t kOrNext = 0x10;
constexpr std::uint64_t kOfFile = 0x20;

// False, and nothing else done, where the kernel does not know the question.
bool AskForMappings(int maps, Changes& changes) {
  MappingQuery query;
  query.flags = kShared | kOrNext | kOfFile;
  while (ioctl(maps, kQueryMapping, &query) == 0) {
    if (query.inode != 0) changes.AddInode(query.inode);
    query.address = query.end;
  }
  return errno != ENOTTY && errno != EINVAL;
}

// A line of /proc/PID/maps: "BEGIN-END rw-s OFFSET MAJOR:MINOR INODE   PATH".
void AddLine(std::string_view line, Changes& changes) {
  constexpr size_t kFieldsBeforeInode = 4;
  constexpr size_t kPlaceOfShared = 4;
  size_t at = line.find(' ');
  if (at == std::string_view::npos || at + kPlaceOfShared >= line.size()) return;
  if (line[at + kPlaceOfShared] != 's') return;
  for (size_t field = 1; field < kFieldsBeforeInode && at != std::string_view::npos; ++field) {
    at = line.find(' ', at + 1);
  }
  if (at == std::string_view::npos) return;
  std::uint64_t inode = 0;
  std::from_chars(line.data() + at + 1, line.data() + line.size(), inode);
  if (inode != 0) changes.AddInode(inode);
}

void ReadMappings(UniqueFd maps, Changes& changes) {
  const std::unique_ptr<FILE, int (*)(FILE*)> lines(fdopen(maps.Release(), "r"), std::fclose);
  char* line = nullptr;
  size_t room = 0;
  for (ssize_t length = 0; lines && (length = getline(&line, &room, lines.get())) > 0;) {
    AddLine({line, static_cast<size_t>(length)}, changes);
  }
  std::free(line);
}

// Whether /proc shows the processes of the whole machine: in a container it shows the container's,
// while others may have its files mapped.
bool SeesAllProcesses() {
  // Of the first namespace, as the kernel has it (PROC_PID_INIT_INO); others get higher numbers.
  constexpr ino_t kFirst = 0xEFFFFFFC;
  struct stat status;
  return stat("/proc/self/ns/pid", &status) == 0 && status.st_ino == kFirst;
}

bool HasEnded() { return errno == ENOENT || errno == ESRCH; }

bool AddMappings(int process, Changes& changes) {
  UniqueFd maps(openat(process, "maps", O_RDONLY | O_CLOEXEC));
  if (!maps) return HasEnded();
  if (!AskForMappings(maps.get(), changes)) ReadMappings(std::move(maps), changes);
  return true;
}

// The file itself is not touched: it may lie on a file server that does not answer.
bool AddOpenForWriting(int process, Changes& changes) {
  constexpr size_t kMostBytes = 256;  // the inode is in the fourth line
  constexpr std::string_view kInode = "\nino:\t";
  const auto names = NamesIn(process, "fd");
  if (!names) return HasEnded();
  for (const std::string& name : *names) {
    // The mode of a descriptor's link says how it was opened.
    struct stat status;
    const bool writes =
        fstatat(process, ("fd/" + name).c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
        (status.st_mode & S_IWUSR) != 0;
    if (!writes) continue;
    const UniqueFd file(openat(process, ("fdinfo/" + name).c_str(), O_RDONLY | O_CLOEXEC));
    std::array<char, kMostBytes> text;
    const ssize_t got = file ? read(file.get(), text.data(), text.size()) : -1;
    if (got < 0 && HasEnded()) continue;
    const std::string_view lines(text.data(), static_cast<size_t>(std::max<ssize_t>(got, 0)));
    const size_t at = lines.find(kInode);
    if (at == std::string_view::npos) return false;
    std::uint64_t inode = 0;
    std::from_chars(lines.data() + at + kInode.size(), lines.data() + lines.size(), inode);
    if (inode != 0) changes.AddInode(inode);
  }
  return true;
}

}  // namespace

bool AddInodesMappedBy(const std::string& pid, Changes& changes) {
  const UniqueFd process(open(("/proc/" + pid).c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!process) return HasEnded();
  return AddMappings(process.get(), changes) && AddOpenForWriting(process.get(), changes);
}

// What one hides is to be expected of any file; the others make no difference then.
bool AddMappedInodes(Changes& changes) {
  if (!SeesAllProcesses()) return false;
  const auto names = NamesIn(AT_FDCWD, "/proc");
  if (!names) return false;
  return std::ranges::all_of(*names, [&](const std::string& name) {
    const bool process = name.find_first_not_of("0123456789") == std::string::npos;
    return !process || AddInodesMappedBy(name, changes);
  });
}

}  // namespace nas
