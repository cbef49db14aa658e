#pragma once
// What is mounted, as /proc/self/mountinfo tells it to this process.

#include <cstdint>
#include <optional>
#include <string>

namespace nas {

struct Place {
  std::string number;  // "MAJOR:MINOR" that files there say they are on
  std::uint64_t mount_id = 0;
};
// Of an open file or folder (O_PATH will do). Asks no file server, so it does not wait for one.
std::optional<Place> PlaceOf(int fd);

struct Mount {
  std::string device;  // "MAJOR:MINOR" of the whole, where subvolumes have numbers of their own
  std::string type;
  std::string source;
};
// Nothing where the mount is not among this process's.
std::optional<Mount> FindMount(std::uint64_t mount_id);

inline constexpr char kMountInfo[] = "/proc/self/mountinfo";

}  // namespace nas
