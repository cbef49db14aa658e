#include "nas/search/mounts_below.h"

#include <fcntl.h>

#include <algorithm>
#include <sstream>

#include "nas/base/file_io.h"
#include "nas/base/paths.h"

namespace nas {
namespace {

constexpr size_t kMostMountinfoBytes = size_t{64} << 20;
constexpr size_t kEscapeDigits = 3;

// Spaces and their like are written as a backslash and three octal digits.
std::string Unescaped(const std::string& text) {
  std::string plain;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\\' && i + kEscapeDigits < text.size()) {
      plain += static_cast<char>(std::stoi(text.substr(i + 1, kEscapeDigits), nullptr, 8));
      i += kEscapeDigits;
    } else {
      plain += text[i];
    }
  }
  return plain;
}

}  // namespace

std::vector<std::string> MountsBelow(const std::string& mountinfo, const std::string& folder) {
  const std::string base = folder == "/" ? "/" : folder + "/";
  std::vector<std::string> below;
  std::istringstream lines(mountinfo);
  for (std::string line; std::getline(lines, line);) {
    std::istringstream fields(line);
    std::string id;
    std::string parent;
    std::string device;
    std::string root;
    std::string place;
    if (!(fields >> id >> parent >> device >> root >> place)) continue;
    place = Unescaped(place);
    if (place.size() > base.size() && place.starts_with(base)) {
      below.push_back(place.substr(base.size()));
    }
  }
  std::ranges::sort(below);
  below.erase(std::unique(below.begin(), below.end()), below.end());
  return below;
}

std::optional<std::vector<std::string>> MountsBelow(int fd) {
  const auto path = RealPath("/proc/self/fd/" + std::to_string(fd));
  const auto mounts = ReadWholeFile(AT_FDCWD, "/proc/self/mountinfo", kMostMountinfoBytes);
  if (!path || !mounts) return std::nullopt;
  return MountsBelow(*mounts, *path);
}

}  // namespace nas
