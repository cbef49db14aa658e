#include "nas/match/wildcards.h"

#include <algorithm>

namespace nas {
namespace {

constexpr size_t kNone = std::string_view::npos;
constexpr size_t kMostExpandedBytes = size_t{64} << 10;
constexpr std::string_view kSpecial = "*?[]{},\\";

bool IsEscape(std::string_view text, size_t at) {
  return text[at] == '\\' && at + 1 < text.size() && kSpecial.find(text[at + 1]) != kNone;
}

// Behind the character, escape or set at `at`.
size_t Next(std::string_view text, size_t at) {
  if (IsEscape(text, at)) return at + 2;
  const size_t end = text[at] == '[' ? Glob::SetEnd(text, at) : kNone;
  return end == kNone ? at + 1 : end + 1;
}

// "{", "," ... "}" of one list; empty where the text has none.
using Marks = std::vector<size_t>;

// The first list that is not inside another.
Marks FirstList(std::string_view text) {
  std::vector<Marks> open;
  Marks first;
  for (size_t at = 0; at < text.size(); at = Next(text, at)) {
    if (text[at] == '{') open.push_back({at});
    if (open.empty()) continue;
    if (text[at] == ',') open.back().push_back(at);
    if (text[at] != '}') continue;
    open.back().push_back(at);
    const bool list = open.back().size() > 2;
    if (list && (first.empty() || open.back().front() < first.front())) {
      first = std::move(open.back());
    }
    open.pop_back();
    if (open.empty() && !first.empty()) break;
  }
  return first;
}

// False where there are too many.
bool Expand(std::string_view text, std::vector<std::string>& all, size_t& bytes) {
  const Marks list = FirstList(text);
  if (list.empty()) {
    bytes += text.size();
    all.emplace_back(text);
    return all.size() == 1 ||
           (all.size() <= Wildcards::kMostAlternatives && bytes <= kMostExpandedBytes);
  }
  for (size_t i = 0; i + 1 < list.size(); ++i) {
    std::string one(text.substr(0, list.front()));
    one.append(text.substr(list[i] + 1, list[i + 1] - list[i] - 1));
    one.append(text.substr(list.back() + 1));
    if (!Expand(one, all, bytes)) return false;
  }
  return true;
}

// As a glob without backslashes: a set of one stands for its character.
std::string Translated(std::string_view text) {
  std::string glob;
  for (size_t at = 0; at < text.size();) {
    const size_t next = Next(text, at);
    if (!IsEscape(text, at)) {
      glob.append(text.substr(at, next - at));
    } else if (std::string_view("*?[").find(text[at + 1]) != kNone) {
      glob.append({'[', text[at + 1], ']'});
    } else {
      glob.push_back(text[at + 1]);
    }
    at = next;
  }
  return glob;
}

}  // namespace

bool Wildcards::Speak(std::string_view text) {
  if (Glob::HasWildcard(text)) return true;
  const size_t open = text.find('{');
  const size_t comma = text.find(',', std::min(open, text.size()));
  return text.find('}', std::min(comma, text.size())) != kNone;
}

bool Wildcards::Remain(std::string_view text) {
  for (size_t at = 0; at < text.size(); at = Next(text, at)) {
    const bool set = text[at] == '[' && Glob::SetEnd(text, at) != kNone;
    if (text[at] == '*' || text[at] == '?' || set) return true;
  }
  return !FirstList(text).empty();
}

std::string Wildcards::Unescaped(std::string_view text) {
  std::string plain;
  for (size_t at = 0; at < text.size(); ++at) {
    if (IsEscape(text, at)) ++at;
    plain.push_back(text[at]);
  }
  return plain;
}

std::vector<std::string> Wildcards::Alternatives(std::string_view text) {
  std::vector<std::string> all;
  size_t bytes = 0;
  if (!Expand(text, all, bytes)) return {};
  for (std::string& one : all) one = Translated(one);
  return all;
}

std::optional<Wildcards> Wildcards::Make(std::string_view text, bool of_path) {
  const std::vector<std::string> all = Alternatives(text);
  if (all.empty()) return std::nullopt;
  Wildcards wildcards;
  for (const std::string& one : all) {
    if (of_path) {
      wildcards.path_globs_.push_back(MakePathGlob(one));
    } else {
      wildcards.globs_.emplace_back(one);
    }
  }
  return wildcards;
}

Wildcards::PathGlob Wildcards::MakePathGlob(std::string_view text) {
  PathGlob glob;
  glob.anchored = text.starts_with('/');
  glob.folders_only = text.ends_with('/');
  glob.runs.emplace_back();
  bool any_folders = false;
  while (!text.empty()) {
    const size_t end = std::min(text.find('/'), text.size());
    const std::string_view name = text.substr(0, end);
    text.remove_prefix(std::min(end + 1, text.size()));
    any_folders = name == "**";
    if (any_folders) {
      glob.runs.emplace_back();
    } else if (!name.empty()) {
      glob.runs.back().emplace_back(name);
    }
  }
  if (any_folders) glob.runs.back().emplace_back("*");  // what is below, not the folder itself
  if (!glob.anchored) glob.runs.emplace(glob.runs.begin());
  return glob;
}

bool Wildcards::PathGlob::Matches(const std::vector<std::string_view>& names,
                                  bool is_folder) const {
  if (folders_only && !is_folder) return false;
  const auto fits = [&](const std::vector<Glob>& run, size_t at) {
    for (size_t i = 0; i < run.size(); ++i) {
      if (at + i >= names.size()) return false;
      if (!names[at + i].empty() && !run[i].Matches(names[at + i])) return false;
    }
    return true;
  };
  if (!fits(runs.front(), 0)) return false;
  size_t at = runs.front().size();
  if (runs.size() == 1) return at == names.size();
  // Taking the first place where each middle run fits leaves the most for those behind it.
  for (size_t i = 1; i + 1 < runs.size(); ++i) {
    while (at + runs[i].size() <= names.size() && !fits(runs[i], at)) ++at;
    if (at + runs[i].size() > names.size()) return false;
    at += runs[i].size();
  }
  const std::vector<Glob>& last = runs.back();
  return at + last.size() <= names.size() && fits(last, names.size() - last.size());
}

namespace {

std::vector<std::string_view> NamesOf(std::string_view path) {
  std::vector<std::string_view> names;
  while (!path.empty()) {
    const size_t end = std::min(path.find('/'), path.size());
    if (end > 0) names.push_back(path.substr(0, end));
    path.remove_prefix(std::min(end + 1, path.size()));
  }
  return names;
}

}  // namespace

bool Wildcards::Matches(std::string_view text) const {
  if (path_globs_.empty()) {
    return std::ranges::any_of(globs_, [text](const Glob& glob) { return glob.Matches(text); });
  }
  const std::vector<std::string_view> names = NamesOf(text);
  return std::ranges::any_of(
      path_globs_, [&](const PathGlob& glob) { return glob.Matches(names, text.ends_with('/')); });
}

bool Wildcards::MayMatchBelow(std::string_view folder) const {
  std::vector<std::string_view> names = NamesOf(folder);
  names.emplace_back();
  return std::ranges::any_of(path_globs_,
                             [&](const PathGlob& glob) { return glob.Matches(names, true); });
}

std::string_view Wildcards::Required() const {
  std::string_view longest;
  const auto consider = [&longest](const Glob& glob) {
    if (glob.LongestLiteral().size() > longest.size()) longest = glob.LongestLiteral();
  };
  if (globs_.size() == 1) consider(globs_.front());
  if (path_globs_.size() == 1) {
    for (const auto& run : path_globs_.front().runs) std::ranges::for_each(run, consider);
  }
  return longest;
}

std::string_view Wildcards::RequiredOfFolder() const {
  std::string_view longest;
  if (path_globs_.size() != 1) return longest;
  const auto& runs = path_globs_.front().runs;
  for (const auto& run : runs) {
    for (const Glob& glob : run) {
      const bool last = &run == &runs.back() && &glob == &run.back();
      const std::string_view text = glob.LongestLiteral();
      if (!last && text.size() > longest.size()) longest = text;
    }
  }
  return longest;
}

std::vector<std::string> Wildcards::RequiredTexts() const {
  std::vector<std::string> texts;
  for (const Glob& glob : globs_) texts.push_back(glob.LongestText());
  if (texts.empty()) texts.emplace_back();
  return texts;
}

std::string Wildcards::Expression(bool alone) const {
  std::string all;
  for (const Glob& glob : globs_) {
    const std::string one = glob.Expression(alone && globs_.size() == 1);
    if (one.empty()) return one;
    all.append(all.empty() ? "" : "|").append(one);
  }
  return all;
}

}  // namespace nas
