// The query language: what each query finds in one small tree, how values are read, and what is
// refused in which words.

#include <gtest/gtest.h>

#include <algorithm>
#include <ctime>
#include <optional>
#include <random>
#include <string>

#include "nas/match/meant_query.h"
#include "nas/match/near_text.h"
#include "nas/match/query.h"
#include "nas/match/query_match.h"
#include "nas/match/query_values.h"

namespace nas {
namespace {

constexpr std::int64_t kDay = 24 * 60 * 60;
constexpr std::time_t kNow = 1'784'548'800;  // Monday, 2026-07-20 12:00 UTC

class Queries : public testing::Test {
 protected:
  Queries() {
    setenv("TZ", "UTC", 1);
    tzset();
  }

  // Below "/photo/trip", the folder that is searched; a folder's path ends with "/".
  struct File {
    std::string path;
    std::int64_t size = 0;
    std::int64_t days_old = 0;  // since it was modified
    std::uint32_t uid = 0;
    bool empty_folder = false;
  };

  static bool Finds(const Query& query, const File& file) {
    const bool is_folder = file.path.ends_with('/');
    const std::string path = file.path.substr(0, file.path.size() - (is_folder ? 1 : 0));
    const size_t slash = path.rfind('/');
    const std::string folder = slash == std::string::npos ? "" : "/" + path.substr(0, slash);
    const std::string name = path.substr(slash + 1);
    const std::string in_share = "trip" + folder;
    FoldedName folded;
    folded.Set(name);
    EntryPath entry_path;
    entry_path.SetBase({"/photo/trip", "/volume1/photo/trip", "trip"});
    entry_path.SetFolder(in_share);
    entry_path.SetEntry(name, is_folder);
    const QueryAttributes attributes{
        .size = file.size, .modified = kNow - file.days_old * kDay, .uid = file.uid};
    const std::function<bool()> is_empty = [&file] { return file.empty_folder; };
    QuerySubject subject;
    subject.name = &folded;
    subject.path = &entry_path;
    subject.is_folder = is_folder;
    subject.is_file = !is_folder;
    subject.whole_way = true;
    // What is known of the name alone may leave a question open, but is never taken back.
    const Answer early = Ask(query.root(), subject);
    subject.attributes = &attributes;
    subject.is_empty_folder = &is_empty;
    const Answer answer = Ask(query.root(), subject);
    EXPECT_NE(answer, Answer::kMaybe) << file.path;
    EXPECT_TRUE(early == Answer::kMaybe || early == answer) << file.path;
    return answer == Answer::kYes;
  }

  static std::string Found(const std::string& text, const std::vector<File>& files) {
    const auto query = Query::Parse(text, kNow);
    if (!query) return query.error().path;
    std::string found;
    for (const File& file : files) {
      if (Finds(*query, file)) found += (found.empty() ? "" : " ") + file.path;
    }
    return found;
  }

