#include "tests/program/cases.h"

#include <fnmatch.h>
#include <gtest/gtest.h>
#include <regex.h>
#include <strings.h>

#include <algorithm>

#include "nas/base/json_text.h"

namespace program_test {
namespace {

bool Holds(const std::string& text, const char* word) {
  return strcasestr(text.c_str(), word) != nullptr;
}
bool Ends(const std::string& text, const std::string& end) {
  return text.size() > end.size() &&
         strcasecmp(text.c_str() + text.size() - end.size(), end.c_str()) == 0;
}
bool Glob(const Entry& entry, const char* pattern) {
  return fnmatch(pattern, entry.name.c_str(), FNM_CASEFOLD) == 0;
}
bool MatchesRegex(const std::string& name, const char* expression) {
  regex_t compiled;
  EXPECT_EQ(regcomp(&compiled, expression, REG_EXTENDED | REG_ICASE | REG_NOSUB), 0);
  const bool matches = regexec(&compiled, name.c_str(), 0, nullptr, 0) == 0;
  regfree(&compiled);
  return matches;
}
bool IsCafe(const std::string& name) {
  return name.starts_with("caf\u00e9") || name.starts_with("cafe\u0301");
}
bool IsRegular(const Entry& entry) { return S_ISREG(entry.info.st_mode); }
long Modified(const Entry& entry) { return entry.info.st_mtim.tv_sec; }
long Read(const Entry& entry) { return entry.info.st_atim.tv_sec; }

}  // namespace

const std::vector<Case>& Cases() {
  static const std::vector<Case> cases = {
      {"everything", R"({"pattern": ""})", [](const Entry&) { return true; }},
      {"nothing", R"({"pattern": "no such name"})", [](const Entry&) { return false; }},
      {"a word, any case", R"({"pattern": "TXT"})",
       [](const Entry& e) { return Holds(e.name, "txt"); }},
      {"a glob is the whole name", R"({"pattern": "*.txt"})",
       [](const Entry& e) { return Glob(e, "*.txt"); }},
      {"one character and a set", R"({"pattern": "?mg[0-9].j*"})",
       [](const Entry& e) { return Glob(e, "?mg[0-9].j*"); }},
      {"two words and a third that is not", R"({"pattern": "a g !txt"})",
       [](const Entry& e) {
         return Holds(e.name, "a") && Holds(e.name, "g") && !Holds(e.name, "txt");
       }},
      {"either", R"({"pattern": "jpg|pdf"})",
       [](const Entry& e) { return Holds(e.name, "jpg") || Holds(e.name, "pdf"); }},
      {"a quoted wildcard is itself", R"({"pattern": "\"*\""})",
       [](const Entry& e) { return Holds(e.name, "*"); }},
      {"a regular expression", R"({"pattern": "regex:^[a-z]+[.](txt|jpg)$"})",
       [](const Entry& e) { return MatchesRegex(e.name, "^[a-z]+[.](txt|jpg)$"); }},
      {"composed finds decomposed", R"({"pattern": "caf\u00e9"})",
       [](const Entry& e) { return IsCafe(e.name); }},
      {"decomposed finds composed", R"({"pattern": "CAFE\u0301"})",
       [](const Entry& e) { return IsCafe(e.name); }},
      {"case beyond ASCII", R"({"pattern": "\u00fcber"})",
       [](const Entry& e) { return e.name.starts_with("\u00dcB") || e.name == "\u00dcber"; }},
      {"a newline is part of a name", R"({"pattern": "*\n*"})",
       [](const Entry& e) { return Holds(e.name, "\n"); }},
      {"a leading dash", R"({"pattern": "--help"})",
       [](const Entry& e) { return e.name == "--help"; }},
      {"what looks like SQL", R"({"pattern": "\"'; DROP\""})",
       [](const Entry& e) { return Holds(e.name, "'; drop"); }},
      {"one extension", R"({"extension": "txt"})",
       [](const Entry& e) { return !e.is_dir() && Ends(e.name, ".txt"); }},
      {"several, as people write them", R"({"extension": ".JPG; *.pdf,tar.gz"})",
       [](const Entry& e) {
         return !e.is_dir() &&
                (Ends(e.name, ".jpg") || Ends(e.name, ".pdf") || Ends(e.name, ".tar.gz"));
       }},
      {"folders", R"({"filetype": "dir"})", [](const Entry& e) { return e.is_dir(); }},
      {"files", R"({"filetype": "file"})", [](const Entry& e) { return !e.is_dir(); }},
      {"a category", R"({"filetype": "image"})",
       [](const Entry& e) {
         return !e.is_dir() && (Ends(e.name, ".jpg") || Ends(e.name, ".png"));
       }},
      {"size, both edges", R"({"size_from": 1023, "size_to": 1024})",
       [](const Entry& e) {
         return !e.is_dir() && e.info.st_size >= 1023 && e.info.st_size <= 1024;
       }},
      {"empty files", R"({"size_to": 0})",
       [](const Entry& e) { return !e.is_dir() && e.info.st_size == 0; }},
      {"bounds that cross", R"({"size_from": 2, "size_to": 1})",
       [](const Entry&) { return false; }},
      {"modified, both edges", R"({"mtime_from": 1700000010, "mtime_to": 1700000020})",
       [](const Entry& e) { return Modified(e) >= 1700000010 && Modified(e) <= 1700000020; }},
      {"last read", R"({"atime_to": 1699999990})",
       [](const Entry& e) { return Read(e) <= 1699999990; }},
      {"only the folder itself", R"({"pattern": "txt", "recursive": false})",
       [](const Entry& e) { return Holds(e.name, "txt"); }},
      {"criteria together",
       R"({"pattern": "a*", "extension": "txt", "size_from": 1, "mtime_from": 1700000030})",
       [](const Entry& e) {
         return Glob(e, "a*") && Ends(e.name, ".txt") && !e.is_dir() && e.info.st_size >= 1 &&
                Modified(e) >= 1700000030;
       }},
      {"a group, a bar and prefixes",
       R"({"pattern": "<ext:jpg,pdf size:>1kb>|<modified:1700000010..1700000020 !star>"})",
       [](const Entry& e) {
         const bool picture = Ends(e.name, ".jpg") || Ends(e.name, ".pdf");
         return (picture && !e.is_dir() && e.info.st_size > 1024) ||
                (Modified(e) >= 1700000010 && Modified(e) <= 1700000020 && !Holds(e.name, "star"));
       }},
      {"a prefix and a parameter", R"({"pattern": "size:>=1", "size_to": 1023})",
       [](const Entry& e) { return !e.is_dir() && e.info.st_size >= 1 && e.info.st_size <= 1023; }},
      {"a path with wildcards", R"({"pattern": "docs/**/*.{jpg,pdf} !case:img"})",
       [](const Entry& e) {
         return Holds(e.path, "/docs/") && (Ends(e.name, ".jpg") || Ends(e.name, ".pdf"));
       }},
      {"a path", R"({"pattern": "er/img1"})",
       [](const Entry& e) { return Holds(e.path, "er/img1"); }},
      {"no accent finds any", R"({"pattern": "cafe"})",
       [](const Entry& e) { return IsCafe(e.name); }},
      {"what is left out, and all in it",
       R"({"pattern": "exclude:er,*.{jpg,gz} hidden:no exclude:/comma*/"})",
       [](const Entry& e) {
         return !Holds(e.path, "/deep/er") && !Ends(e.name, ".jpg") && !Ends(e.name, ".gz") &&
                !e.name.starts_with('.') && !Holds(e.path, "/comma, folder");
       }},
      {"a name below a folder, and one at its place only",
       R"({"pattern": "exclude:docs/**/IMG2.*,deep/er g"})",
       [](const Entry& e) {
         return Holds(e.name, "g") && !(Holds(e.path, "/docs/") && Holds(e.name, "img2."));
       }},
      {"what an ignore file says", R"({"pattern": "ignored:no"})",
       [](const Entry& e) {
         const bool docs = Holds(e.path, "/docs/");
         return !Holds(e.path, "/docs/deep/er") &&
                !(docs && e.name.ends_with(".gz") && e.name != "x.tar.gz");
       }},
      {"letters that count", R"({"pattern": "letters:smart IMG|txt"})",
       [](const Entry& e) { return e.name.find("IMG") != e.name.npos || Holds(e.name, "txt"); }},
      {"two levels", R"({"pattern": "depth:<=2 txt"})",
       [](const Entry& e) {
         const std::string below = e.path.substr(e.path.find("/tree/"));
         return std::ranges::count(below, '/') <= 3 && Holds(e.name, "txt");
       }},
      {"by what they are", R"({"pattern": "type:link,pipe"})",
       [](const Entry& e) { return S_ISLNK(e.info.st_mode) || S_ISFIFO(e.info.st_mode); }},
      {"what can be run", R"({"pattern": "type:x,dir !type:device"})",
       [](const Entry& e) {
         return e.is_dir() || (IsRegular(e) && (e.info.st_mode & S_IXUSR) != 0);
       }},
      {"empty ones", R"({"pattern": "empty:"})",
       [](const Entry& e) {
         return e.is_dir() ? e.name == "empty" : IsRegular(e) && e.info.st_size == 0;
       }},
      {"contents by a prefix, among other criteria",
       R"({"pattern": "content:\"the needle\"|ext:gz !content:regex:\"^q{1025}\" !*.txt"})",
       [](const Entry& e) {
         const std::string text = TextOf(e.path);
         return (Holds(text, "the needle") || Ends(e.name, ".gz")) &&
                !text.starts_with(std::string(1025, 'q')) && !Ends(e.name, ".txt");
       }},
      {"contents", R"({"pattern": "the needle", "search_content": true})",
       [](const Entry& e) {
         const std::string text = TextOf(e.path);
         const auto has = [&](const char* word) {
           return Holds(e.name, word) || Holds(text, word);
         };
         return (Holds(e.name, "the") && Holds(e.name, "needle")) || (has("the") && has("needle"));
       }},
      {"contents of large files only",
       R"({"pattern": "needle", "size_from": 2000, "search_content": true})",
       [](const Entry& e) {
         return !e.is_dir() && e.info.st_size >= 2000 && Holds(TextOf(e.path), "needle");
       }},
  };
  return cases;
}

