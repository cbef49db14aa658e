#include "nas/index/mapped_files.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>

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

}  // namespace

bool AddMappedInodes(Changes& changes) {
  if (!SeesAllProcesses()) return false;
  const auto names = NamesIn(AT_FDCWD, "/proc");
  if (!names) return false;
  bool complete = true;
  for (const std::string& name : *names) {
    if (name.find_first_not_of("0123456789") != std::string::npos) continue;
    UniqueFd maps(open(("/proc/" + name + "/maps").c_str(), O_RDONLY | O_CLOEXEC));
    if (!maps) {
      complete = complete && (errno == ENOENT || errno == ESRCH);
    } else if (!AskForMappings(maps.get(), changes)) {
      ReadMappings(std::move(maps), changes);
    }
  }
  return complete;
}

}  // namespace nas
