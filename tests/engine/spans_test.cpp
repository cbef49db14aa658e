// What a person is told of a query while they type: places, meanings, errors, and what may come
// next.

#include <gtest/gtest.h>

#include <string>

#include "nas/match/query.h"
#include "nas/match/query_spans.h"

namespace nas {
namespace {

constexpr std::time_t kNow = 1'784'548'800;  // Monday, 2026-07-20 12:00 UTC

class Spans : public testing::Test {
 protected:
  Spans() {
    setenv("TZ", "UTC", 1);
    tzset();
  }

  // "kind(prefix:|value)" each, with "+" where it has to hold by itself, "~" where it is open, and
  // "!" where it is wrong.
  static std::string Told(const std::string& query) {
    static constexpr const char* kKinds[] = {"text", "phrase", "regex", "prefix", "sign", "group"};
    std::string told;
    size_t behind = 0;
    for (const QuerySpan& span : SpansOf(query, kNow)) {
      EXPECT_LE(behind, span.begin) << query;
      EXPECT_LE(span.begin, span.value) << query;
      EXPECT_LE(span.value, span.end) << query;
      EXPECT_LE(span.end, query.size()) << query;
      behind = span.end;
      told += (told.empty() ? "" : " ") + std::string(kKinds[static_cast<int>(span.kind)]) + "(";
      told += query.substr(span.begin, span.value - span.begin);
      told +=
          (span.value > span.begin ? "|" : "") + query.substr(span.value, span.end - span.value);
      told += std::string(")") + (span.alone ? "+" : "") + (span.open ? "~" : "");
      told += span.wrong.empty() ? "" : "!";
    }
    return told;
  }

