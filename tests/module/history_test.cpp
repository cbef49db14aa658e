// The history API, and how searches are remembered.

#include <gtest/gtest.h>

#include "history/history_store.h"
#include "module/table.h"
#include "search/find_handler.h"
#include "tests/module/scripted_platform.h"

namespace {

struct Row {
  const char* why;
  const char* params;
  const char* fail;
  std::string expected;
};

const std::string kSimple = "FileDB(/prefs/search_history.db)";
const std::string kAdvanced = "FileDB(/prefs/adv_search_history.db)";
const std::string kOpened = kSimple + "; FileDB.IsGood()";
const std::string kWriting = kOpened + "; FileDB.Max(10); FileDB.Key(pattern); ";

void Check(const Row& row, NUVA::APIEntry entry) {
  Script play;
  play.params = Parse(row.params);
  play.fail = {row.fail};
  play.history = {Parse(R"({"pattern":"b"})"), Parse(R"({"pattern":"a"})")};
  EXPECT_EQ(Told(Serve(play, entry), {"FileDB", "~FileDB", "log", "reply"}), row.expected)
      << row.why;
}

TEST(History, KindSelectsTheFile) {
  for (const char* kind : {"simple", "", "Advance", "ADVANCE", "adv", "advanced"}) {
    EXPECT_EQ(HistoryDBFileName(kind), "search_history.db") << kind;
  }
  EXPECT_EQ(HistoryDBFileName("advance"), "adv_search_history.db");
}

TEST(History, Get) {
  const std::string both =
      R"(; ~FileDB; reply 0 {"history":[{"pattern":"b"},{"pattern":"a"}],"total":2})";
  const Row rows[] = {
      {"everything, in the store's order", "{}", "", kOpened + "; FileDB.Select(0,0)" + both},
      {"counts pass unchanged", R"({"offset":-2,"limit":3,"search_type":"advance"})", "",
       kAdvanced + "; FileDB.IsGood(); FileDB.Select(-2,3)" + both},
      {"what is no number counts nothing, and what is no text names no other history",
       R"({"offset":"x","limit":[1],"search_type":{}})", "",
       kOpened + "; FileDB.Select(0,0)" + both},
      {"counts beyond all", R"({"offset":1e10,"limit":-99999999999})", "",
       kOpened + "; FileDB.Select(2147483647,-2147483648)" + both},
      {"an unusable store is empty", "{}", "FileDB.IsGood",
       kOpened + "; log S:1060 db is not good, /prefs/search_history.db, Permission denied; "
                 R"(~FileDB; reply 0 {"history":[],"total":0})"},
  };
  for (const Row& row : rows) Check(row, SearchHistoryGetEntry);
}

TEST(History, Set) {
  const Row rows[] = {
      {"defaults", R"({"pattern":"x"})", "",
       kWriting + R"(FileDB.Insert({"folder_path":"","pattern":"x","recursive":false}); )"
                  "~FileDB; reply 0 null"},
      {"values as received", R"({"pattern":5,"folder_path":["/a"],"recursive":"yes"})", "",
       kWriting + R"(FileDB.Insert({"folder_path":["/a"],"pattern":"5","recursive":"yes"}); )"
                  "~FileDB; reply 0 null"},
      {"no pattern: the store is not opened", R"({"folder_path":"/a"})", "", "reply 401 null"},
      {"nor for one that is no text", R"({"pattern":{"a":1}})", "", "reply 401 null"},
      {"store", R"({"pattern":"x","search_type":"advance"})", "FileDB.IsGood",
       kAdvanced + "; FileDB.IsGood(); log S:1089 db is not good, /prefs/adv_search_history.db, "
                   "Permission denied; ~FileDB; reply 401 null"},
      {"insert", R"({"pattern":"x"})", "FileDB.Insert",
       kWriting + R"(FileDB.Insert({"folder_path":"","pattern":"x","recursive":false}); )"
                  "~FileDB; reply 401 null"},
  };
  for (const Row& row : rows) Check(row, SearchHistorySetEntry);
}

TEST(History, Delete) {
  const Row rows[] = {
      {"everything", R"({"pattern":"x"})", "",
       kOpened + "; FileDB.Delete(0,0); ~FileDB; reply 0 null"},
      {"store", "{}", "FileDB.IsGood",
       kOpened + "; log S:1111 db is not good, /prefs/search_history.db, Permission denied; "
                 "~FileDB; reply 401 null"},
      {"delete", R"({"search_type":"advance"})", "FileDB.Delete",
       kAdvanced + "; FileDB.IsGood(); FileDB.Delete(0,0); ~FileDB; reply 401 null"},
  };
  for (const Row& row : rows) Check(row, SearchHistoryDeleteEntry);
}

TEST(Recording, WritesTheCriteriaUnderTheRequestsPattern) {
  const std::string opened = kOpened + "; ~FileDB";
  const Row rows[] = {
      {"old record goes, new one comes", R"({"pattern":"p","folder_path":"/a","recursive":true})",
       "FileDB.Delete",  // its failure is ignored
       kWriting +
           "FileDB.Delete(0,0,pattern=p); "
           R"(FileDB.Update({"folder_path":"/a","pattern":"c","recursive":true,"size_to":1},3); )"
           "~FileDB"},
      {"no pattern", "{}", "", opened},
      {"unusable store: not a word", R"({"pattern":"p"})", "FileDB.IsGood", opened},
      {"a pattern that is no text", R"({"pattern":["p"],"search_type":{}})", "", opened},
  };
  for (const Row& row : rows) {
    Script play;
    play.params = Parse(row.params);
    play.fail = {row.fail};
    const Trace trace = Play(play, [] {
      ArboryFindHandler handler(Request(), Response());
      handler.SetSearchHistory(Parse(R"({"pattern":"c","size_to":1,"folder_path":"old"})"));
    });
    EXPECT_EQ(Told(trace, {"FileDB", "~FileDB", "log", "threw"}), row.expected) << row.why;
  }
}

TEST(Recording, CountsSearches) {
  const std::string key = R"("NUVA.VTX.App.PersonalSettings.Instance")";
  const struct {
    const char* why;
    std::string before;
    std::string after;  // empty: not written
  } rows[] = {
      {"first search", "{}", "{" + key + R"(:{"search_count":1}})"},
      {"others are kept", "{" + key + R"(:{"a":[1],"search_count":41},"z":{"y":null}})",
       "{" + key + R"(:{"a":[1],"search_count":42},"z":{"y":null}})"},
      {"wraps", "{" + key + R"(:{"search_count":4294967295}})",
       "{" + key + R"(:{"search_count":0}})"},
      {"settings of another shape", "[1]", ""},
      {"a count of another shape", "{" + key + R"(:{"search_count":"x"}})", ""},
  };
  const auto count = [](const Script& play) {
    const Trace trace = Play(play, [] {
      ArboryFindHandler handler(Request(), Response());
      handler.SetSearchCount();
    });
    return Told(trace, {"fromFile", "toFile", "log", "threw"});
  };
  const std::string read = "fromFile(/prefs/usersettings)";
  for (const auto& row : rows) {
    Script play;
    play.settings = Parse(row.before);
    EXPECT_EQ(count(play),
              row.after.empty() ? read : read + "; toFile(/prefs/usersettings," + row.after + ")")
        << row.why;
  }
  Script missing;
  missing.fail = {"fromFile"};
  EXPECT_EQ(count(missing), read + "; log S:801 Failed to load usersettings, Permission denied");
}

}  // namespace
