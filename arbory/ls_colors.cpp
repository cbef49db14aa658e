#include "arbory/ls_colors.h"

#include <strings.h>
#include <sys/stat.h>

#include <algorithm>

namespace arbory {
namespace {

// Where a link has the colour of what it leads to.
constexpr char kAsTarget[] = "target";

bool IsCode(std::string_view code) {
  return code.find_first_not_of("0123456789;") == std::string_view::npos;
}

// "0" is how LS_COLORS writes that there is no colour.
bool IsColour(std::string_view code) {
  return code.find_first_not_of("0;") != std::string_view::npos;
}

bool EndsWith(std::string_view name, const std::string& ending) {
  return name.size() >= ending.size() &&
         strncasecmp(name.data() + name.size() - ending.size(), ending.data(), ending.size()) == 0;
}

char LastOf(std::string_view text) {
  return static_cast<char>(tolower(static_cast<unsigned char>(text.back())));
}

}  // namespace

LsColors::LsColors(std::string_view text)
    : codes_{{"di", "01;34"}, {"ln", "01;36"}, {"pi", "33"},    {"so", "01;35"},
             {"bd", "01;33"}, {"cd", "01;33"}, {"ex", "01;32"}, {"su", "37;41"},
             {"sg", "30;43"}, {"st", "37;44"}, {"ow", "34;42"}, {"tw", "30;42"}} {
  while (!text.empty()) {
    const std::string_view item = text.substr(0, text.find(':'));
    text.remove_prefix(std::min(text.size(), item.size() + 1));
    const size_t equals = item.rfind('=');
    if (equals == std::string_view::npos || equals == 0) continue;
    const std::string key(item.substr(0, equals));
    const std::string code(item.substr(equals + 1));
    if (!IsCode(code) && !(key == "ln" && code == kAsTarget)) continue;
    if (!key.starts_with('*')) {
      codes_[key] = code;
    } else if (key.size() > 1) {
      auto& endings = endings_[LastOf(key)];
      endings.emplace(endings.begin(), key.substr(1), code);
    }
  }
}

std::string_view LsColors::Code(const char* key) const {
  const auto found = codes_.find(key);
  return found != codes_.end() && IsColour(found->second) ? found->second : std::string_view();
}

std::string_view LsColors::OfFolder(mode_t mode) const {
  const char* key = "di";
  if ((mode & S_IWOTH) != 0) {
    key = (mode & S_ISVTX) != 0 ? "tw" : "ow";
  } else if ((mode & S_ISVTX) != 0) {
    key = "st";
  }
  const std::string_view code = Code(key);
  return code.empty() ? Code("di") : code;
}

std::string_view LsColors::OfLink(const char* path) const {
  const auto link = codes_.find("ln");
  const bool as_target = link != codes_.end() && link->second == kAsTarget;
  const auto broken = codes_.find("or");
  struct stat target;
  if (as_target || broken != codes_.end()) {
    const bool leads_nowhere = stat(path, &target) != 0;
    if (leads_nowhere && broken != codes_.end()) return Code("or");
    if (as_target) return leads_nowhere ? std::string_view() : Of(path, target.st_mode, path);
  }
  return Code("ln");
}

std::string_view LsColors::OfFile(std::string_view name, mode_t mode) const {
  const char* key = nullptr;
  if ((mode & S_ISUID) != 0) {
    key = "su";
  } else if ((mode & S_ISGID) != 0) {
    key = "sg";
  } else if ((mode & (S_IXUSR | S_IXGRP | S_IXOTH)) != 0) {
    key = "ex";
  }
  const std::string_view code = key == nullptr ? std::string_view() : Code(key);
  if (!code.empty()) return code;
  const auto endings = endings_.find(LastOf(name));
  if (endings != endings_.end()) {
    for (const auto& [ending, its_code] : endings->second) {
      if (EndsWith(name, ending)) return IsColour(its_code) ? its_code : std::string_view();
    }
  }
  return Code("fi");
}

std::string_view LsColors::Of(std::string_view name, mode_t mode, const char* path) const {
  switch (mode & S_IFMT) {
    case S_IFDIR:
      return OfFolder(mode);
    case S_IFLNK:
      return OfLink(path);
    case S_IFIFO:
      return Code("pi");
    case S_IFSOCK:
      return Code("so");
    case S_IFBLK:
      return Code("bd");
    case S_IFCHR:
      return Code("cd");
    default:
      return OfFile(name, mode);
  }
}

}  // namespace arbory
