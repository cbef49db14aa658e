// Asks the engine itself (nas/search/explain.h), in this process and as the user, what it makes of
// one file. No search runs and nothing is stored.

#include "arbory/why_command.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <ctime>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "arbory/caller.h"
#include "arbory/comparators.h"
#include "arbory/search_request.h"
#include "arbory/terminal.h"
#include "nas/base/accounts.h"
#include "nas/base/paths.h"
#include "nas/search/explain.h"

namespace arbory {
namespace {

using nas::Refusal;

// The real path of a location's folder; empty for the root directory.
std::string FolderOf(const nas::Location& location) {
  return location.share.root + (location.path.empty() ? "" : "/" + location.path);
}

std::string Absolute(const std::string& path) {
  std::string absolute = std::filesystem::absolute(path).lexically_normal().string();
  while (absolute.size() > 1 && absolute.ends_with('/')) absolute.pop_back();
  return absolute;
}

// The path with the links on the way to it followed, but not one that it is itself.
std::optional<std::string> RealWay(const std::string& file) {
  const std::filesystem::path path(file);
  const std::string name = path.filename().string();
  const bool is_link_free = name.empty() || name == "." || name == "..";
  const std::string parent = path.has_parent_path() ? path.parent_path().string() : ".";
  const auto real = nas::RealPath(is_link_free ? file : parent);
  if (!real) return std::nullopt;
  return is_link_free ? *real : (*real == "/" ? "" : *real) + "/" + name;
}

// The ways by which FILE may lie in a folder to search. First as the user wrote both, so that a
// symbolic link between them is told of; but ".." behind a link leads elsewhere than it seems.
std::vector<std::string> WaysTo(const std::string& file, const std::vector<std::string>& folders) {
  std::vector<std::string> ways;
  if (("/" + file + "/").find("/../") == std::string::npos) {
    const std::string written = Absolute(file);
    for (const std::string& folder : folders) {
      const std::string root = Absolute(folder);
      const auto real = nas::RealPath(folder);
      if (!real || !nas::IsWithin(written, root)) continue;
      ways.push_back((*real == "/" ? "" : *real) + written.substr(root == "/" ? 0 : root.size()));
    }
    ways.push_back(written);
  }
  if (const auto real = RealWay(file); real) ways.push_back(*real);
  return ways;
}

// A way to FILE, seen from the innermost location that holds it: a location inside another is
// searched by itself.
struct Seen {
  size_t location = 0;
  std::string path;
};

std::optional<Seen> Locate(const std::vector<std::string>& ways,
                           const std::vector<nas::Location>& locations) {
  for (const std::string& way : ways) {
    std::optional<Seen> best;
    size_t longest = 0;
    for (size_t i = 0; i < locations.size(); ++i) {
      const std::string folder = FolderOf(locations[i]);
      if (!nas::IsWithin(way, folder) || way == folder) continue;
      if (best && folder.size() <= longest) continue;
      longest = folder.size();
      best = Seen{i, way.substr(folder.size() + 1)};
    }
    if (best) return best;
  }
  return std::nullopt;
}

std::string TimeText(std::int64_t seconds) {
  const std::time_t time = seconds;
  std::tm local = {};
  localtime_r(&time, &local);
  char text[sizeof("-2147483648-12-31 23:59:59")];
  return {text, std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &local)};
}

// What the file has instead of what was asked for.
std::string Fact(Refusal refusal, const nas::FileAttributes& file) {
  switch (refusal) {
    case Refusal::kTooSmall:
    case Refusal::kTooLarge:
      return std::to_string(file.size) + (file.size == 1 ? " byte" : " bytes");
    case Refusal::kModifiedEarlier:
    case Refusal::kModifiedLater:
      return TimeText(file.mtime);
    case Refusal::kCreatedEarlier:
    case Refusal::kCreatedLater:
      return TimeText(file.crtime);
    case Refusal::kReadEarlier:
    case Refusal::kReadLater:
      return TimeText(file.atime);
    case Refusal::kOwner:
      return nas::UserText(file.uid);
    case Refusal::kGroup:
      return nas::GroupText(file.gid);
    default:
      return "";
  }
}

std::string Reason(const nas::Explanation& found) {
  const Refusal refusal = found.refusal;
  const std::string words = nas::Words(refusal);
  if (found.error_number != 0) return words + " (" + std::strerror(found.error_number) + ")";
  if (refusal == Refusal::kNotRecursive) return words + " (--no-recursive)";
  if (!found.attributes) return words;
  const nas::FileAttributes& file = *found.attributes;
  const bool of_size = refusal == Refusal::kTooSmall || refusal == Refusal::kTooLarge;
  if (of_size && S_ISDIR(file.mode)) return "is a folder, and folders match no size";
  const bool of_creation = refusal == Refusal::kCreatedEarlier || refusal == Refusal::kCreatedLater;
  if (of_creation && file.crtime == nas::FileAttributes::kNoTime) {
    return "is on a file system that does not record when files were created";
  }
  const std::string fact = Fact(refusal, file);
  return fact.empty() ? words : words + " (" + fact + ")";
}

int Tell(const std::string& line, int exit_code) {
  Print((isatty(STDOUT_FILENO) != 0 ? Escaped(line) : line) + "\n");
  return exit_code;
}

int TellOfFile(const nas::Explanation& found, const nas::Location& location,
               const WhyOptions& options) {
  if (found.refusal == Refusal::kNone) {
    const bool part = options.search.limit != 0 || options.search.offset != 0;
    return Tell(options.file + " matches" +
                    (part ? "; whether it is printed depends on --offset and --limit" : ""),
                kExitSuccess);
  }
  const std::string whom =
      nas::IsOfFolder(found.refusal) ? location.share.root + "/" + found.path : "it";
  return Tell(options.file + " is left out: " + whom + " " + Reason(found), kExitNothing);
}

[[noreturn]] void ThrowNoFile(const std::string& file, const nas::Error& error) {
  if (error.kind == nas::kErrorNoSuchFolder) throw UsageError("there is no '" + file + "'");
  throw UsageError("'" + file + "' cannot be looked for: " + error.Text());
}

struct OpenedLocations {
  std::vector<nas::Location> locations;
  std::optional<nas::Error> failed;  // of the first of the others
};

OpenedLocations OpenAll(const Json::Value& texts) {
  OpenedLocations opened;
  for (const Json::Value& text : texts) {
    nas::Result<nas::Location> location = nas::OpenLocation(text.asString());
    if (location) {
      opened.locations.push_back(std::move(*location));
    } else if (!opened.failed) {
      opened.failed = location.error();
    }
  }
  return opened;
}

// FILE lies in no folder that is searched.
int TellOfElsewhere(const std::string& file, const std::optional<nas::Error>& unopened) {
  struct stat info;
  if (lstat(file.c_str(), &info) != 0) ThrowNoFile(file, nas::ErrnoError(file));
  if (!unopened)
    return Tell(file + " is left out: it is in none of the folders to search", kExitNothing);
  return Tell(file + " is left out: a folder cannot be searched: " + unopened->Text(),
              kExitNothing);
}

}  // namespace

int RunWhyCommand(const WhyOptions& options) {
  Caller caller(options.search.common);
  caller.BecomeUser();
  const SearchQuery& query = options.search.query;
  const Json::Value params = PrepareSearch(query, &caller);
  const Comparators comparators(params);
  const auto [locations, unopened] = OpenAll(params["folder_path"]);

  std::string file = options.file;
  while (file.size() > 1 && file.ends_with('/')) file.pop_back();
  const auto seen = Locate(WaysTo(file, query.folders), locations);
  if (!seen) return TellOfElsewhere(options.file, unopened);
  const auto found = nas::Explain({locations, comparators.get(), query.recursive, query.content},
                                  seen->location, seen->path);
  if (!found) ThrowNoFile(options.file, found.error());
  return TellOfFile(*found, locations[seen->location], options);
}

}  // namespace arbory
