// Text of all kinds: JSON both ways, cleaned and in files, parameter splitting, shell words,
// file entries.

#include <json/value.h>

#include <cstdio>
#include <limits>
#include <new>
#include <optional>
#include <string_view>

#include "nas/base/json_pull.h"
#include "nas/base/json_text.h"
#include "nas/system/memory.h"
#include "nas/system/request_bounds.h"
#include "platform/json_file.h"
#include "platform/system.h"
#include "platform/webfm.h"
#include "tests/nas/fixture.h"

namespace nas_test {
namespace {

#define BAD "\xEF\xBF\xBD"

struct Utf8Row {
  std::string text;
  std::string clean;
  const char* why;
};

TEST(Json, ReplacesEachBadSequenceOnce) {
  const Utf8Row rows[] = {
      {"", "", "empty"},
      {"plain name.txt", "plain name.txt", "nothing to do"},
      {std::string("a\0b", 3), "a\\u0000b", "NUL is a character"},
      {"\xC2\x80 \xDF\xBF", "\xC2\x80 \xDF\xBF", "edges of two bytes"},
      {"\xE0\xA0\x80 \xEF\xBF\xBF", "\xE0\xA0\x80 \xEF\xBF\xBF", "edges of three bytes"},
      {"\xF0\x90\x80\x80 \xF4\x8F\xBF\xBF", "\xF0\x90\x80\x80 \xF4\x8F\xBF\xBF", "of four"},
      {"\x80", BAD, "continuation alone"},
      {"\xC1\xBF", BAD BAD, "overlong, two bytes"},
      {"\xE0\x9F\xBF", BAD BAD BAD, "overlong, three bytes"},
      {"\xF0\x8F\xBF\xBF", BAD BAD BAD BAD, "overlong, four bytes"},
      {"\xED\xA0\x80", BAD BAD BAD, "surrogate"},
      {"\xF4\x90\x80\x80", BAD BAD BAD BAD, "beyond the last character"},
      {"\xE2\x82", BAD, "cut at the end: one character, one replacement"},
      {"\xF0\x9F\x98", BAD, "the same of four"},
      {"\xE2\x82z", BAD "z", "cut by ASCII, which stays"},
      {"abcdefgh\xFFijklmnop\xC3\xA9", "abcdefgh" BAD "ijklmnop\xC3\xA9", "between good ones"},
  };
  for (const Utf8Row& row : rows) {
    EXPECT_EQ(nas::JsonText(row.text, nas::JsonBytes::kClean), '"' + row.clean + '"') << row.why;
  }
}

TEST(Json, WritesWhatItReads) {
  const char* const same[] = {"null",
                              "true",
                              "-9223372036854775808",
                              "18446744073709551615",
                              "1.0",
                              "1e+300",
                              "0.1",
                              "\"\"",
                              "[]",
                              "{}",
                              "[1,[2,{\"a\":null}]]",
                              "{\"a\\\"b\":\"\\\\ \\n\\t\\u0000\\u001f\"}",
                              "\"\xC3\xA9\x7F\"",
                              "\"bytes \xFF\xC3 stay\""};
  for (const char* text : same) {
    Json::Value value;
    ASSERT_TRUE(nas::ParseJson(text, &value)) << text;
    EXPECT_EQ(nas::JsonText(value, nas::JsonBytes::kRaw), text);
  }
  Json::Value value;
  ASSERT_TRUE(nas::ParseJson("{\"\xFF\":\"a\xC3\xA9\xE2\x82\"}", &value));
  EXPECT_EQ(nas::JsonText(value, nas::JsonBytes::kClean), "{\"" BAD "\":\"a\xC3\xA9" BAD "\"}");
  EXPECT_EQ(nas::JsonText(std::numeric_limits<double>::infinity(), nas::JsonBytes::kRaw), "null");
}

TEST(Json, RefusesWhatIsNotOneDocument) {
  const auto list_of = [](size_t values) {  // the list itself counts as one
    std::string text = "[\",,[{\"";
    for (size_t count = 2; count < values; ++count) text += ",1";
    return text + "]";
  };
  Json::Value list;
  EXPECT_TRUE(nas::ParseJson(list_of(nas::kJsonMaxValues), &list));
  EXPECT_FALSE(nas::ParseJson(list_of(nas::kJsonMaxValues + 1), &list)) << "too many values";
  const std::string deep(nas::kJsonMaxDepth + 1, '[');
  const std::string rows[] = {"",    " ",    "{",       "[1,]",     "{\"a\":1,}",
                              "1 2", "[1]x", "// c\n1", "[1/*c*/]", "'a'",
                              "NaN", "\"a",  "{a:1}",   deep,       std::string(1 << 20, '[')};
  for (const std::string& text : rows) {
    Json::Value value("untouched");
    EXPECT_FALSE(nas::ParseJson(text, &value)) << text.substr(0, 20);
    EXPECT_EQ(value, "untouched");
  }
}

// A record that is taken for damaged is removed, so a shortage must not look like damage.
TEST(Json, TellsNoMemoryFromNoDocument) {
  if (!kMemoryIsBounded) GTEST_SKIP() << "sanitizers need their memory";
  constexpr size_t kBytes = size_t{16} << 20;
  const std::string text = '"' + std::string(kBytes, 'a') + '"';
  // Whichever of the copies it is that finds no room.
  for (size_t more = kBytes / 2; more < 4 * kBytes; more += kBytes / 2) {
    EXPECT_TRUE(InChild([&] {
      nas::LimitMemory(kBytes + more);
      Json::Value value;
      try {
        EXPECT_TRUE(nas::ParseJson(text, &value)) << more;
      } catch (const std::bad_alloc&) {
        nas::LiftMemoryLimit();
      }
    }));
  }
}

struct PullRow {
  const char* text;
  const char* taken;  // its strings and numbers, each with a blank behind it; null: not in order
  const char* why;
};

// What a page of rows is made of: ["name", number, number or null], after what is skipped.
std::optional<std::string> Pulled(std::string_view text) {
  nas::JsonPull pull{std::string(text)};
  std::string name;
  std::uint32_t small = 0;
  std::int64_t large = 0;
  const bool taken = pull.TakeObject([&](const std::string& member) {
    if (member != "row") return pull.Skip();
    return pull.EnterArray() && pull.TakeString(&name) && pull.TakeNumber(&small) &&
           (pull.TakeNull() || pull.TakeNumber(&large)) && pull.LeaveArray();
  });
  if (!taken || !pull.AtEnd()) return std::nullopt;
  return name + " " + std::to_string(small) + " " + std::to_string(large);
}

TEST(Json, IsReadInPieces) {
  const PullRow rows[] = {
      {" {\t\"row\" :\r\n[ \"a\" , 1 , null ] } \n", "a 1 0", "blanks, and null"},
      {R"({"row":["\u0041\"\\\/\n\u00e9\u20ac\ud83d\ude00",1,2]})",
       "A\"\\/\n\u00e9\u20ac\U0001F600 1 2", "every escape"},
      {"{\"row\":[\"\xFF\xC3\",1,2]}", "\xFF\xC3 1 2", "bytes that are not UTF-8"},
      {R"({"x":{"a":[1,-2.5e3,true,false,null,"]}"],"b":{}},"row":["a",1,2],"y":[]})", "a 1 2",
       "what is not known is passed over"},
      {R"({"row":["a",4294967295,-9223372036854775808]})", "a 4294967295 -9223372036854775808",
       "edges of numbers"},
      {R"({"row":["a",4294967296,2]})", nullptr, "beyond them"},
      {R"({"row":["a",1,9223372036854775808]})", nullptr, "beyond the signed ones"},
      {R"({"row":["a",1,99999999999999999999]})", nullptr, "beyond all"},
      {R"({"row":["a",-1,2]})", nullptr, "below"},
      {R"({"row":["a",1.0,2]})", nullptr, "a fraction"},
      {R"({"row":["a","1",2]})", nullptr, "a string for a number"},
      {R"({"row":["a",1,2,3]})", nullptr, "one too many"},
      {R"({"row":["a",1]})", nullptr, "one too few"},
      {R"({"row":["a",1,2]} x)", nullptr, "something behind it"},
      {R"({"row":["a",1,2])", nullptr, "not ended"},
      {R"({"row":["a)", nullptr, "a string not ended"},
      {"{\"row\":[\"a\nb\",1,2]}", nullptr, "a control character as it is"},
      {R"(["row"])", nullptr, "no object"},
      {"", nullptr, "nothing"},
  };
  for (const PullRow& row : rows) {
    SCOPED_TRACE(row.text);
    EXPECT_EQ(Pulled(row.text).value_or("nothing"), row.taken == nullptr ? "nothing" : row.taken)
        << row.why;
  }
  using std::string_literals::operator""s;
  EXPECT_FALSE(Pulled("{\"row\":[\"a\",1,2]}\0, x"s)) << "something behind a NUL";
  EXPECT_FALSE(Pulled("{\"x\":" + std::string(100'000, '[')));
  const auto deep = [](size_t levels) {
    return "{\"x\":" + std::string(levels, '[') + std::string(levels, ']') + "}";
  };
  EXPECT_TRUE(Pulled(deep(nas::kJsonMaxValues / 2 - 2)));
  EXPECT_FALSE(Pulled(deep(nas::kJsonMaxValues / 2)))
      << "a little text that would take much memory";
}

class JsonFileTest : public PlatformTest {};

TEST_F(JsonFileTest, TellsWhyAFileCannotBeRead) {
  const struct {
    const char* name;
    const char* content;  // null: not made
    int error;
  } rows[] = {{"good", " {\"a\":[1]}\n", 0},   {"scalar", "5", 0},
              {"missing", nullptr, ENOENT},    {"empty", "", EBADMSG},
              {"torn", "{\"a\":", EBADMSG},    {"..", nullptr, EISDIR},
              {"good/below", nullptr, ENOTDIR}};
  for (const auto& row : rows) {
    const std::string path = dir_ + "/" + row.name;
    if (row.content != nullptr) WriteFile(path, row.content);
    Json::Value value("untouched");
    errno = 0;
    EXPECT_EQ(Json::fromFile(path, value), row.error == 0) << row.name;
    EXPECT_EQ(errno, row.error) << row.name;
    EXPECT_EQ(value == "untouched", row.error != 0) << row.name;
  }
  ASSERT_EQ(mkfifo((dir_ + "/pipe").c_str(), 0600), 0);
  Json::Value value;
  EXPECT_FALSE(Json::fromFile(dir_ + "/pipe", value)) << "a pipe must not block";
}

TEST_F(JsonFileTest, ReplacesWholeFiles) {
  const std::string path = dir_ + "/settings";
  umask(0);
  ASSERT_TRUE(Json::toFile(path, Json::Value("\xFF")));
  EXPECT_EQ(ModeOf(path), 0600) << "a new file is its owner's";
  EXPECT_EQ(ReadFile(path), "\"\xFF\"\n");
  ASSERT_EQ(chmod(path.c_str(), 0640), 0);
  ASSERT_TRUE(Json::toFile(path, Json::Value(2)));
  EXPECT_EQ(ModeOf(path), 0640) << "an old one keeps its mode";

  const std::string link = dir_ + "/link";
  ASSERT_EQ(symlink(path.c_str(), link.c_str()), 0);
  ASSERT_TRUE(Json::toFile(link, Json::Value(3)));
  EXPECT_EQ(ReadFile(path) + ReadFile(link), "2\n3\n") << "a link is replaced, not followed";

  const std::string closed = MakeFolder("closed");
  WriteFile(closed + "/file", "old");
  ASSERT_EQ(chmod(closed.c_str(), 0555), 0);
  ASSERT_EQ(chmod((closed + "/file").c_str(), 0666), 0);
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    EXPECT_FALSE(Json::toFile(closed + "/file", Json::Value(1)));
    EXPECT_EQ(errno, EACCES);
  }));
  EXPECT_EQ(ReadFile(closed + "/file"), "old");
  ASSERT_EQ(chmod(closed.c_str(), 0755), 0);
}

