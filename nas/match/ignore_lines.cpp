#include "nas/match/ignore_lines.h"

#include <algorithm>

namespace nas {
namespace {

constexpr std::string_view kMark = "\xEF\xBB\xBF";  // of UTF-8, before the first line

// Spaces at the end count behind a backslash only.
std::string_view WithoutEnd(std::string_view line) {
  if (line.ends_with('\r')) line.remove_suffix(1);
  while (line.ends_with(' ')) {
    const size_t backslashes =
        line.size() - 1 - (line.substr(0, line.size() - 1).find_last_not_of('\\') + 1);
    if (backslashes % 2 == 1) break;
    line.remove_suffix(1);
  }
  return line;
}

// What is named where no sign speaks.
std::string Plain(std::string_view text) {
  std::string plain;
  for (size_t at = 0; at < text.size(); ++at) {
    if (text[at] == '\\' && at + 1 < text.size()) ++at;
    plain.push_back(text[at]);
  }
  return plain;
}

// As wildcards.h has it: there braces speak, and a backslash is itself before most signs.
std::string Translated(std::string_view text) {
  std::string out;
  for (size_t at = 0; at < text.size(); ++at) {
    const bool escape = text[at] == '\\' && at + 1 < text.size();
    const char c = escape ? text[++at] : text[at];
    const bool special = std::string_view("*?[]{},\\").find(c) != std::string_view::npos;
    const bool brace = c == '{' || c == '}' || c == ',';
    if (special && (escape || brace)) out.push_back('\\');
    out.push_back(c);
  }
  return out;
}

}  // namespace

IgnoreLines::IgnoreLines(std::string_view text) {
  if (text.starts_with(kMark)) text.remove_prefix(kMark.size());
  while (!text.empty()) {
    const size_t end = std::min(text.find('\n'), text.size());
    Add(WithoutEnd(text.substr(0, end)));
    text.remove_prefix(std::min(end + 1, text.size()));
  }
}

void IgnoreLines::Add(std::string_view text) {
  Line line;
  if (text.starts_with('#')) return;
  if (text.starts_with('!')) {
    line.keeps = true;
    text.remove_prefix(1);
  }
  if (text.ends_with('/')) {
    line.folders_only = true;
    text.remove_suffix(1);
  }
  if (text.empty()) return;
  line.of_path = text.find('/') != std::string_view::npos;
  const std::string rooted =
      (line.of_path && !text.starts_with('/') ? "/" : "") + std::string(text);
  if (text.find_first_of("*?[") == std::string_view::npos) {
    line.name = Plain(rooted);
  } else {
    line.wildcards = Wildcards::Make(Translated(rooted), line.of_path);
  }
  lines_.push_back(std::move(line));
}

IgnoreLines::Verdict IgnoreLines::Of(std::string_view path, bool is_folder) const {
  const std::string_view name = path.substr(path.rfind('/') + 1);
  std::string rooted;
  for (auto each = lines_.rbegin(); each != lines_.rend(); ++each) {
    const Line& line = *each;
    if (line.folders_only && !is_folder) continue;
    if (line.of_path && rooted.empty()) rooted.assign("/").append(path);
    const std::string_view text = line.of_path ? std::string_view(rooted) : name;
    if (line.wildcards ? line.wildcards->Matches(text) : text == line.name) {
      return line.keeps ? Verdict::kKept : Verdict::kIgnored;
    }
  }
  return Verdict::kNothing;
}

}  // namespace nas
