#include "nas/base/paths.h"

#include <dirent.h>
#include <fcntl.h>

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <string_view>

#include "nas/base/unique_fd.h"

namespace nas {

Result<std::string> RealPath(const std::string& path) {
  const std::unique_ptr<char, void (*)(void*)> real(realpath(path.c_str(), nullptr), std::free);
  if (!real) return ErrnoError(path);
  return std::string(real.get());
}

bool IsWithin(const std::string& path, const std::string& folder) {
  if (folder.empty() || folder == "/") return true;
  return path.starts_with(folder) && (path.size() == folder.size() || path[folder.size()] == '/');
}

std::string ProgramFolder() {
  const std::string program = RealPath("/proc/self/exe").value_or({});
  return program.substr(0, program.rfind('/') + 1);
}

Result<std::vector<std::string>> NamesIn(int dir_fd, const std::string& name) {
  UniqueFd fd(openat(dir_fd, name.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!fd) return ErrnoError(name);
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(fdopendir(fd.get()), closedir);
  if (!stream) return ErrnoError(name);
  fd.Release();  // the stream's from here on
  std::vector<std::string> names;
  errno = 0;
  while (const dirent* entry = readdir(stream.get())) {
    const std::string_view found = entry->d_name;
    if (found != "." && found != "..") names.emplace_back(found);
  }
  if (errno != 0) return ErrnoError(name);
  return names;
}

}  // namespace nas
