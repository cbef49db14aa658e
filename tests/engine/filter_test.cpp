// What tells names apart without asking each: it may let too much pass, never too little.

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "nas/match/entry_path.h"
#include "nas/match/query.h"
#include "nas/match/query_match.h"
#include "nas/match/regex.h"
#include "nas/match/regex_literal.h"
#include "nas/match/regex_scan.h"

namespace nas {
namespace {

TEST(Filters, TextsThatExpressionsHold) {
  const struct {
    const char* expression;
    const char* text;
  } rows[] = {
      {"report", "report"},
      {"Report.*\\d{3}", "report"},
      {"ab{3}cdef", "cdef"},
      {"cdab{0}x", "cda"},         // none of what was counted
      {"abc{x}de", "x}de"},        // no count: what cannot be told ends the text
      {"colou?r", "colo"},         //
      {"abcd+e", "abcd"},          // one at least
      {"ab|cd", ""},               // either
      {"(ab|cd)xyz", "xyz"},       //
      {"(?i)abc", ""},             // options
      {"a\\.bc\\d", "a.bc"},       //
      {"a\\x62c", ""},             // an escape that takes what follows it
      {"[abc]def[^]x]gh", "def"},  //
      {"book", "boo"},             // the sign of Kelvin is a k
  };
  for (const auto& row : rows) {
    EXPECT_EQ(LiteralOf(row.expression, false), row.text) << row.expression;
  }
}

// Each row over all texts at once, against each of them alone.
TEST(Filters, ExpressionsOverManyTexts) {
  const std::vector<std::string> texts = {
      "a",         "ab",        "b",         "report 2024.txt",
      "report\n7", "x]y",       "-",         "foo-bar_12",
      "zzzq",      "q",         "aaa",       "12",
      "a.c",       "a b",       "tab\there", "^caret",
      "end",       "q_in_last",
  };
  const struct {
    const char* expression;
    bool runs;
  } rows[] = {
      {"^a", true},
      {"b$", true},
      {"^.$", true},
      {"^[^a]+$", true},
      {"[^]a]q", true},
      {"^[]x]+", true},
      {"a.*b", true},
      {"\\D+\\d", true},
      {"^\\W$", true},
      {"^\\S+\\s\\S+", true},
      {"q[^z]*", true},
      {"\\bbar", true},
      {"\\Bb", true},
      {"(a|b)c?$", true},
      {"(?:ab?){2,}", true},
      {"a{2}", true},
      {"^\\w+?_\\d+$", true},
      {"[a-c]\\.", true},
      {"$", true},
      {"\\B$", true},
      {"[^q]$", true},
      {"t\\.t|xt$", true},
      {"[\\s\\d]{2}", true},
      // Told from what lies beside the text, or from less than all ways to match.
      {"(?<=a)b", false},
      {"a(?!b)", false},
      {"a++b", false},
      {"(?>a|ab)c", false},
      {"\\Aa", false},
      {"b\\z", false},
      {"(a)\\1", false},
      {"(*COMMIT)a", false},
      {"[[:alpha:]]", false},
      {"\\N{U+61}", false},
      {"\\p{Lu}", false},
      {"[^-a]", false},
      {"\\x00", false},
      {"(?s)a", false},
      {"a?+b", false},
      {"\xc3\xa9", false},
      {"[\\x00-z]", false},
      {"a{1,2}+", false},
      {"[^\\D\\x01]", false},
  };
  std::string all;
  for (const std::string& text : texts) all.append(text).push_back('\0');
  for (const auto& row : rows) {
    SCOPED_TRACE(row.expression);
    const auto scan = RegexScan::Make(row.expression, RegexScan::Texts::kBytes);
    EXPECT_EQ(scan != nullptr, row.runs);
    if (!scan) continue;
    const auto alone = Regex::Compile(row.expression, Regex::Kind::kName);
    ASSERT_TRUE(alone);
    size_t begin = 0;
    for (const std::string& text : texts) {
      const auto place = scan->Find(all, begin);
      ASSERT_TRUE(place);
      EXPECT_EQ(*place <= begin + text.size(), (*alone)->Finds(text)) << text;
      begin += text.size() + 1;
    }
  }
}

// Whatever lies in a folder and matches, the folder is not left out; and some are.
TEST(Filters, FoldersWhosePathsCanMatch) {
  const char* const terms[] = {
      "photo/budget",
      "photo/",
      "oto/",
      "a/photo/bud",
      "/photo/budget",
      "/share/top/a",
      "photo/*.jpg",
      "photo/**",
      "**/photo/**/b*",
      "/photo/*/",
      "{photo,scan}/b",
      "/disk/top/p*/b?d*",
      "caf\xc3\xa9/b",
      "cafe/b",
      "case:Photo/b",
      "!photo/budget",
      "*/*/bud*",
      "photo/budget/x",
      "depth:2 a/b",
      "\"a/photo/\"",
      "STRASSE/b",
      "\xff/b",
      "case:caf\xc3\xa9/",
  };
  const char* const folders[] = {"",
                                 "photo",
                                 "a/photo",
                                 "Photo",
                                 "photo/budget",
                                 "caf\xc3\xa9",
                                 "cafe\xcc\x81",
                                 "scan",
                                 "stra\xc3\x9f"
                                 "e",
                                 "a\xff",
                                 "a/b/photo/c",
                                 "\xff"};
  const char* const names[] = {"budget", "b.jpg", "bud\xff", "b\xc3\xa9", "x", "photo", "b"};
  size_t left_out = 0;
  for (const char* term : terms) {
    const auto query = Query::Parse(term);
    ASSERT_TRUE(query) << term;
    for (const char* folder : folders) {
      EntryPath path;
      path.SetBase({"/share/top", "/disk/top", ""});
      path.SetFolder(folder);
      path.SetEntry({}, false);
      QuerySubject subject{.folder = &path};
      const bool may = Ask(query->root(), subject) != Answer::kNo;
      left_out += may ? 0 : 1;
      for (const char* name : names) {
        for (const bool is_folder : {false, true}) {
          FoldedName folded;
          folded.Set(name);
          path.SetEntry(name, is_folder);
          const QuerySubject entry{.name = &folded, .path = &path, .is_folder = is_folder};
          if (Ask(query->root(), entry) == Answer::kYes) {
            EXPECT_TRUE(may) << term << " in " << folder << ": " << name;
          }
        }
      }
    }
  }
  EXPECT_GT(left_out, std::size(terms) * std::size(folders) / 3);
}

}  // namespace
}  // namespace nas
