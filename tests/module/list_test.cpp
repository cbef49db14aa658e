// Listing and the records of files.

#include <gtest/gtest.h>

#include "module/table.h"
#include "search/find_handler.h"
#include "search/search_state.h"
#include "tests/module/scripted_platform.h"

namespace {

Script ListScript(const char* params = "{}") {
  Script play;
  play.method = "list";
  play.params = Parse(params);
  play.params["taskid"] = "t1";
  play.accounts["ann"] = 1000;
  play.properties = Parse(R"({"data":{"sdbid":"db1","sdbvol":"/volume1"}})");
  return play;
}

TEST(List, PassesThePageOnToTheQuery) {
  const std::tuple<const char*, const char*, const char*> rows[] = {
      {"defaults", "{}", "0,2147483647,null,asc,2,"},
      {"descending in any case", R"({"sort_by":"size","sort_direction":"desc"})",
       "0,2147483647,size,desc,2,"},
      {"any other direction ascends", R"({"sort_by":"size","sort_direction":"DSC"})",
       "0,2147483647,size,asc,2,"},
      {"folders", R"({"filetype":"DIR","pattern":"x"})", "0,2147483647,null,asc,0,x"},
      {"files", R"({"filetype":"File"})", "0,2147483647,null,asc,1,"},
      {"another word is both", R"({"filetype":"files"})", "0,2147483647,null,asc,2,"},
      {"low 32 bits", R"({"offset":4294967298,"limit":4294967299})", "2,3,null,asc,2,"},
      {"a limit whose low bits are 0", R"({"limit":4294967296})", "0,2147483647,null,asc,2,"},
      {"no range", R"({"offset":-1,"limit":-2})", "4294967295,4294967294,null,asc,2,"},
  };
  for (const auto& [why, params, query] : rows) {
    const Trace trace = Serve(ListScript(params), SearchAPIEntry);
    EXPECT_EQ(Keep(trace, {"DBTask.query"}), Trace{std::string("DBTask.query(") + query + ")"})
        << why;
    const std::string offset = std::string(query).substr(0, std::string(query).find(','));
    EXPECT_EQ(Keep(trace, {"reply"}), Trace{R"(reply 0 {"files":[],"finished":false,"offset":)" +
                                            offset + R"(,"total":0})"})
        << why;
  }
}

TEST(List, AnswersEachFailureWithItsCode) {
  const std::string through = "SessionIdentity(sid,ann); WaitKeyReady(data,sdbid,500); ";
  const std::string ready = through + "WaitReady(result_ready,100); ";
  const std::string opened = ready + "getDBTask(/volume1,db1); ";
  const std::tuple<const char*, const char*, std::string> rows[] = {
      {"cleaned: finished", "no tasks", R"(reply 0 {"finished":true})"},
      {"identity", "fail SessionIdentity",
       "SessionIdentity(sid,ann); log S:528 Failed to set UGID for user=ann, sid=sid.; "
       "reply 401 null"},
      {"no database yet", "fail WaitKeyReady",
       through + "log S:540 Failed to get json data, t1.; reply 600 null"},
      {"no data", "no data", through + "log S:546 Failed to get json data, t1.; reply 401 null"},
      {"no volume: nothing to query", "no volume", ready + R"(reply 0 {"finished":false})"},
      {"not ready in time is no failure", "fail WaitReady, finished",
       opened + R"(reply 0 {"files":[],"finished":true,"offset":0,"total":0})"},
      {"no such user", "no accounts", ready + "reply 600 null"},
      {"no such database", "fail getDBTask", opened + "reply 600 null"},
      {"a record that was tampered with names none", "spoil sdbid",
       ready + "getDBTask(/volume1,); "
               R"(reply 0 {"files":[],"finished":false,"offset":0,"total":0})"},
      {"no number", "text offset", opened + "reply 600 null"},
      {"query", "fail DBTask.query",
       opened + "log S:451 Fail to select data from DB by ann; reply 600 null"},
  };
  for (const auto& [why, arrange, expected] : rows) {
    Script play = ListScript();
    play.Arrange(arrange);
    const Trace trace = Serve(play, SearchAPIEntry);
    EXPECT_EQ(Told(trace, {"SessionIdentity", "Wait", "getDBTask", "log", "reply"}), expected)
        << why;
    EXPECT_EQ(Keep(trace, {"~Task"}).size(), play.tasks.size() / 2) << why;
    EXPECT_EQ(Keep(trace, {"NUVAUserGet(ann)"}).size() * play.accounts.size(),
              Keep(trace, {"NUVAUserFree"}).size())
        << why;
  }
}

TEST(Additional, IsAMaskOfKnownNames) {
  const std::pair<const char*, int> rows[] = {{R"("size,SIZE,foo")", 2},
                                              {R"(["real_path","Owner","time"])", 13},
                                              {R"("perm,type")", 48},
                                              {R"("")", 0},
                                              {"5", 0}};
  for (const auto& [value, mask] : rows) {
    Script play;
    play.params["additional"] = Parse(std::string("[") + value + "]")[0];
    EXPECT_EQ(Keep(Play(play,
                        [] {
                          ArboryFindHandler handler(Request(), Response());
                          Note("mask " + std::to_string(handler.ParseFileAdditional()));
                        }),
                   {"mask"}),
              Trace{"mask " + std::to_string(mask)})
        << value;
  }
}

TEST(Records, ShowWhatWasAskedFor) {
  const struct {
    const char* why;
    const char* additional;
    bool is_dir;
    const char* shown;
    const char* asked;
  } rows[] = {
      {"nothing more", "", false, "/s/d/f mask=0", ""},
      {"type in upper case", "type", false, "/s/d/f mask=32 type=TAR.GZ", ""},
      {"folders have no type", "type", true, "/s/d/f dir mask=32", ""},
      {"size and stamps of 32 bits", "size,time", false,
       "/s/d/f mask=10 size=1234567890123 time=1,2,3,4", ""},
      {"owner", "owner", false, "/s/d/f mask=4 owner=o,g,10,20", ""},
      {"permissions of an empty path", "perm", false, "/s/d/f mask=16 perm=420,7,1",
       "GetACLPrivilege(); ACLIsSupport(,-1,2)"},
      {"permissions of the real path", "perm,real_path", false,
       "/s/d/f mask=17 real=/v/s/d/f perm=420,7,1",
       "GetACLPrivilege(/v/s/d/f); ACLIsSupport(/v/s/d/f,-1,2)"},
  };
  for (const auto& row : rows) {
    Script play = ListScript();
    play.params["additional"] = row.additional;
    play.rows = {{"/v/s", "s", "d/f", row.is_dir}};
    const Trace trace = Serve(play, SearchAPIEntry);
    EXPECT_EQ(Keep(trace, {"reply"}), Trace{std::string(R"(reply 0 {"files":[")") + row.shown +
                                            R"("],"finished":false,"offset":0,"total":1})"})
        << row.why;
    EXPECT_EQ(Told(trace, {"GetACL", "ACLIs"}), row.asked) << row.why;
  }
}

