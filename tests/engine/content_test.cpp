// Contents of files: literals and expressions wherever a piece may end, and what is not searched.

#include <fcntl.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <random>

#include "nas/match/content_scanner.h"
#include "nas/search/candidate_list.h"

namespace nas {
namespace {

constexpr size_t kPiece = 256 * 1024;  // as the scanner reads

class Contents : public testing::Test {
 protected:
  Contents() {
    std::filesystem::create_directories(folder_);
    fd_ = UniqueFd(open(folder_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  }
  ~Contents() override { std::filesystem::remove_all(folder_); }

  ContentScanner::Outcome Scan(const std::string& pattern_text, const std::string& content) {
    const auto query = ContentQuery::From(Query::Parse(pattern_text)->root(), true);
    EXPECT_TRUE(query) << pattern_text;
    std::ofstream(folder_ + "/file", std::ios::binary) << content;
    return ContentScanner(*query, stop_).Scan(fd_.get(), "file");
  }
  // Long enough that its encoding is told.
  static std::string Hebrew() {
    std::string text;
    for (int i = 0; i < 5; ++i) {
      text +=
          "\xe4\xf1\xf4\xf8 \xe4\xe6\xe4 \xf0\xeb\xfa\xe1 \xe1\xf2\xe1\xf8\xe9\xfa "
          "\xe5\xe4\xe5\xe0 \xf2\xe5\xf1\xf7 \xe1\xfa\xe5\xec\xe3\xe5\xfa \xe4\xf2\xe9\xf8 "
          "\xe9\xf8\xe5\xf9\xec\xe9\xed. ";
    }
    return text;
  }
  bool Finds(const std::string& pattern, const std::string& content) {
    return Scan(pattern, content) == ContentScanner::Outcome::kMatch;
  }

  const std::string folder_ = testing::TempDir() + "contents-" + std::to_string(getpid());
  UniqueFd fd_;
  int stop_ = 0;
};

TEST_F(Contents, Table) {
  using std::string_literals::operator""s;
  const struct {
    std::string pattern, content;
    bool found;
    const char* why;
  } rows[] = {
      {"needle", "hay NeedLe hay", true, "ignoring case"},
      {"needle", "need le", false, ""},
      {"needle", "", false, "an empty file"},
      {"needle", "needl", false, "shorter than the text"},
      {"a_b", "A_B", true, "only letters fold"},
      {"a_b",
       "a\x7f"
       "b",
       false, "an underscore is not its neighbour"},
      {"[", "x[", true, ""},
      {"one two", "two\none", true, "all terms, anywhere"},
      {"one two", "one", false, ""},
      {"one|two", "two", true, ""},
      {"one !two", "one", true, ""},
      {"one !two", "one two", false, ""},
      {"straße", "STRAßE", true, "beyond ASCII"},
      {"é", "e\u0301", true, "stored decomposed"},
      {"e\u0301", "é", true, "stored composed"},
      {"\"two words\"", "Two Words", true, ""},
      {"regex:^b.d$", "a\nbad\nc", true, "each line"},
      {"regex:a.b", "a\nb", false, "a dot stays in its line"},
      {"regex:\\bint\\s+main", "int  main()", true, ""},
      {"needle", "needle\0"s, false, "binary"},
      {"needle", "needle" + std::string(30'000, 'x') + "\0"s, false, "a NUL in the first block"},
      {"needle", std::string(40'000, 'x') + "\0needle"s, true, "a NUL behind the first block"},
      {"x", "\xff\xc0x", true, "not UTF-8"},
      {"regex:x", "\xff\xc0x", true, "not UTF-8"},
      {"regex:^x", "\xef\xbb\xbfx", true, "behind the mark of UTF-8"},
      {"needle", "\xff\xfen\0e\0E\0d\0l\0e\0"s, true, "UTF-16, little end first"},
      {"é", "\xfe\xff\0\xe9"s, true, "UTF-16, big end first"},
      {"é", "\xfe\xff\0\0\0\xe9"s, false, "binary, though it begins with a mark"},
      {"é", "caf\xe9", true, "Latin-1"},
      {"x !é", "x caf\xe9", false, "Latin-1"},
      {"regex:f.\\b", "caf\xe9 au lait", true, "Latin-1"},
      {"привет", "\xd3\xeb\xe8\xf6\xe0 \xcf\xf0\xe8\xe2\xe5\xf2, \xea\xe0\xea \xe4\xe5\xeb\xe0?",
       true, "Windows-1251"},
      {"日本語", "\x82\xb1\x82\xea\x82\xcd\x93\xfa\x96\x7b\x8c\xea\x82\xc5\x82\xb7", true,
       "Shift JIS"},
      {"הסוב", Hebrew() + "\xe4\xf1\xe5\xe1", true,
       "Windows-1255, a letter that waits for its point"},
      {"é", "\xff caf\xc3\xa9", true, "UTF-8 with damages"},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(Finds(row.pattern, row.content), row.found)
        << row.pattern << " in «" << row.content.substr(0, 40) << "» " << row.why;
  }
}

TEST_F(Contents, WhatAsksForNoContents) {
  for (const char* pattern : {"", "*.txt", "a ?b", "!a", "!a !b", "a|!b"}) {
    EXPECT_FALSE(ContentQuery::From(Query::Parse(pattern)->root(), true)) << pattern;
  }
}

TEST_F(Contents, NothingIsLostWherePiecesMeet) {
  for (const char* pattern : {"needle", "regex:n..dle", "needlé"}) {
    const std::string needle = std::string(pattern) == "needlé" ? "NEEDLÉ" : "NEEDLE";
    for (size_t at = kPiece - 8; at <= kPiece + 1; ++at) {
      EXPECT_TRUE(Finds(pattern, std::string(at, '-') + needle + std::string(100, '-')))
          << pattern << " in one line at " << at;
      std::string lines;
      while (lines.size() < at) lines += "line of text\n";
      lines.resize(at);
      EXPECT_TRUE(Finds(pattern, lines + needle)) << pattern << " in lines at " << at;
    }
  }
  EXPECT_TRUE(Finds("regex:^end$", std::string(3 * kPiece, '-') + "\nend\n"));
  EXPECT_FALSE(Finds("regex:^-+x", std::string(3 * kPiece, '-') + "\nx\n"));
  const std::string huge(size_t{64} << 10, 'q');
  EXPECT_TRUE(Finds(huge, std::string(kPiece - 1, '-') + huge)) << "as long as a pattern may be";
}

// So are the parts that the first piece is read in.
TEST_F(Contents, NothingIsLostInTheFirstBlock) {
  for (const size_t edge : {size_t{4} << 10, size_t{32} << 10}) {
    for (size_t at = edge - 7; at <= edge + 1; ++at) {
      for (const char* mark : {"", "\xef\xbb\xbf"}) {
        const std::string content = mark + std::string(at, '-') + "needle";
        EXPECT_TRUE(Finds("regex:^-*needle$", content)) << at;
        EXPECT_TRUE(Finds("needle", content + std::string(edge, '-'))) << at;
      }
    }
  }
}

TEST_F(Contents, LiteralAgainstPlainSearch) {
  std::mt19937 random(7);
  int found = 0;
  for (int round = 0; round < 20'000; ++round) {
    const auto letters = [&random](size_t count) {
      std::string text;
      while (text.size() < count) text.push_back("abAB@`["[random() % 7]);
      return text;
    };
    const std::string needle = letters(1 + random() % 5);
    const std::string hay = std::string(random() % 150, 'z') + letters(random() % 70);
    const bool expected = AsciiLower(hay).find(AsciiLower(needle)) != std::string::npos;
    ASSERT_EQ(LiteralFinder(needle).Finds(hay), expected) << needle << " in " << hay;
    found += expected;
  }
  EXPECT_GT(found, 1'000);
}

// In another encoding a text grows when it is read, and what makes it foreign may come late.
TEST_F(Contents, OtherEncodingsAcrossPieces) {
  for (size_t at = kPiece - 4; at <= kPiece + 4; ++at) {
    EXPECT_TRUE(Finds("café", std::string(at, '-') + "caf\xe9")) << at;
    EXPECT_FALSE(Finds("cafe", std::string(at, '-') + "caf\xe9")) << at;
    EXPECT_TRUE(Finds("café", std::string(at, '-') + "caf\xc3\xa9 \xff")) << at;
    std::string wide = "\xff\xfe";
    for (size_t count = 0; count < at / 3; ++count) wide += "\x2c\x67";  // three bytes in UTF-8
    EXPECT_TRUE(Finds("本é", wide + "\xe9" + std::string(1, '\0'))) << at;
  }
}

TEST_F(Contents, FirstLine) {
  using std::string_literals::operator""s;
  constexpr size_t kMost = 24;
  const std::string blank(3 * kPiece, '\n');
  const struct {
    std::string pattern, content;
    std::uint64_t number;
    std::string text;  // what is marked in brackets
  } rows[] = {
      {"needle", "hay\nA Needle, needles\r\nneedle", 2, "A [Needle], [needle]s"},
      {"needle", "hay", 0, ""},
      {"one two", "x\nan aone\ntwo", 2, "an a[one]"},
      {"aab baa !c", "aabaa", 1, "[aabaa]"},
      {"regex:^b.d$", "bed \nbad", 2, "[bad]"},
      {"regex:a\\sb", "xa\nb", 1, "x[a]"},
      {"regex:(?=b)", "ab", 1, "a[]b"},
      {"needle", blank + "needle", 3 * kPiece + 1, "[needle]"},
      {"end", std::string(30, 'x') + "the end" + std::string(30, 'y'), 1,
       "…xxthe [end]yyyyyyyyyyyyyyy…"},
      {"end", std::string(3 * kPiece, 'x') + " end", 1, "…xxxxx [end]"},
      {"é", "\n\ncaf\xe9", 3, "caf[é]"},
      {"é", "\xff\xfe\n\0c\0a\0\xe9\0"s, 2, "ca[é]"},
  };
  for (const auto& row : rows) {
    const auto query = ContentQuery::From(Query::Parse(row.pattern)->root(), true);
    std::ofstream(folder_ + "/file", std::ios::binary) << row.content;
    const auto line = ContentScanner(*query, stop_).FirstLine(fd_.get(), "file", kMost);
    EXPECT_EQ(line ? line->number : 0, row.number) << row.pattern;
    if (!line) continue;
    std::string text = line->text;
    for (auto mark = line->marks.rbegin(); mark != line->marks.rend(); ++mark) {
      text.insert(mark->first + mark->second, "]");
      text.insert(mark->first, "[");
    }
    EXPECT_EQ(text, row.text) << row.pattern;
  }
}

// What is found is told by the reading that found it: a pipe can be read but once.
TEST_F(Contents, FirstLineReadsOnce) {
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
  const UniqueFd out(ends[0]);
  ASSERT_EQ(write(ends[1], "hay\none\ntwo", 11), 11);
  close(ends[1]);
  const auto query = ContentQuery::From(Query::Parse("two one")->root(), true);
  const auto line = ContentScanner(*query, stop_).FirstLine(out.get(), 100);
  ASSERT_TRUE(line);
  EXPECT_EQ(line->number, 2U);
}

// As grep prints them: "12:" before a line that matches, "11-" before another.
TEST_F(Contents, EachLineWithThoseAround) {
  const std::string far(3 * kPiece, '\n');
  const std::string number = std::to_string(3 * kPiece + 1);
  const struct {
    const char* why;
    std::string pattern, content;
    size_t before, after;
    std::string told;
  } rows[] = {
      {"each line once", "a", "a a\nb\nA\n", 0, 0, "1:a a|3:A|"},
      {"none", "x", "a\nb\n", 1, 1, ""},
      {"around", "x", "a\nb\nx\nc\nd\n", 1, 1, "2-b|3:x|4-c|"},
      {"those of two overlap", "x", "a\nx\nb\nx\nc", 2, 2, "1-a|2:x|3-b|4:x|5-c|"},
      {"at the edges", "x", "x\r\nx", 2, 2, "1:x|2:x|"},
      {"lines of the piece before", "x", far + "x", 1, 0,
       std::to_string(3 * kPiece) + "-|" + number + ":x|"},
      {"far away", "x", far + "x\n" + far + "x", 0, 0,
       number + ":x|" + std::to_string(6 * kPiece + 2) + ":x|"},
      {"any of the texts, where all are there", "x y", "x\nb\ny", 0, 0, "1:x|3:y|"},
      {"one text is missing", "x y", "x\nb", 0, 0, ""},
      {"what must not be there", "x !y", "x\nb", 0, 0, "1:x|"},
      {"an expression", "regex:^b$", "ab\nb\nb", 0, 0, "2:b|3:b|"},
      {"an expression over an end of a line", "regex:a\\sb", "a\nb\n", 0, 0, "1:a|"},
      {"another encoding", "\u00e9", "a\nb\xe9\nc", 1, 0, "1-a|2:b\u00e9|"},
      {"no text", "x", std::string("x\n\0", 3), 0, 0, ""},
      {"a line longer than a piece", "x", std::string(3 * kPiece, 'b') + "x\nx", 0, 0, ""},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.why);
    const auto query = ContentQuery::From(Query::Parse(row.pattern)->root(), true);
    std::ofstream(folder_ + "/file", std::ios::binary) << row.content;
    std::string told;
    const auto tell = [&](const MatchingLine& line, bool matches) {
      told += std::to_string(line.number) + (matches ? ":" : "-") + line.text.substr(0, 9) + "|";
      return true;
    };
    ContentScanner(*query, stop_).EachLine(fd_.get(), "file", {100, row.before, row.after}, tell);
    if (row.content.size() > 3 * kPiece && row.content[0] == 'b') {
      EXPECT_TRUE(told.ends_with("|2:x|")) << told;
    } else {
      EXPECT_EQ(told, row.told);
    }
  }
}

TEST_F(Contents, StopsAndFails) {
  stop_ = 1;
  EXPECT_EQ(Scan("x", "x"), ContentScanner::Outcome::kStopped);
  stop_ = 0;
  std::filesystem::remove(folder_ + "/file");
  std::filesystem::create_symlink("/etc/passwd", folder_ + "/file");
  const auto query = ContentQuery::From(Query::Parse("root")->root(), true);
  EXPECT_EQ(ContentScanner(*query, stop_).Scan(fd_.get(), "file"), ContentScanner::Outcome::kFailed)
      << "links are not followed";
}

TEST_F(Contents, CandidatesComeBackWhole) {
  CandidateList list(folder_);
  std::map<std::string, std::string> expected;
  for (int i = 0; i < 3'000; ++i) {
    const std::string folder = "folder " + std::to_string(i);
    std::string names;
    for (int k = 0; k <= i % 64; ++k) names.append(std::string(30, 'n')).push_back('\0');
    list.Add(static_cast<std::uint16_t>(i % 5), folder, names);
    expected[folder] = names;
  }
  CandidateList::Record record;
  while (list.Take(record)) {
    EXPECT_EQ(record.names, expected[std::string(record.folder_path)]);
    expected.erase(std::string(record.folder_path));
  }
  EXPECT_TRUE(expected.empty());
}

}  // namespace
}  // namespace nas