  static std::string Says(const std::string& query) {
    std::string said;
    for (const QuerySpan& span : SpansOf(query, kNow)) {
      said += (said.empty() ? "" : " / ") + (span.wrong.empty() ? span.says : "! " + span.wrong);
    }
    return said;
  }
};

TEST_F(Spans, StandWhereTheTermsDo) {
  const struct {
    const char *query, *told, *why;
  } rows[] = {
      {"", "", ""},
      {"  oslo  2026 ", "text(oslo)+ text(2026)+", "blanks lie in none"},
      {"a|b !c", "text(a) sign(|) text(b) sign(!) text(c)", ""},
      {"a | b", "text(a) sign(|) text(b)", ""},
      {"!", "text(!)+", "a mark before nothing is text"},
      {"\"a b\" \"open end", "phrase(\"a b\")+ phrase(\"open end)+~", "a quote that is not closed"},
      {"\"\" x", "phrase(\"\")+ text(x)+", "nothing in quotes"},
      {"size:>1k ext:a,b", "prefix(size:|>1k)+ prefix(ext:|a,b)+", ""},
      {"SIZE:1xb x", "prefix(SIZE:|1xb)+! text(x)+", "what is wrong with one is no other's"},
      {"modified:2 weeks ago x", "prefix(modified:|2 weeks ago)+ text(x)+", "words that go on"},
      {"owner:\"no body", "prefix(owner:|\"no body)+~!", ""},
      {"content:\"a b\" case:X content:regex:a b",
       "prefix(content:|\"a b\")+ prefix(case:|X)+ prefix(content:regex:|a b)+~", ""},
      {"a regex:^b c", "text(a)+ regex(regex:|^b c)+~", "it takes the rest"},
      {"regex:\"^b c\" d", "regex(regex:|\"^b c\")+ text(d)+", ""},
      {"regex:", "regex(regex:|)+~", "as it is being typed"},
      {"size:", "prefix(size:|)+!", ""},
      {"!<a size:1k>|c d",
       "sign(!) group(<) text(a) prefix(size:|1k) group(>) sign(|) text(c) text(d)+", ""},
      {"<a b", "text(<a)+ text(b)+", "a group that is not closed is none"},
      {"exclude:\"a b\",c|x hidden:no",
       "prefix(exclude:|\"a b\",c)! sign(|) text(x) prefix(hidden:|no)+",
       "what holds for all, beside a bar"},
      {"!hidden:no", "sign(!) prefix(hidden:|no)!", ""},
      {"<a hidden:no>", "group(<) text(a) prefix(hidden:|no)! group(>)", ""},
      {"\xf0\x9f\x98\x80 a", "text(\xf0\x9f\x98\x80)+ text(a)+", "an emoji"},
      {"\xff\xfe b", "text(\xff\xfe)+ text(b)+", "no UTF-8"},
      {"note:x", "text(note:x)+", "no prefix"},
  };
  for (const auto& row : rows) EXPECT_EQ(Told(row.query), row.told) << row.query << row.why;
  EXPECT_EQ(Told(std::string("a\0b", 3)), "");
  EXPECT_EQ(Told(std::string(Query::kMostBytes + 1, 'a')), "");
  std::string many;
  for (size_t i = 0; i < kMostSpans; ++i) many += "a|";
  EXPECT_EQ(SpansOf(many, kNow).size(), kMostSpans);
}

// Whatever is cut off: the places stay within the text, and a query is wrong where a span or the
// whole is.
TEST_F(Spans, OfEveryBeginningOfAQuery) {
  const std::string query =
      "!<\"a b\"|size:>1k ext:a> owner:\"\xc3\xa9\" exclude:{a,b},c modified:>2 weeks ago "
      "regex:^(a) b";
  for (size_t end = 0; end <= query.size(); ++end) {
    const std::string text = query.substr(0, end);
    const bool wrong = Told(text).find(")!") != std::string::npos ||
                       Told(text).find("+!") != std::string::npos ||
                       Told(text).find("~!") != std::string::npos;
    EXPECT_EQ(wrong, !Query::Parse(text, kNow)) << text;
  }
}

TEST_F(Spans, SayWhatATermWasUnderstoodToAskFor) {
  const struct {
    const char *query, *says;
  } rows[] = {
      {"oslo", "“oslo” in the name"},
      {"!oslo", "leaves out what follows / not: “oslo” in the name"},
      {"*.{a,b}", "a name like *.{a,b}"},
      {"a/b", "“a/b” in the path"},
      {"case:A", "“A” in the name, capitals as written"},
      {"content:a", "“a” inside the file"},
      {"regex:^a", "a name that matches ^a"},
      {"regex:(", "! missing closing parenthesis at character 1"},
      {"ext:jpg,.png", "a name that ends in .jpg or .png"},
      {"type:image,dir,x", "executable, picture or folder"},
      {"size:>1MB", "more than 1 MB"},
      {"size:>=1.5MB", "1.5 MB or more"},
      {"size:<1k", "less than 1 KB"},
      {"size:..10k", "up to 10 KB"},
      {"size:1KB..2GB", "1 KB to 2 GB"},
      {"size:10MB", "9.5 MB or more, and less than 10.5 MB"},
      {"size:0", "0 bytes"},
      {"size:1xb", "! write a size as in size:>10MB, size:1GB..2GB or size:0"},
      {"modified:today", "modified since 2026-07-20"},
      {"modified:last-7-days", "modified since 2026-07-14"},
      {"created:>2026", "created since 2027-01-01"},
      {"created:2026-01..2026-06", "created from 2026-01-01 to 2026-06-30"},
      {"opened:2026-07-20T10:15", "opened on 2026-07-20 10:15"},
      {"modified:<2026-07", "modified until 2026-06-30"},
      {"owner:root", "owned by root"},
      {"owner:nob0dy", "! there is no user 'nob0dy'"},
      {"depth:<3", "up to 2 levels down"},
      {"empty:", "with nothing in it"},
      {"empty:no", "with something in it"},
      {"exclude:a,*.b", "without a,*.b"},
      {"hidden:no", "without names that begin with a dot"},
      {"hidden:yes", "leaves nothing out"},
      {"letters:smart", "capitals count in words that have one"},
  };
  for (const auto& row : rows) EXPECT_EQ(Says(row.query), row.says) << row.query;
}

TEST_F(Spans, WhatCanBeWrittenNext) {
  const struct {
    const char* query;  // "^" is where one writes
    const char* told;   // what stands in its place, and what is offered of it
  } rows[] = {
      {"si^", "si: size:"},
      {"SI^", "SI: size:"},
      {"plan !mo^ x", "mo: modified: mounts:"},
      {"<ex^", "ex: ext: exclude:"},
      {"<ex^>", "ex: ext: exclude:"},
      {"si^ze", "size: size:"},
      {"plan^", ":"},
      {"size:^", ": >1MB >100MB >1GB <10KB 1MB..10MB 0"},
      {"type:im^", "im: image"},
      {"type:image,v^,dir", "v: video"},
      {"type:image^", ":"},
      {"hidden:^ x", ": no yes"},
      {"modified:last-1^", "last-1: last-12-months"},
      {"owner:roo^", "roo: root"},
      {"owner:\"roo^", "\"roo: root"},
      {"/ph^oto/x", "photo: (shares)"},
      {"/photo/^", ":"},
      {"\"si^\"", ":"},
      {"regex:si^", ":"},
      {"content:si^", ":"},
      {"a|^",
       ": ext: type: size: modified: created: opened: owner: group: content: exclude: depth: "
       "empty: hidden: ignored: mounts: letters: case: regex:"},
      {"\xf0\x9f\x98\x80 si^", "si: size:"},
  };
  for (const auto& row : rows) {
    std::string query = row.query;
    const size_t place = query.find('^');
    query.erase(place, 1);
    const QueryCompletion found = CompletionAt(query, place, kNow);
    std::string told = query.substr(found.begin, found.end - found.begin) + ":";
    if (found.of == QueryCompletion::Of::kNothing) told = ":";
    if (found.of == QueryCompletion::Of::kShare) told += " (shares)";
    for (const QueryCompletion::Item& item : found.items) told += " " + item.text;
    EXPECT_EQ(told, row.told) << row.query;
  }
  EXPECT_EQ(CompletionAt("size:", 5, kNow).items[0].about, "more than 1 MB");
  EXPECT_EQ(CompletionAt("si", 99, kNow).items[0].text, "size:");
}

}  // namespace
}  // namespace nas
