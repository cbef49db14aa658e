// Normalises the locations of a search, so that the user's home is searched under one spelling and
// is not walked twice because it was also given as a part of the homes. Texts are compared as they
// are; nothing here looks at the disk but the home lookup.

#include "search/locations.h"

#include <syslog.h>

#include <string_view>
#include <vector>

#include "api/log.h"
#include "platform/system.h"
#include "search/find_handler.h"

namespace {

constexpr std::string_view kHome = "/home";
constexpr std::string_view kHomes = "/homes";
constexpr char kHomesFolder[] = "/homes/";
constexpr size_t kHomePathBytes = 4096;  // of the longest path on this system

// Whether `path` lies below `folder`.
bool IsInside(std::string_view path, std::string_view folder) {
  return path.size() > folder.size() && path.starts_with(folder) && path[folder.size()] == '/';
}

// Only the first entry that decides is looked at: others inside `folder` stay, even when that makes
// `folder` appear twice.
void MergeIntoHomes(const std::string& folder, std::vector<std::string>& homes) {
  for (std::string& entry : homes) {
    if (IsInside(entry, folder)) {
      entry = folder;
      return;
    }
    if (entry == folder || IsInside(folder, entry)) return;
  }
  homes.push_back(folder);
}

}  // namespace

bool GetUserHomesPath(const char* user, std::string& path) {
  char buffer[kHomePathBytes] = {};
  if (NUVAServiceHomePathGet(user, buffer, sizeof(buffer)) != 0) {
    syslog(LOG_ERR, "%s:%d Failed to get homes path for %s, %m", kLogSource, log_line::kHomeLookup,
           user);
    return false;
  }
  const std::string home = buffer;
  const size_t start = home.find(kHomesFolder);
  if (start == std::string::npos) {
    syslog(LOG_ERR, "%s:%d Failed to find /homes/ in %s", kLogSource, log_line::kHomeOutsideHomes,
           buffer);
    return false;
  }
  path = home.substr(start);
  return true;
}

Json::Value ArboryFindHandler::RemoveDuplicatedLocations(const Json::Value& locations) const {
  Json::Value output(Json::arrayValue);
  std::vector<std::string> homes;
  std::vector<std::string> converted;
  for (const Json::Value& location : locations) {
    const std::string path = location.asString();
    if (path == kHome || IsInside(path, kHome)) {
      std::string home;
      if (GetUserHomesPath(request()->GetLoginUserName().c_str(), home)) {
        converted.push_back(home + path.substr(kHome.size()));
      }
    } else if (path == kHomes || IsInside(path, kHomes)) {
      homes.push_back(path);
    } else {
      output.append(path);
    }
  }
  for (const std::string& folder : converted) MergeIntoHomes(folder, homes);
  for (const std::string& folder : homes) output.append(folder);
  return output;
}
