#include "arbory/search_terms.h"

#include <algorithm>
#include <string_view>
#include <vector>

#include "nas/match/file_kinds.h"

namespace arbory {
namespace {

void AddTerm(std::string_view term, std::string* terms) { terms->append(term).append(" "); }

// One name or glob: quoted, so that only quotes and commas mean anything in it.
std::string Quoted(std::string_view glob) {
  std::string quoted = "\"";
  size_t open = 0;
  for (size_t at = 0; at < glob.size(); ++at) {
    const char c = glob[at];
    if (c == '\\' && at + 1 < glob.size()) {
      quoted.append({c, glob[++at]});
      continue;
    }
    open += c == '{' ? 1 : 0;
    open -= c == '}' && open > 0 ? 1 : 0;
    if (c == '"' || (c == ',' && open == 0)) quoted.push_back('\\');
    quoted.push_back(c);
  }
  return quoted + "\"";
}

std::vector<std::string> Words(const std::vector<std::string>& lists) {
  std::vector<std::string> words;
  for (const std::string& list : lists) {
    for (size_t at = 0; at <= list.size();) {
      const size_t end = std::min(list.find(',', at), list.size());
      words.push_back(list.substr(at, end - at));
      at = end + 1;
    }
  }
  return words;
}

// "executable" and "empty" narrow what the others ask for, as in other programs: of files those
// that can be run, and of all those that hold nothing.
void AddTypes(const std::vector<std::string>& types, std::string* terms) {
  std::vector<std::string> words = Words(types);
  const auto is = [](std::string_view letter, std::string_view word) {
    return [=](const std::string& type) { return type == letter || type == word; };
  };
  if (std::erase_if(words, is("e", "empty")) > 0) AddTerm("empty:", terms);
  if (std::ranges::any_of(words, is("x", "executable"))) std::erase_if(words, is("f", "file"));
  std::string list;
  for (const std::string& word : words) list += (list.empty() ? "" : ",") + word;
  if (list.empty()) return;
  // As people would write it, where it is what it should be: sentences quote it.
  const bool plain = list.find_first_not_of("abcdefghijklmnopqrstuvwxyz,") == std::string::npos;
  AddTerm(plain ? "type:" + list : "type:\"" + list + "\"", terms);
}

}  // namespace

std::string PatternWithTerms(const SearchQuery& query) {
  std::string terms;
  for (const std::string& glob : query.excludes) AddTerm("exclude:" + Quoted(glob), &terms);
  if (query.no_hidden) AddTerm("hidden:no", &terms);
  if (query.ignore_files) AddTerm("ignored:no", &terms);
  if (query.one_file_system) AddTerm("mounts:no", &terms);
  if (!query.letters.empty()) AddTerm("letters:" + query.letters, &terms);
  if (!query.min_depth.empty()) AddTerm("depth:>=" + query.min_depth, &terms);
  if (!query.max_depth.empty()) AddTerm("depth:<=" + query.max_depth, &terms);
  if (TypeParameter(query).empty()) AddTypes(query.types, &terms);
  if (terms.empty()) return query.pattern;
  // A bar that nothing stands before would join what follows to the last of the terms.
  const size_t begin = query.pattern.find_first_not_of(" |");
  return terms + (begin == std::string::npos ? "" : query.pattern.substr(begin));
}

// "file" is whatever is no folder to the API, and a regular file to people.
std::string TypeParameter(const SearchQuery& query) {
  if (query.types.size() != 1) return query.type;
  const auto type = nas::ParseFileType(query.types.front());
  return type && (type->folder || type->category) ? query.types.front() : query.type;
}

}  // namespace arbory