TEST(Records, ShowTheUsersOwnHome) {
  const std::string long_name(5000, 'x');
  const struct {
    const char* why;
    const char* user;
    const char* share;
    std::string path;
    bool enabled;
    std::string shown;  // empty: the selection ends
  } rows[] = {
      {"own file", "ann", "homes", "ann/docs/a.txt", true, "/home/docs/a.txt"},
      {"share in any case", "ann", "Homes", "ann/x", true, "/home/x"},
      {"another's file", "ann", "Homes", "bob/x", true, "/Homes/bob/x"},
      {"a longer name", "ann", "homes", "anna/x", true, "/homes/anna/x"},
      {"the folder itself", "ann", "homes", "ann", true, "/homes/ann"},
      {"homes are off", "ann", "homes", "ann/x", false, "/homes/ann/x"},
      {"another share", "ann", "photo", "ann/x", true, "/photo/ann/x"},
      {"found in another case: stays", "ann", "homes", "ANN/x", true, "/homes/ANN/x"},
      {"found in another case, further on", "ann", "homes", "ANN/joanna/x", true, "/homea/x"},
      {"domain account by its looked-up home", "D\\eve", "homes", "@D/1/eve-7/x", true, "/home/x"},
      {"mail-like account too", "eve@d", "homes", "@D/2/eve-8/x", true, "/home/x"},
      {"no home to be found", "D\\nobody", "homes", "x", true, ""},
      {"a home elsewhere", "root@d", "homes", "x", true, ""},
      {"no lookup outside homes", "D\\nobody", "photo", "x", true, "/photo/x"},
      {"cut to what a path holds", "ann", "photo", long_name, true,
       "/photo/" + long_name.substr(0, 4096 - 7)},
  };
  for (const auto& row : rows) {
    Script play = ListScript();
    play.user = row.user;
    play.accounts[row.user] = 1;
    play.home_enabled = row.enabled;
    play.homes = {{"D\\eve", "/volume2/homes/@D/1/eve-7"},
                  {"eve@d", "/volume2/homes/@D/2/eve-8"},
                  {"root@d", "/root"}};
    play.rows = {{"/v", row.share, row.path}, {"/v", row.share, row.path}};
    const Trace trace = Serve(play, SearchAPIEntry);
    const std::string file = "\"" + row.shown + " mask=0\"";
    EXPECT_EQ(Keep(trace, {"reply"}),
              Trace{R"(reply 0 {"files":[)" + (row.shown.empty() ? "" : file + "," + file) +
                    R"(],"finished":false,"offset":0,"total":2})"})
        << row.why;
    EXPECT_LE(Keep(trace, {"HomePath"}).size(), 1U) << row.why << ": looked up once";
  }
}