TEST(Splitting, FollowsItsTable) {
  const struct {
    const char* value;  // JSON
    int version;
    bool drop;
    const char* pieces;
  } rows[] = {
      {R"("")", 1, false, "[]"},
      {R"("a")", 1, false, R"(["a"])"},
      {R"("a,b")", 1, false, R"(["a","b"])"},
      {R"(",a,,b,")", 1, false, R"(["","a","","b",""])"},
      {R"(",a,,b,")", 1, true, R"(["a","b"])"},
      {R"("a\\,b,c")", 1, false, R"(["a,b","c"])"},
      {R"("a\\b\\")", 1, false, R"(["a\\b\\"])"},
      {R"("[\"a,b\",\"c\"]")", 2, false, R"(["a,b","c"])"},
      {R"("[\"a\",\"c\"]")", 1, false, R"(["[\"a\"","\"c\"]"])"},
      {R"("[broken,b")", 2, false, R"(["[broken","b"])"},
      {R"("{\"a\":1}")", 2, false, R"(["{\"a\":1}"])"},
      {R"(["a,b","","c"])", 1, true, R"(["a,b","","c"])"},
      {R"(["a",5,true,null,{},["x"]])", 2, false, R"(["a","5","true"])"},
      {"5", 2, false, "[]"},
      {"{}", 2, false, "[]"},
      {"null", 2, false, "[]"},
  };
  for (const auto& row : rows) {
    Json::Value value;
    ASSERT_TRUE(nas::ParseJson(row.value, &value)) << row.value;
    const Json::Value pieces = StringExplodeEx(value, ",", row.version, row.drop);
    EXPECT_EQ(nas::JsonText(pieces, nas::JsonBytes::kRaw), row.pieces) << row.value;
  }
}

TEST(Splitting, HasABound) {
  for (const size_t count : {nas::kMostPieces, nas::kMostPieces + 1}) {
    std::string text = "x";
    for (size_t i = 1; i < count; ++i) text += ",x";
    Json::Value array(Json::arrayValue);
    for (size_t i = 0; i < count; ++i) array.append("x");
    const std::string json = nas::JsonText(array, nas::JsonBytes::kRaw);
    for (const Json::Value& value : {Json::Value(text), array, Json::Value(json)}) {
      if (count > nas::kMostPieces) {
        EXPECT_THROW(StringExplodeEx(value, ",", 2, false), nas::TooManyPieces);
      } else {
        EXPECT_EQ(StringExplodeEx(value, ",", 2, false).size(), count);
      }
    }
  }
}

TEST(ShellWords, ComeThroughTheShellUnchanged) {
  const std::string rows[] = {"",    "ann",  "o'neil", "''''", "a b", "$(id)`id`\\",
                              "-rf", "\n\t", "\xFF",   "*?[!", ";&|", "\"'\""};
  for (const std::string& text : rows) {
    char word[128];
    ASSERT_EQ(NLIBCEncShParam(text.c_str(), word, sizeof word), 0) << text;
    FILE* shell = popen((std::string("printf %s. ") + word).c_str(), "r");
    char output[128];
    const size_t count = fread(output, 1, sizeof output, shell);
    pclose(shell);
    EXPECT_EQ(std::string(output, count), text + ".");
  }
  char exact[6];
  EXPECT_EQ(NLIBCEncShParam("abc", exact, sizeof exact), 0);
  EXPECT_EQ(NLIBCEncShParam("abcd", exact, sizeof exact), -1) << "no room for the NUL";
  EXPECT_EQ(NLIBCEncShParam("'", exact, 0), -1);
}

TEST(FileEntries, ShowWhatIsAskedFor) {
  DIRENTRY_INFO entry;
  entry.name = "n\xFF";
  entry.path = "/s/n\xFF";
  entry.real_path = "/r/n\xFF";
  entry.type = "TXT";
  entry.size = 1ULL << 40;
  entry.mode = 0104750;
  entry.acl_privilege = 5;
  entry.atime = 4294967295U;
  entry.user = "ann";
  const struct {
    int mask;
    const char* member;  // null: none beyond the three
    const char* shown;
  } rows[] = {
      {0, nullptr, ""},
      {1, "real_path", "\"/r/n\xFF\""},
      {2, "size", "1099511627776"},
      {4, "owner", R"({"gid":0,"group":"","uid":0,"user":"ann"})"},
      {8, "time", R"({"atime":4294967295,"crtime":0,"ctime":0,"mtime":0})"},
      {16, "perm", R"({"acl_mode":false,"mode":4750,"privilege":5})"},
      {32, "type", R"("TXT")"},
  };
  for (const auto& row : rows) {
    Json::Value shown("old");
    DumpFileInfo(row.mask, entry, shown, 0, 0);
    if (row.member != nullptr) {
      EXPECT_EQ(nas::JsonText(shown[row.member], nas::JsonBytes::kRaw), row.shown);
      shown.removeMember(row.member);
    }
    EXPECT_EQ(nas::JsonText(shown, nas::JsonBytes::kRaw),
              "{\"is_dir\":false,\"name\":\"n\xFF\",\"path\":\"/s/n\xFF\"}")
        << row.mask;
  }
}

}  // namespace
}  // namespace nas_test
