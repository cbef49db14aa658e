// What an index's names are told apart by, against asking each of them: it may let too much pass,
// never too little.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <utf8proc.h>

#include <algorithm>
#include <cstdlib>
#include <random>
#include <string>
#include <vector>

#include "nas/index/tree_scan.h"
#include "nas/match/folded_name.h"
#include "nas/match/query.h"
#include "nas/search/index_filter.h"
#include "tests/nas/fixture.h"

namespace nas {
namespace {

class Pieces {
 public:
  explicit Pieces(unsigned seed) : random_(seed) {}
  size_t Below(size_t count) { return random_() % count; }
  template <class All>
  std::string Some(const All& all, size_t most) {
    std::string text;
    for (size_t left = 1 + Below(most); left > 0; --left) text += all[Below(std::size(all))];
    return text;
  }

 private:
  std::mt19937 random_;
};

// What folds to other letters, to more of them or to ASCII, what composes, and what is no UTF-8.
constexpr const char* kInNames[] = {
    "a",
    "b",
    "B",
    "k",
    "K",
    "s",
    "S",
    "x",
    "Z",
    "1",
    "7",
    " ",
    ".",
    "-",
    "_",
    "i",
    "I",
    "ss",
    "fi",
    "\x01",
    "\n",
    "\u00e9",
    "e\u0301",
    "E\u0301",
    "\u00df",
    "\u1e9e",
    "\u212a",
    "\u017f",
    "\u0130",
    "\u0131",
    "\u01f0",
    "j\u030c",
    "H\u0331",
    "T\u0308",
    "\u0301",
    "\ufb01",
    "\u0149",
    "\u03b1",
    "\u0386",
    "\u0391\u0301",
    "\u0437",
    "\u0418\u0306",
    "\u0627",
    "\u0627\u0653",
    "\u05d0",
    "\u65e5",
    "\ud55c",
    "\u1112\u1161",
    "\u304b\u3099",
    "\xff",
    "\xc3",
    "\u0660",
    "\u00a0",
    "\U0001f600",
    "q\u0323\u0307",
};

constexpr const char* kInGlobs[] = {"*",     "*",       "*",      "?",    "a",
                                    "b",     "k",       "s",      "ss",   "i",
                                    "1",     "x",       "[a-k]",  "[!a]", "[\u00e9\u03b1]",
                                    "[0-9]", "\u00e9",  "\u00df", "e",    ".",
                                    "{a,s}", "{1?,*k}", "\\*",    "\xff", "\x01",
                                    "\u65e5"};
constexpr const char* kInExpressions[] = {
    "a",   "b",   "k",    "s",     "i",    "1",      "x",     ".",  ".*",   "\\w", "\\W", "\\d+",
    "\\D", "\\s", "\\S+", "[a-k]", "[^a]", "[^a-z]", "(a|s)", "k?", "s{2}", "\\b", "\\B", "[\\w.]"};

// Of the kinds that are run over all names at once, and of a few more.
std::string PatternOf(Pieces& pieces) {
  if (pieces.Below(2) == 0) return pieces.Some(kInGlobs, 5);
  const std::string begin = pieces.Below(4) == 0 ? "^" : "";
  const std::string end = pieces.Below(4) == 0 ? "$" : "";
  const std::string prefix = pieces.Below(8) == 0 ? "case:regex:" : "regex:";
  const std::string more = pieces.Below(6) == 0 ? " a" : "";
  return prefix + begin + pieces.Some(kInExpressions, 4) + end + more;
}

// Of one folder `tree`.
class IndexFilters : public nas_test::PlatformTest {
 protected:
  void SetUp() override {
    PlatformTest::SetUp();
    tree_ = dir_ + "/tree";
    ASSERT_EQ(mkdir(tree_.c_str(), S_IRWXU), 0);
  }
  Result<NameTable> Scan() const {
    const UniqueFd top(open(tree_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    const TablePlace place{AT_FDCWD, dir_ + "/table", "a test's"};
    if (const auto made = ScanTree({{top.get(), "tree"}}, place); !made) return made.error();
    return NameTable::Open(place.dir_fd, place.name, place.file_system);
  }
  std::string tree_;
};

// A query, and what an index's filter lets pass for it.
class Filtered {
 public:
  Filtered(const IndexSnapshot& snapshot, const Query& query)
      : comp_(query.root()), search_({&comp_}, nowhere_, never_) {
    const IndexFilter filter(snapshot, search_);
    const Location location;
    EntryFilter entries(filter, location);
    entries.Find(
        0, snapshot.table.folders(), [](NameTable::FolderId) { return ""; }, &found_);
    EXPECT_TRUE(std::ranges::is_sorted(found_));
  }
  bool Passes(NameTable::EntryId entry) const { return std::ranges::binary_search(found_, entry); }
  bool Matches(const QuerySubject& subject) const { return search_.Ask(subject) == Answer::kYes; }

 private:
  class : public RowSink {
    void Append(RowBlock& block) override { block.Clear(); }
  } nowhere_;
  const int never_ = 0;
  NodeComp comp_;
  const SharedSearch search_;
  std::vector<NameTable::EntryId> found_;
};

TEST_F(IndexFilters, LeaveOutNoNameThatMatches) {
  constexpr size_t kNames = 2'000;
  constexpr size_t kPatterns = 600;
  const char* const given = std::getenv("ARBORY_TEST_SEED");
  Pieces pieces(given != nullptr ? static_cast<unsigned>(std::atoi(given)) : 1);
  for (size_t i = 0; i < kNames; ++i) {
    const std::string path = tree_ + "/" + pieces.Some(kInNames, 7);
    const UniqueFd file(open(path.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, S_IRUSR | S_IWUSR));
  }
  const auto table = Scan();
  ASSERT_TRUE(table);
  const Changes changes;
  const IndexSnapshot snapshot{*table, changes, true};
  size_t matches = 0;
  size_t left_out = 0;
  for (size_t i = 0; i < kPatterns; ++i) {
    const std::string pattern = PatternOf(pieces);
    const auto query = Query::Parse(pattern);
    if (!query) continue;
    const Filtered filtered(snapshot, *query);
    FoldedName name;
    for (NameTable::EntryId entry = 0; entry < table->entries(); ++entry) {
      name.Set(table->name(entry));
      const bool match = filtered.Matches({.name = &name, .is_file = true});
      const bool passes = filtered.Passes(entry);
      ASSERT_LE(match, passes) << pattern << ": " << table->name(entry);
      matches += match ? 1 : 0;
      left_out += passes ? 0 : 1;
    }
  }
  EXPECT_GT(matches, kPatterns * kNames / 20);
  EXPECT_GT(left_out, kPatterns * kNames / 4);
}

// Sizes and times beside the ends of what a table's columns hold, and of what is asked for.
constexpr std::int64_t kSizes[] = {0,          1,          1000,       1001,
                                   4294967294, 4294967295, 4294967296, 6000000000};
constexpr std::int64_t kTimes[] = {-5000000000, -2147483649, -2147483648, -2147483647,
                                   -1,          0,           1000000000,  1000000001,
                                   2147483646,  2147483647,  2147483648,  5000000000};

// Several ends, or one.
std::string RangeOf(Pieces& pieces) {
  const bool of_size = pieces.Below(2) == 0;
  const auto some = [&] {
    return of_size ? kSizes[pieces.Below(std::size(kSizes))]
                   : std::max<std::int64_t>(kTimes[pieces.Below(std::size(kTimes))], 10000);
  };
  std::string range = of_size ? "size:" : pieces.Below(4) == 0 ? "created:" : "modified:";
  const std::int64_t one = some();
  const std::int64_t other = some();
  switch (pieces.Below(4)) {
    case 0:
      range += '>' + std::to_string(one);
      break;
    case 1:
      range += "<=" + std::to_string(one);
      break;
    case 2:
      range += std::to_string(std::min(one, other)) + ".." + std::to_string(std::max(one, other));
      break;
    default:
      range += std::to_string(one);
  }
  return range;
}

TEST_F(IndexFilters, LeaveOutNoFileOfTheseSizesAndTimes) {
  constexpr size_t kFiles = 3'000;  // more than are looked at together
  constexpr size_t kQueries = 150;
  Pieces pieces(3);
  for (size_t i = 0; i < kFiles; ++i) {
    const std::string path = tree_ + "/" + std::to_string(i);
    const size_t kind = pieces.Below(20);
    if (kind == 0) {
      ASSERT_EQ(mkdir(path.c_str(), S_IRWXU), 0);
    } else if (kind == 1) {
      ASSERT_EQ(mkfifo(path.c_str(), S_IRUSR), 0);
    } else if (kind == 2 && i > 0) {
      (void)!link((tree_ + "/" + std::to_string(pieces.Below(i))).c_str(), path.c_str());
    } else {
      const UniqueFd file(open(path.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, S_IRUSR | S_IWUSR));
      ASSERT_EQ(ftruncate(file.get(), kSizes[pieces.Below(std::size(kSizes))]), 0);
    }
    const time_t time = kTimes[pieces.Below(std::size(kTimes))];
    const timespec times[] = {{time, 0}, {time, 0}};
    (void)utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW);
  }
  const auto table = Scan();
  ASSERT_TRUE(table);
  std::vector<struct statx> files(table->entries());
  for (NameTable::EntryId entry = 0; entry < table->entries(); ++entry) {
    const std::string path = tree_ + "/" + std::string(table->name(entry));
    ASSERT_EQ(statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS | STATX_BTIME,
                    &files[entry]),
              0);
  }
  Changes changes;
  for (const auto& file : files) {
    if (pieces.Below(500) == 0) changes.AddInode(file.stx_ino);
  }
  size_t matches = 0;
  size_t left_out = 0;
  for (size_t i = 0; i < kQueries; ++i) {
    std::string text = RangeOf(pieces);
    if (pieces.Below(2) == 0) text += " " + RangeOf(pieces);
    SCOPED_TRACE(text);
    const auto query = Query::Parse(text);
    ASSERT_TRUE(query);
    const bool mappings_known = pieces.Below(2) == 0;
    const bool of_time = text.find("modified:") != std::string::npos;
    const bool of_more =
        text.find("size:") != std::string::npos || text.find("created:") != std::string::npos;
    const Filtered filtered({*table, changes, true, mappings_known}, *query);
    FoldedName name;
    for (NameTable::EntryId entry = 0; entry < table->entries(); ++entry) {
      const struct statx& file = files[entry];
      const bool is_file = S_ISREG(file.stx_mode);
      QueryAttributes attributes;
      attributes.size = static_cast<std::int64_t>(file.stx_size);
      attributes.modified = file.stx_mtime.tv_sec;
      attributes.created =
          (file.stx_mask & STATX_BTIME) != 0 ? file.stx_btime.tv_sec : QueryAttributes::kNoTime;
      name.Set(table->name(entry));
      const bool match = filtered.Matches({.name = &name,
                                           .is_folder = S_ISDIR(file.stx_mode),
                                           .is_file = is_file,
                                           .attributes = &attributes});
      const bool passes = filtered.Passes(entry);
      ASSERT_LE(match, passes) << table->name(entry);
      // What may have changed unseen is looked at, whatever the table says.
      const bool changed = changes.inodes().contains(file.stx_ino) || file.stx_nlink > 1;
      const bool written = !mappings_known && file.stx_size > 0 && !of_more;
      ASSERT_LE(is_file && (changed || written) && of_time, passes) << table->name(entry);
      matches += match ? 1 : 0;
      left_out += passes ? 0 : 1;
    }
  }
  EXPECT_GT(matches, kQueries * kFiles / 20);
  EXPECT_GT(left_out, kQueries * kFiles / 4);
}

std::string Composed(const std::string& text) {
  utf8proc_uint8_t* made = utf8proc_NFC(reinterpret_cast<const utf8proc_uint8_t*>(text.c_str()));
  if (made == nullptr) return "broken";
  const std::string composed(reinterpret_cast<char*>(made));
  std::free(made);
  return composed;
}

std::string Encoded(utf8proc_int32_t point) {
  utf8proc_uint8_t bytes[4];
  const auto length = static_cast<size_t>(utf8proc_encode_char(point, bytes));
  return {reinterpret_cast<char*>(bytes), length};
}

void ExpectComposed(const std::string& text) {
  std::string out = ">";
  const bool valid = AppendComposed(text, &out);
  const std::string expected = Composed(text);
  ASSERT_EQ(valid, expected != "broken") << text;
  ASSERT_EQ(out, valid ? ">" + expected : ">") << text;
}

TEST(FoldedName, ComposesAsUnicodeDoes) {
  constexpr utf8proc_int32_t kEnd = 0x20000;
  for (utf8proc_int32_t point = 1; point < kEnd; ++point) {
    if (point >= 0xd800 && point < 0xe000) continue;
    const std::string one = Encoded(point);
    ASSERT_TRUE(!IsComposed(one) || Composed(one) == one) << point;
    ExpectComposed("e" + one + "\u0301");
  }
  for (utf8proc_int32_t mark = 0x2f0; mark < 0x380; ++mark) {
    for (char letter = 1; letter > 0; ++letter) ExpectComposed(letter + Encoded(mark) + "x");
  }
  Pieces pieces(2);
  for (int i = 0; i < 100'000; ++i) ExpectComposed(pieces.Some(kInNames, 7));
}

}  // namespace
}  // namespace nas