TEST(Records, OfVanishedFilesArePurgedAndThePageIsAskedForAgain) {
  Script play = ListScript(R"({"additional":"real_path"})");
  play.rows = {
      {"/v/homes/ann", "homes", "ann/1"}, {"/v/homes", "homes", "bob/2"}, {"/v/s", "s", "3"}};
  play.home_enabled = false;
  play.vanished = {"/v/homes/ann/1", "/v/homes/bob/2"};
  const std::string query = "DBTask.query(0,2147483647,null,asc,2,)";
  const Trace purges = {"DBTask.delRecs(homes,/v/homes/ann/1)",
                        "DBTask.delRecs(homes,/v/homes/bob/2)"};
  EXPECT_EQ(Keep(Serve(play, SearchAPIEntry), {"DBTask", "reply"}),
            (Trace{query, purges[0], purges[1], query,
                   R"(reply 0 {"files":["/s/3 mask=1 real=/v/s/3"],)"
                   R"("finished":false,"offset":0,"total":1})"}));
  play.fail = {"DBTask.delRecs"};  // or the page would be asked for for ever
  EXPECT_EQ(Keep(Serve(play, SearchAPIEntry), {"DBTask", "reply"}),
            (Trace{query, purges[0], purges[1],
                   R"(reply 0 {"files":["/homes/ann/1 mask=1 real=/v/homes/ann/1",)"
                   R"("/homes/bob/2 mask=1 real=/v/homes/bob/2","/s/3 mask=1 real=/v/s/3"],)"
                   R"("finished":false,"offset":0,"total":3})"}));
}

TEST(Records, EndWithTheTerminationFlag) {
  Script play = ListScript();
  play.rows = {{"/v", "s", "1"}, {"/v", "s", "2"}};
  play.at["DBTask.query"] = [] { DelSigHandler(15); };
  EXPECT_EQ(Keep(Serve(play, SearchAPIEntry), {"reply"}),
            Trace{R"(reply 0 {"files":["/s/1 mask=0"],"finished":false,"offset":0,"total":2})"});
}

}  // namespace
