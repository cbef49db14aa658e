#include "nas/match/meant_query.h"

#include <algorithm>
#include <utility>
#include <vector>

#include "nas/match/folded_name.h"
#include "nas/match/query.h"
#include "nas/match/query_prefix.h"

namespace nas {
namespace {

constexpr size_t kNone = std::string_view::npos;

// Words of other programs before a colon; "" for what a word is looked for in anyway.
constexpr std::pair<std::string_view, std::string_view> kPrefixes[] = {
    {"name", ""},
    {"filename", ""},
    {"file", ""},
    {"in", ""},
    {"path", ""},
    {"date", "modified"},
    {"changed", "modified"},
    {"mtime", "modified"},
    {"datemodified", "modified"},
    {"dm", "modified"},
    {"datecreated", "created"},
    {"dc", "created"},
    {"accessed", "opened"},
    {"atime", "opened"},
    {"extension", "ext"},
    {"filetype", "type"},
    {"kind", "type"},
    {"user", "owner"},
    {"text", "content"},
    {"contents", "content"},
    {"contains", "content"},
    {"re", "regex"},
    {"regexp", "regex"},
};

// Words as spaces part them; one with a quote goes on to the next quote, and what begins a regular
// expression to the end.
std::vector<std::string> Words(std::string_view query) {
  std::vector<std::string> words;
  for (size_t at = 0; (at = query.find_first_not_of(' ', at)) != kNone;) {
    size_t end = at;
    for (bool quoted = false; end < query.size() && (quoted || query[end] != ' '); ++end) {
      if (query[end] == '"') quoted = !quoted;
    }
    if (AsciiLower(query.substr(at, end - at)).find("regex:") != kNone) end = query.size();
    words.emplace_back(query.substr(at, end - at));
    at = end;
  }
  return words;
}

bool IsOpaque(const std::string& word) {
  return word.find('"') != std::string::npos ||
         AsciiLower(word).find("regex:") != std::string::npos;
}

// At most one letter more, less or other.
bool IsNear(std::string_view a, std::string_view b) {
  const auto [end, other] = std::ranges::mismatch(a, b);
  const std::string_view rest(end, a.end());
  const std::string_view there(other, b.end());
  const auto tail = [](std::string_view text) {
    return text.substr(std::min<size_t>(1, text.size()));
  };
  return tail(rest) == there || rest == tail(there) || tail(rest) == tail(there);
}

std::string WithKnownPrefix(const std::string& word) {
  const size_t colon = word.find(':');
  if (colon == std::string::npos || colon + 1 == word.size()) return word;
  const std::string name = AsciiLower(word.substr(0, colon));
  if (FindPrefix(name + ":") != nullptr) return word;
  const std::string value = word.substr(colon + 1);
  for (const auto& [other, ours] : kPrefixes) {
    if (name == other) return ours.empty() ? value : std::string(ours) + ":" + value;
  }
  constexpr size_t kShortest = 4;  // everything is near to less
  for (const char* ours :
       {"type", "size", "modified", "created", "opened", "owner", "group", "depth", "empty",
        "content", "regex", "exclude", "hidden", "ignored", "mounts", "letters"}) {
    if (name.size() >= kShortest && IsNear(name, ours)) return std::string(ours) + ":" + value;
  }
  return word;
}

std::string Meant(std::string word) {
  if (IsOpaque(word)) return word;
  if (word.size() > 2 && word.starts_with('-') && word[1] != '-') word[0] = '!';
  if (word.starts_with("file://")) word.erase(0, std::string_view("file://").size());
  if (word.starts_with("./")) word.erase(0, 1);
  word = WithKnownPrefix(word);
  std::ranges::replace(word, ';', '|');
  const bool wild = word.find_first_of("*?") != std::string::npos;
  if (!wild && word.find('[') == std::string::npos) std::ranges::replace(word, '\\', '/');
  const bool is_set = word.find('[') != std::string::npos && word.find(']') != std::string::npos;
  if (!is_set || wild) return word;
  const std::string sign = word.starts_with('!') ? "!" : "";
  return sign + "\"" + word.substr(sign.size()) + "\"";
}

// "size", ">", "1gb" and the like as one word; `at` is the first and becomes the last.
std::string Joined(const std::vector<std::string>& words, size_t& at) {
  const std::string prefix = words[at] + ":";
  const auto begins = [&](size_t i) {
    return i < words.size() && words[i].find_first_of("<>=") == 0;
  };
  if (FindPrefix(prefix) == nullptr || !begins(at + 1)) return words[at];
  std::string value = words[++at];
  const bool sign_alone = value.find_first_not_of("<>=") == std::string::npos;
  if (sign_alone && at + 1 < words.size()) value += words[++at];
  if (value.starts_with('=')) value.erase(0, value.find_first_not_of('='));
  return prefix + value;
}

// The words of a text in single quotes as one in double ones.
std::string Quoted(const std::vector<std::string>& words, size_t& at) {
  std::string text;
  for (size_t end = at; end < words.size(); ++end) {
    text += (end == at ? "" : " ") + words[end];
    if (text.size() < 3 || !text.ends_with('\'')) continue;
    at = end;
    return "\"" + text.substr(1, text.size() - 2) + "\"";
  }
  return words[at];
}

}  // namespace

std::string MeantQuery(std::string_view query) {
  const std::vector<std::string> words = Words(query);
  std::string meant;
  std::string before;  // the next word
  for (size_t at = 0; at < words.size(); ++at) {
    const std::string& word = words[at];
    const bool inside = !meant.empty() && at + 1 < words.size();
    if (inside && (word == "AND" || word == "&&" || word == "OR")) {
      before = word == "OR" ? "|" : " ";
      continue;
    }
    if (word == "NOT" && at + 1 < words.size()) {
      before = meant.empty() ? "!" : " !";
      continue;
    }
    if (before.empty() && !meant.empty()) before = " ";
    meant += std::exchange(before, {});
    meant += word.starts_with('\'') ? Quoted(words, at) : Meant(Joined(words, at));
  }
  std::string written;
  for (const std::string& word : words) written += (written.empty() ? "" : " ") + word;
  return meant == written || !Query::Parse(meant) ? "" : meant;
}

}  // namespace nas
