#include "arbory/locate.h"

#include <strings.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "arbory/options.h"
#include "nas/base/paths.h"
#include "nas/system/share_names.h"

namespace arbory {
namespace {

// Real paths here have no final "/", so that of the root directory is empty.
std::string RealFolder(const std::string& folder) {
  const auto fail = [&](const char* trouble) {
    throw UsageError("cannot search '" + folder + "': " + trouble);
  };
  const auto real = nas::RealPath(folder);
  if (!real) fail(std::strerror(real.error().error_number));
  struct stat info;
  if (stat(real->c_str(), &info) != 0) fail(std::strerror(errno));
  if (!S_ISDIR(info.st_mode)) fail("it is not a folder");
  return *real == "/" ? std::string() : *real;
}

std::vector<std::string> RealFolders(const std::vector<std::string>& folders, bool recursive) {
  std::vector<std::string> real;
  for (const std::string& folder : folders) {
    const std::string path = RealFolder(folder);
    if (std::find(real.begin(), real.end(), path) == real.end()) real.push_back(path);
  }
  if (!recursive) return real;
  std::vector<std::string> outermost;
  for (const std::string& path : real) {
    const bool covered = std::any_of(real.begin(), real.end(), [&](const std::string& other) {
      return path != other && nas::IsWithin(path, other);
    });
    if (!covered) outermost.push_back(path);
  }
  return outermost;
}

// The directory to share for a folder. Only the share "homes" may lie in or be a folder "homes", so
// below one the share begins above it.
std::string ShareRoot(const std::string& path) {
  return path.substr(0, (path + "/").find("/homes/"));
}

// The folder itself where it lies in none.
std::string RepositoryOf(const std::string& path) {
  struct stat status;
  for (std::string top = path; !top.empty(); top.resize(top.rfind('/'))) {
    if (stat((top + "/.git").c_str(), &status) == 0) return top;
  }
  return path;
}

}  // namespace

const nas::Share* InnermostShare(const std::string& path, const std::vector<nas::Share>& shares) {
  const nas::Share* best = nullptr;
  for (const nas::Share& share : shares) {
    const bool holds = nas::IsWithin(path, share.root);
    if (holds && (best == nullptr || share.root.size() > best->root.size())) best = &share;
  }
  return best;
}

std::string FreeShareName(const std::string& real_path, const std::vector<std::string>& taken) {
  constexpr size_t kMaxBytes = 200;  // leaves room for a number
  std::string base = real_path.substr(real_path.find_last_of('/') + 1).substr(0, kMaxBytes);
  for (char& byte : base) {
    if (!nas::TroubleWithShareName(std::string(1, byte)).empty() && byte != '.') byte = '_';
  }
  if (base.empty()) base = "root";
  const auto usable = [&](const std::string& name) {
    return nas::TroubleWithShareName(name).empty() &&
           strcasecmp(name.c_str(), nas::kHomesShare) != 0 &&
           std::find(taken.begin(), taken.end(), name) == taken.end();
  };
  std::string name = base;
  for (int number = 2; !usable(name); ++number) name = base + "-" + std::to_string(number);
  return name;
}

Locations LocateFolders(const std::vector<std::string>& folders,
                        const std::vector<nas::Share>& shares, bool recursive, bool repositories) {
  Locations locations;
  std::vector<std::string> taken;
  for (const nas::Share& share : shares) taken.push_back(share.name);
  for (const std::string& path : RealFolders(folders, recursive)) {
    if (const nas::Share* share = InnermostShare(path, shares)) {
      locations.paths.push_back("/" + share->name + path.substr(share->root.size()));
      continue;
    }
    const std::string root = ShareRoot(repositories ? RepositoryOf(path) : path);
    const std::string name = FreeShareName(root, taken);
    taken.push_back(name);
    locations.added.push_back({name, root.empty() ? "/" : root});
    locations.paths.push_back("/" + name + path.substr(root.size()));
  }
  return locations;
}

}  // namespace arbory