void Compare(const Case& row, const std::string& folder, const Way& way) {
  SCOPED_TRACE(row.why);
  Json::Value params;
  ASSERT_TRUE(nas::ParseJson(row.params, &params));
  for (const auto& [name, usual] : {std::pair("recursive", true), {"search_content", false}}) {
    if (!params.isMember(name)) params[name] = usual;
  }
  const bool recursive = params["recursive"].asBool();
  const Reference expected = Walk(folder, recursive, row.wanted);
  const Found found = way(params, folder);
  if (found.refused) {
    EXPECT_TRUE(expected.paths.empty());
    return;
  }
  EXPECT_EQ(found.unreadable, recursive ? expected.unreadable : 0);
  if (!found.cleaned) {
    EXPECT_EQ(std::set<std::string>(found.paths.begin(), found.paths.end()), expected.paths);
  }
  EXPECT_EQ(found.paths.size(), expected.paths.size()) << "something is missing or found twice";
  for (const std::string& path : found.paths) {
    const bool cleaned = found.cleaned && path.find("\uFFFD") != std::string::npos;
    EXPECT_TRUE(cleaned || expected.paths.contains(path)) << path;
  }
}

void CompareAll(const std::string& folder, const Way& way) {
  for (const Case& row : Cases()) Compare(row, folder, way);
}

}  // namespace program_test