  const std::vector<File> tree_ = {
      {"a.jpg", 0, 0},
      {"b.JPG", 1024, 1},
      {"c.png", 1025, 6},
      {"d.pdf", 1'500'000, 7, 1},
      {"e.tar.gz", std::int64_t{3} << 30, 40, 1},
      {"src/", 4096, 3},
      {"src/test_1.py", 10, 29},
      {"src/lib/", 4096, 500, 0, true},
      {"src/lib/x/test_2.py", 10, 30},
      {"other/src/test_3.py", 10, 365},
      {"Caf\u00e9.txt", 5, 20'000},
  };
};

TEST_F(Queries, Table) {
  const std::string everything = Found("", tree_);
  const struct {
    const char *query, *found, *why;
  } rows[] = {
      // Groups.
      {"<a jpg>|png", "a.jpg c.png", "a group is one side of a bar"},
      {"<a|b jpg>", "a.jpg b.JPG", ""},
      {"!<a jpg> jpg", "b.JPG", "a group can be left out"},
      {"<<a>|<b !pdf>> jpg", "a.jpg b.JPG", "groups within groups"},
      {"< a jpg > | png", "a.jpg c.png", "with spaces"},
      {"<a jpg>|", "a.jpg", ""},
      {"<\"\"> a.jpg", "a.jpg", "a group of nothing asks nothing"},
      {"<size:>1k jpg>|<regex:^c\\.>", "c.png",
       "a value may begin with the sign that ends a group"},
      // Braces and backslashes.
      {"?.{jpg,png}", "a.jpg b.JPG c.png", ""},
      {"{a,c}.{jpg,png}", "a.jpg c.png", "each with each"},
      {"{?{.pdf,.png},a*}", "a.jpg c.png d.pdf", "braces within braces"},
      {"\\*.jpg", "", "a star that is meant"},
      // Paths.
      {"src/test", "src/test_1.py other/src/test_3.py", "anywhere in the path"},
      {"!/ py", "", "every path has one"},
      {"src/", "src/ src/test_1.py src/lib/ src/lib/x/test_2.py other/src/test_3.py",
       "a folder and what it holds"},
      {"/src/test", "src/test_1.py", "from the folder that is searched"},
      {"src/**/test_*.py", "src/test_1.py src/lib/x/test_2.py other/src/test_3.py",
       "folders in between, or none"},
      {"/src/**/test_*.py", "src/test_1.py src/lib/x/test_2.py", ""},
      {"src/*.py", "src/test_1.py other/src/test_3.py", "a star ends with its name"},
      {"src/*/", "src/lib/", "a slash at the end is a folder's"},
      {"src/**", "src/test_1.py src/lib/ src/lib/x/test_2.py other/src/test_3.py", ""},
      {"{lib,other}/**/*.py", "src/lib/x/test_2.py other/src/test_3.py", ""},
      {"/photo/trip/src/test_1.py", "src/test_1.py", "a path of a share, as it is pasted"},
      {"/volume1/photo/trip/src/test_1.py", "src/test_1.py", "and one of the disk"},
      {"/photo/trip/s*/*.py", "src/test_1.py", ""},
      {"/photo/tr", "", "a part of the folder's own name"},
      {"\"/photo/trip/src/test_1.py\"", "src/test_1.py", ""},
      {"!src/ py", "", ""},
      // Prefixes.
      {"ext:jpg,.png", "a.jpg b.JPG c.png", "several values"},
      {"EXT:*.tar.gz", "e.tar.gz", "in any case"},
      {"!ext:jpg,png,py,txt type:file", "d.pdf e.tar.gz", ""},
      {"ext:png|<ext:jpg size:0>", "a.jpg c.png", ""},
      {"type:photos,document !py", "a.jpg b.JPG c.png d.pdf Caf\u00e9.txt", ""},
      {"type:dir", "src/ src/lib/", ""},
      {"type:Folders", "src/ src/lib/", ""},
      {"size:>1kb", "c.png d.pdf e.tar.gz", "more than that"},
      {"size:>=1kb size:<1mb", "b.JPG c.png", ""},
      {"size:1kb..1025", "b.JPG c.png", "both ends belong to it"},
      {"size:..5 type:file", "a.jpg Caf\u00e9.txt", ""},
      {"size:1kb", "b.JPG c.png", "what is shown as that"},
      {"size:1024", "b.JPG", "bytes are exact"},
      {"size:0,3GB", "a.jpg e.tar.gz", ""},
      {"size:>1 GB", "e.tar.gz", "a unit of its own"},
      {"size:>2 gz", "e.tar.gz", "a word that is no unit"},
      {"modified:today", "a.jpg", ""},
      {"modified:yesterday", "b.JPG", ""},
      {"modified:last-7-days", "a.jpg b.JPG c.png src/", "today is one of the seven"},
      {"modified:7d", "a.jpg b.JPG c.png d.pdf src/", "seven times 24 hours"},
      {"modified:\"last 30 days\" py", "src/test_1.py", "thirty days and not 31"},
      {"modified:last 30 days py", "src/test_1.py", ""},
      {"modified:2026-07-20,2026-07-19", "a.jpg b.JPG", ""},
      {"modified:2026-06 !other", "e.tar.gz src/test_1.py src/lib/x/test_2.py", "a month"},
      {"modified:<2026-06", "src/lib/ other/src/test_3.py Caf\u00e9.txt", "before it begins"},
      {"modified:>2026-07-18", "a.jpg b.JPG", "after it ends"},
      {"modified:30 days ago..29 days ago", "src/test_1.py src/lib/x/test_2.py", ""},
      {"modified:<1 year ago", "src/lib/ Caf\u00e9.txt", "a day is not yet before itself"},
      {"modified:..1970 other|txt", "", "before there were seconds"},
      {"created:today", "", "a time that is not recorded"},
      {"owner:1", "d.pdf e.tar.gz", "a number"},
      {"owner:root py", "src/test_1.py src/lib/x/test_2.py other/src/test_3.py", ""},
      {"owner:root,1 gz", "e.tar.gz", ""},
      {"depth:1 ext:py", "", ""},
      {"depth:>2", "src/lib/x/test_2.py other/src/test_3.py", ""},
      {"depth:2..3 py", "src/test_1.py other/src/test_3.py", ""},
      {"empty:", "a.jpg src/lib/", "files without bytes, folders without entries"},
      {"empty:no type:dir", "src/", ""},
      {"case:JPG", "b.JPG", ""},
      {"case:*.jpg|case:\"c.p\"", "a.jpg c.png", ""},
      {"case:regex:^[A-Z]", "Caf\u00e9.txt", ""},
      {"regex:\"^a|^b\" jpg", "a.jpg b.JPG", "in quotes it is one term"},
      {"regex:jpg ", "a.jpg b.JPG", "a space that came by itself"},
      // Accents.
      {"cafe", "Caf\u00e9.txt", ""},
      {"CAFE.*", "Caf\u00e9.txt", ""},
      {"caf\u00e9", "Caf\u00e9.txt", ""},
      {"caf\u00e8", "", "another accent"},
      {"case:cafe", "", ""},
      // What is left out, wherever it stands and with all that is in it.
      {"exclude:*.py py", "", ""},
      {"exclude:lib,OTHER py", "src/test_1.py", "whole names, in any letter case"},
      {"exclude:tes? py", "src/test_1.py src/lib/x/test_2.py other/src/test_3.py", ""},
      {"exclude:/src py", "other/src/test_3.py", "from the folder that is searched"},
      {"exclude:src/lib py", "src/test_1.py other/src/test_3.py", "so too with one inside"},
      {"exclude:**/src/*.py py", "src/lib/x/test_2.py", ""},
      {"exclude:src/** src", "src/", "what is below, not the folder"},
      {"exclude:*/ type:file !jpg !p", "e.tar.gz Caf\u00e9.txt", "folders alone"},
      {"exclude:{a,c}.*,\"?.pdf\" ?.*", "b.JPG e.tar.gz", "several values, and braces"},
      {"exclude:\"a\\,b\",cafe* jp", "a.jpg b.JPG", "a comma that is meant"},
      {"jpg exclude:a.jpg", "b.JPG", "anywhere in the query"},
      {"hidden:no jpg", "a.jpg b.JPG", ""},
      // Which letters count.
      {"letters:exact jpg", "a.jpg", ""},
      {"*.JPG letters:exact", "b.JPG", "wherever it stands"},
      {"letters:smart jpg", "a.jpg b.JPG", ""},
      {"letters:smart JPG|png", "b.JPG c.png", "each word by itself"},
      {"letters:smart \u00c9.|a.j", "a.jpg", "capitals of every script"},
      {"letters:smart regex:\\S\\.jpg$", "a.jpg b.JPG", "not those of escapes"},
      {"letters:exact exclude:B.* jpg|JPG", "a.jpg b.JPG", "of what is left out too"},
      {"letters:exact letters:any JPG", "a.jpg b.JPG", "the last counts"},
      // What is only a name.
      {"\"ext:jpg\"", "", ""},
      {"note:jpg", "", "an unknown word before a colon"},
      {"<a jpg", "", "a group that nothing closes"},
      {"c.png>", "", ""},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(Found(row.query, tree_), row.found) << "«" << row.query << "» " << row.why;
  }
  EXPECT_EQ(everything.size(), Found("!nothing", tree_).size());
}

TEST_F(Queries, AreRefusedInWords) {
  const struct {
    const char *query, *says;
  } rows[] = {
      {"a size:>1xb", "'size:>1xb': write a size as in size:>10MB"},
      {"size:", "'size:': write a size"},
      {"!size:5..3", "'!size:5..3': it ends before it begins; write 3..5"},
      {"size:1kb,", "write a size"},
      {"modified:sometime", "'modified:sometime': write a time as in today"},
      {"modified:<modified:today>", "write a time"},
      {"opened:2026-02-30", "write a time"},
      {"opened:5", "write a time"},
      {"created:>", "write a time"},
      {"modified:99999999999999999999d", "write a time"},
      {"type:song", "'type:song': there are file, dir, link, executable"},
      {"owner:nob0dy", "'owner:nob0dy': there is no user 'nob0dy'"},
      {"group:\"no such\"", "there is no group 'no such'"},
      {"depth:deep", "write a number of levels"},
      {"exclude:", "write names, as in exclude:node_modules"},
      {"exclude:a,,b", "write names"},
      {"hidden:sometimes", "write hidden:no"},
      {"letters:big", "write letters:exact"},
      {"!exclude:a", "'!exclude:a': exclude:, hidden:, "},
      {"a|hidden:no b", "'a|hidden:no': exclude:, "},
      {"<a exclude:b> c", "'<a exclude:b>': exclude:, "},
      {"<letters:exact b>", "hold for the whole search"},
      {"empty:maybe", "it takes no value, or yes or no"},
      {"ext:,", "write extensions"},
      {"content: a", "'content:': write a text"},
      {"case:", "'case:': write a name"},
      {"<a regex:\"(\">", "'regex:\"(\"': missing closing parenthesis"},
      {"{a,b}{a,b}{a,b}{a,b}{a,b}{a,b}{a,b}{a,b}{a,b}", "stands for too many names"},
  };
  for (const auto& row : rows) {
    const auto query = Query::Parse(row.query, kNow);
    ASSERT_FALSE(query) << row.query;
    EXPECT_NE(query.error().path.find(row.says), std::string::npos) << query.error().path;
  }
  EXPECT_EQ(Query::Parse("owner:nob0dy").error().kind, kErrorUnknownUser);
}

TEST_F(Queries, HostileOnesEnd) {
  const auto repeated = [](const std::string& text, size_t count) {
    std::string all;
    while (count-- > 0) all += text;
    return all;
  };
  const size_t most = Query::kMostBytes;
  EXPECT_FALSE(Query::Parse(repeated("<a ", 40) + repeated(">", 40)));
  EXPECT_TRUE(Query::Parse(repeated("<a ", 32) + repeated(">", 32)));
  for (const std::string& text :
       {std::string(most, '<'), std::string(most, '{'), std::string(most, '['),
        std::string(most, '\\'), std::string(most, '"'), repeated("<a|", most / 3),
        repeated("modified:2 ", most / 11), repeated("{a,", most / 3),
        "{a,b}" + std::string(most - 10, '['), "*/" + repeated("**/", most / 3 - 1),
        repeated("!<", most / 2), repeated("ext:a,", most / 6)}) {
    const auto query = Query::Parse(text, kNow);
    if (query) Finds(*query, {repeated("aa/", 80) + std::string(255, 'a')});
  }
  EXPECT_EQ(Found(repeated("**/a*/", 400) + "b", {{repeated("aa/", 1000) + "c"}}), "");
}

// Days as a person counts them, also where a day has not 24 hours and a month not 31 days.
TEST_F(Queries, Times) {
  const auto at = [](const char* text) {
    std::tm local = {};
    strptime(text, "%Y-%m-%d %H:%M:%S", &local);
    local.tm_isdst = -1;
    return static_cast<std::int64_t>(std::mktime(&local));
  };
  setenv("TZ", "Europe/Berlin", 1);
  tzset();
  const std::int64_t now = at("2026-03-31 10:00:00");  // a Tuesday
  constexpr const char* kOpen = "";
  const struct {
    const char *text, *from, *to;
  } rows[] = {
      {"2026", "2026-01-01 00:00:00", "2026-12-31 23:59:59"},
      {"2024-02", "2024-02-01 00:00:00", "2024-02-29 23:59:59"},
      {"2026-03-29", "2026-03-29 00:00:00", "2026-03-29 23:59:59"},
      {"2026-03-31T09:30", "2026-03-31 09:30:00", "2026-03-31 09:30:59"},
      {"today", "2026-03-31 00:00:00", kOpen},
      {"Yesterday", "2026-03-30 00:00:00", "2026-03-30 23:59:59"},
      {"this-week", "2026-03-30 00:00:00", kOpen},
      {"last week", "2026-03-23 00:00:00", "2026-03-29 23:59:59"},
      {"last_month", "2026-02-01 00:00:00", "2026-02-28 23:59:59"},
      {"this-month", "2026-03-01 00:00:00", kOpen},
      {"this-year", "2026-01-01 00:00:00", kOpen},
      {"last-year", "2025-01-01 00:00:00", "2025-12-31 23:59:59"},
      {"before-last-year", kOpen, "2024-12-31 23:59:59"},
      {"last-1-day", "2026-03-31 00:00:00", kOpen},
      {"last-30-days", "2026-03-02 00:00:00", kOpen},
      {"last-2-weeks", "2026-03-18 00:00:00", kOpen},
      {"last-12-months", "2025-03-31 00:00:00", kOpen},
      {"1 month ago", "2026-02-28 00:00:00", "2026-02-28 23:59:59"},
      {"2-weeks-ago", "2026-03-17 00:00:00", "2026-03-17 23:59:59"},
      {"7d", "2026-03-24 09:00:00", kOpen},
      {"90 minutes", "2026-03-31 08:30:00", kOpen},
      {"last 2 hours", "2026-03-31 08:00:00", kOpen},
      {"1y", "2025-03-31 10:00:00", kOpen},
  };
  for (const auto& row : rows) {
    const auto value = ReadTime(row.text, now);
    ASSERT_TRUE(value) << row.text;
    EXPECT_EQ(value->alone.from, *row.from == '\0' ? Bounds::kLeast : at(row.from)) << row.text;
    EXPECT_EQ(value->alone.to, *row.to == '\0' ? Bounds::kMost : at(row.to)) << row.text;
  }
  for (const char* text : {"", "-", "2026-13", "26-01-01", "2026-01-01T12", "last-0-days", "0000",
                           "ago", "3 ago", "99999999 years ago", "next-week", "3 dys"}) {
    EXPECT_FALSE(ReadTime(text, now)) << text;
  }
}

// As they are typed, in fields of a form too.
TEST_F(Queries, TypedSizes) {
  const std::pair<const char*, std::optional<std::int64_t>> rows[] = {
      {"0", 0},
      {"500", 500},
      {"20 kb", 20480},
      {"1.5G", 1610612736},
      {"1,5 GB", 1610612736},
      {".5k", 512},
      {"3 MiB", 3145728},
      {"7 B", 7},
      {"1tb", 1099511627776},
      {"1.5.2k", std::nullopt},
      {"1 xb", std::nullopt},
      {"-1", std::nullopt},
      {"k", std::nullopt},
  };
  for (const auto& [text, bytes] : rows) {
    const auto size = ReadSize(text);
    EXPECT_EQ(size ? std::optional(size->span.from) : std::nullopt, bytes) << text;
  }
}

TEST_F(Queries, TypedDays) {
  setenv("TZ", "Europe/Berlin", 1);  // clocks changed on 2026-03-29
  tzset();
  const auto midnight = [](const std::string& day) {
    return day.empty() ? std::nullopt : std::optional(ReadTime(day, kNow)->span.from);
  };
  const std::time_t now = *midnight("2026-03-31") + 12 * 60 * 60;
  const struct {
    const char* text;
    const char* from;  // days; null where it cannot be read
    const char* to;
  } rows[] = {
      {"today", "2026-03-31", ""},
      {"yesterday", "2026-03-30", "2026-03-31"},
      {"last-7-days", "2026-03-25", ""},
      {"last-30-days", "2026-03-02", ""},
      {"last-12-months", "2025-03-31", ""},
      {"this-year", "2026-01-01", ""},
      {"last-year", "2025-01-01", "2026-01-01"},
      {"before-last-year", "", "2025-01-01"},
      {"2026-03-01..2026-03-29", "2026-03-01", "2026-03-30"},
      {"2024-02-29..", "2024-02-29", ""},
      {"..2026-03-29", "", "2026-03-30"},
      {"2026-02-30..", nullptr, nullptr},
      {"sometime", nullptr, nullptr},
  };
  for (const auto& row : rows) {
    const auto time = ReadBounds(row.text, [now](std::string_view t) { return ReadTime(t, now); });
    ASSERT_EQ(time.has_value(), row.from != nullptr) << row.text;
    if (!time) continue;
    EXPECT_EQ(time->from, midnight(row.from).value_or(Bounds::kLeast)) << row.text;
    const auto end = midnight(row.to);
    EXPECT_EQ(time->to, end ? *end - 1 : Bounds::kMost) << row.text;
  }
}

// By the habits of other programs.
TEST_F(Queries, AsTheyWereMeant) {
  const std::pair<const char*, const char*> rows[] = {
      {"size > 1gb", "size:>1gb"},
      {"a size >1 gb", "a size:>1 gb"},
      {"modified = today", "modified:today"},
      {"date:2019 report", "modified:2019 report"},
      {"name:report", "report"},
      {"extension:pdf kind:dir", "ext:pdf type:dir"},
      {"modifed:today", "modified:today"},
      {"*.png;*.jpg", "*.png|*.jpg"},
      {"report OR budget NOT draft", "report|budget !draft"},
      {"report AND 2026", "report 2026"},
      {"-draft", "!draft"},
      {"dir\\file", "dir/file"},
      {"./a file:///b/c", "/a /b/c"},
      {"'exact words' x", "\"exact words\" x"},
      {"[draft]", "\"[draft]\""},
      {"a -draft[1]", "a !\"draft[1]\""},
      // What says nothing else, or what nobody can tell.
      {"plan  ext:pdf", ""},
      {"note:x", ""},
      {"\"a OR b\"", ""},
      {"OR", ""},
      {"regex:a OR b", ""},
      {"date:ever", ""},
      {"*[ab]\\*", ""},
      {"", ""},
  };
  for (const auto& [query, meant] : rows) EXPECT_EQ(MeantQuery(query), meant) << query;
}

// Against the table that the distance is defined by.
TEST(NearText, IsTheLeastDistanceToAnyPart) {
  std::mt19937 random(3);
  const auto letters = [&random](size_t count) {
    std::string text;
    while (text.size() < count) text.push_back("abc"[random() % 3]);
    return text;
  };
  for (int round = 0; round < 3'000; ++round) {
    const std::string word = letters(1 + random() % NearText::kLongest);
    const std::string text = letters(random() % 90);
    std::vector<size_t> column(word.size() + 1);
    for (size_t i = 0; i <= word.size(); ++i) column[i] = i;
    size_t least = word.size();
    for (const char c : text) {
      size_t diagonal = 0;
      for (size_t i = 1; i <= word.size(); ++i) {
        const size_t changed = diagonal + (word[i - 1] == c ? 0 : 1);
        diagonal = column[i];
        column[i] = std::min({changed, column[i] + 1, column[i - 1] + 1});
      }
      least = std::min(least, column.back());
    }
    ASSERT_EQ(NearText(word).Distance(text), least) << word << " in " << text;
  }
}

}  // namespace
}  // namespace nas
