// Names against patterns, extensions and kinds: what a person types against what is on disk.

#include <gtest/gtest.h>
#include <json/json.h>
#include <utf8proc.h>

#include <algorithm>
#include <fstream>
#include <memory>
#include <string>

#include "nas/match/folded_name.h"
#include "nas/match/glob.h"
#include "nas/match/query.h"
#include "nas/match/query_match.h"
#include "nas/search/criteria.h"

namespace nas {
namespace {

using std::string_literals::operator""s;

bool Matches(const std::string& pattern_text, const std::string& name) {
  const auto query = Query::Parse(pattern_text);
  EXPECT_TRUE(query) << pattern_text;
  FoldedName folded;
  folded.Set(name);
  QuerySubject subject;
  subject.name = &folded;
  return query && Ask(query->root(), subject) == Answer::kYes;
}

// The cases are the page's too, which marks in a name what the pattern found: one table for both.
TEST(Patterns, Table) {
  std::ifstream file(ARBORY_SOURCE_DIR "/tests/patterns.json");
  Json::Value rows;
  file >> rows;
  EXPECT_GT(rows.size(), 100U);
  for (const Json::Value& row : rows) {
    EXPECT_EQ(Matches(row["pattern"].asString(), row["name"].asString()), !row["marks"].isNull())
        << row;
  }
}

TEST(Patterns, NamesThatAreNotUtf8) {
  const struct Row {
    std::string pattern, name;
    bool matches;
    const char* why;
  } rows[] = {
      {"x", "\xff\xfex", true, "broken UTF-8 is matched by bytes"},
      {"\xff",
       "a\xff"
       "b",
       true, "and can be typed"},
      {"É", "\xc3\x89\xff", true, "as it was typed"},
      {"*\xff?", "a\xff\xfe", true, "one byte, one character"},
      {"a?b",
       "a\xff"
       "b",
       true, ""},
      {"regex:x",
       "\xff"
       "x",
       true, "broken UTF-8 around"},
  };
  for (const Row& row : rows) {
    EXPECT_EQ(Matches(row.pattern, row.name), row.matches)
        << "pattern «" << row.pattern << "» name «" << row.name << "» " << row.why;
  }
}

TEST(Patterns, RefusesWhatIsBroken) {
  for (const std::string& pattern :
       {"regex:("s, "regex:[a"s, "a regex:*"s, "nul\0l"s, std::string((64 << 10) + 1, 'a')}) {
    const auto parsed = Query::Parse(pattern);
    ASSERT_FALSE(parsed) << pattern.substr(0, 20);
    EXPECT_EQ(parsed.error().kind, kErrorIllegal);
    EXPECT_FALSE(parsed.error().path.empty()) << pattern.substr(0, 20);
  }
}

TEST(Patterns, HostilePatternsEnd) {
  EXPECT_FALSE(Matches("*a*a*a*a*a*a*a*a*a*a*b", std::string(255, 'a')));
  EXPECT_FALSE(Matches("regex:^(a+)+$", std::string(255, 'a') + "b"));
  EXPECT_FALSE(Matches(std::string(5'000, '?'), std::string(255, 'a')));
}

// Names are mostly judged by their bytes. That is right only if nothing but the characters that
// MayFoldToAscii knows can become ASCII, alone or before a combining mark.
TEST(FoldedName, OnlyKnownCharactersFoldToAscii) {
  int checked = 0;
  for (utf8proc_int32_t point = 0x80; point < 0x110000; ++point) {
    if (point >= 0xd800 && point < 0xe000) continue;
    utf8proc_uint8_t bytes[4];
    const auto length = static_cast<size_t>(utf8proc_encode_char(point, bytes));
    const std::string text(reinterpret_cast<char*>(bytes), length);
    for (const std::string& with_mark : {text, text + "\u0301"}) {
      const std::string plain = WithoutAccents(FoldText(with_mark));
      const bool has_ascii =
          std::any_of(plain.begin(), plain.end(), [](char c) { return (c & 0x80) == 0; });
      ASSERT_TRUE(!has_ascii || MayFoldToAscii(with_mark)) << std::hex << point;
      ++checked;
    }
    // Nor may any but those bring the letters beside it together.
    const std::string between = "x" + text + "y";
    const bool together = WithoutAccents(FoldText(between)).find("xy") != std::string::npos;
    ASSERT_TRUE(!together || MayFoldToAscii(between)) << std::hex << point;
  }
  EXPECT_GT(checked, 2'000'000);
}

Answer AskOf(const QueryNode& node, const std::string& name, bool is_folder,
             const QueryAttributes* attributes = nullptr) {
  FoldedName folded;
  folded.Set(name);
  QuerySubject subject;
  subject.name = &folded;
  subject.is_folder = is_folder;
  subject.is_file = !is_folder;
  subject.attributes = attributes;
  return Ask(node, subject);
}

TEST(Criteria, Extensions) {
  const struct {
    const char *list, *name;
    bool matches;
  } rows[] = {
      {"", "a", true},
      {" , ;", "a", true},
      {"jpg", "A.JPG", true},
      {".jpg", "a.jpg", true},
      {"*.jpg", "a.jpg", true},
      {"jpg", "ajpg", false},
      {"jpg;png", "a.png", true},
      {"jpg, png", "a.png", true},
      {"jpg png", "a.gif", false},
      {"tar.gz", "a.tar.gz", true},
      {"tar.gz", "a.gz", false},
      {"gz", "a.tar.gz", true},
      {"bashrc", ".bashrc", false},
      {"é", "x.e\u0301", true},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(AskOf(ExtensionNode(row.list), row.name, false) == Answer::kYes, row.matches)
        << row.list << " " << row.name;
  }
}

TEST(Criteria, Kinds) {
  const struct {
    const char *word, *name;
    bool is_dir, matches;
  } rows[] = {
      {"file", "a", false, true},         {"file", "a", true, false},
      {"DIR", "a", true, true},           {"dir", "a", false, false},
      {"image", "a.JPeG", false, true},   {"image", "a.jpg", true, false},
      {"audio", "a.flac", false, true},   {"video", "a.flac", false, false},
      {"document", "a.pdf", false, true}, {"archive", "a.tar.gz", false, true},
      {"archive", "gz", false, false},
  };
  for (const auto& row : rows) {
    const auto type = ParseFileType(row.word);
    ASSERT_TRUE(type) << row.word;
    QueryNode node{.kind = QueryNode::Kind::kType};
    node.types.push_back(*type);
    EXPECT_EQ(AskOf(node, row.name, row.is_dir) == Answer::kYes, row.matches)
        << row.word << " " << row.name;
  }
  EXPECT_FALSE(ParseFileType("files"));
}

TEST(Criteria, BoundsAreInclusive) {
  const struct {
    const char* what;
    std::unique_ptr<FileSearch::FindComp> comp;
    bool below, at, above, folder;
  } rows[] = {
      {"size from", std::make_unique<FileSearch::FindSizeComp>("greater", 100), false, true, true,
       false},
      {"size to", std::make_unique<FileSearch::FindSizeComp>("less", 100), true, true, false,
       false},
      {"mtime from", std::make_unique<FileSearch::FindMTimeComp>("after", 100), false, true, true,
       true},
      {"mtime to", std::make_unique<FileSearch::FindMTimeComp>("before", 100), true, true, false,
       true},
      {"atime from", std::make_unique<FileSearch::FindATimeComp>("after", 100), false, true, true,
       true},
      {"crtime to", std::make_unique<FileSearch::FindCRTimeComp>("before", 100), true, true, false,
       true},
  };
  for (const auto& row : rows) {
    const auto judge = [&row](int value, bool is_dir) {
      const QueryAttributes file{
          .size = value, .modified = value, .created = value, .opened = value};
      return AskOf(row.comp->criterion().node, "x", is_dir, &file) == Answer::kYes;
    };
    EXPECT_EQ(judge(99, false), row.below) << row.what;
    EXPECT_EQ(judge(100, false), row.at) << row.what;
    EXPECT_EQ(judge(101, false), row.above) << row.what;
    EXPECT_EQ(judge(100, true), row.folder) << row.what;
  }
  const QueryAttributes unrecorded;
  const FileSearch::FindCRTimeComp created("before", 100);
  EXPECT_EQ(AskOf(created.criterion().node, "x", false, &unrecorded), Answer::kNo)
      << "a file whose creation time is not recorded";
}

}  // namespace
}  // namespace nas
