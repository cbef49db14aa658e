// Starting a search: locations, the request's side of the fork and the worker's.

#include <gtest/gtest.h>

#include "module/table.h"
#include "search/find_handler.h"
#include "search/search_state.h"
#include "tests/module/scripted_platform.h"

namespace {

TEST(Locations, AreNormalised) {
  const std::tuple<const char*, const char*, const char*> rows[] = {
      {"home equals its homes entry", R"(["/home","/homes/ann"])", R"(["/homes/ann"])"},
      {"home swallows what lies in it", R"(["/homes/ann/docs","/home"])", R"(["/homes/ann"])"},
      {"home inside an entry is dropped", R"(["/homes","/home/docs"])", R"(["/homes"])"},
      {"only the first entry is replaced", R"(["/homes/ann/a","/homes/ann/b","/home"])",
       R"(["/homes/ann","/homes/ann/b"])"},
      {"homes given twice keep to the text", R"(["/homes/ann/a/","/home/a"])",
       R"(["/homes/ann/a"])"},
      {"a longer name lies beside", R"(["/homes/ann/ab","/home/a"])",
       R"(["/homes/ann/ab","/homes/ann/a"])"},
      {"converted ones are merged too", R"(["/home/a","/home","/home/b"])", R"(["/homes/ann"])"},
      {"homes entries are not compared", R"(["/homes/x","/homes/x","/homes/x/y"])",
       R"(["/homes/x","/homes/x","/homes/x/y"])"},
      {"others come first", R"(["/photo","/homes/ann","/music"])",
       R"(["/photo","/music","/homes/ann"])"},
      {"others are not compared", R"(["/photo","/photo","/photo/a"])",
       R"(["/photo","/photo","/photo/a"])"},
      {"near misses of the alias", R"(["/homework","/home1/x","/homesick","home"])",
       R"(["/homework","/home1/x","/homesick","home"])"},
      {"nothing", "[]", "[]"},
  };
  Script play;
  play.homes["ann"] = "/volume1/homes/ann";
  for (const auto& [why, input, output] : rows) {
    const Trace trace = Play(play, [&] {
      const ArboryFindHandler handler(Request(), Response());
      Note("out " + Text(handler.RemoveDuplicatedLocations(Parse(input))));
    });
    EXPECT_EQ(Keep(trace, {"out"}), Trace{std::string("out ") + output}) << why;
  }
}

TEST(Locations, AFailedHomeLookupDropsTheLocationAndIsLogged) {
  Script play;
  const auto run = [](const Script& s) {
    return Keep(Play(s,
                     [] {
                       const ArboryFindHandler handler(Request(), Response());
                       Note(Text(handler.RemoveDuplicatedLocations(Parse(R"(["/home","/x"])"))));
                     }),
                {"[", "log", "HomePath"});
  };
  EXPECT_EQ(run(play), (Trace{"HomePath(ann,4096)",
                              "log S:950 Failed to get homes path for ann, "
                              "No such file or directory",
                              R"(["/x"])"}));
  play.homes["ann"] = "/root/ann";
  EXPECT_EQ(run(play), (Trace{"HomePath(ann,4096)", "log S:955 Failed to find /homes/ in /root/ann",
                              R"(["/x"])"}));
}

Script StartScript(const char* folders) {
  Script play;
  play.method = "start";
  play.version = 2;
  play.params["folder_path"] = folders;
  return play;
}

TEST(Start, WritesTheTaskAndAnswers) {
  Script play = StartScript("/indexed/a,/other");
  play.indexed = {"indexed"};
  play.fail = {"Task.end"};  // logged, no more
  const Trace trace = Serve(play, SearchAPIEntry);
  EXPECT_EQ(
      Keep(trace, {"Explode", "Task", "NLIBC", "IsShare", "log", "reply", "~Task"}),
      (Trace{"Explode(\"/indexed/a,/other\",,,2,keep)", "Task(ann,null)", "NLIBCProcFork()",
             "Task.begin()", "Task.set(progress,0)",
             R"(Task.set(data,{"location":["/indexed/a","/other"],"pid":4711,"taskid":"new"}))",
             "Task.end()", "log S:873 Failed to write progress.", "IsShareIndexed(indexed)",
             "IsShareIndexed(other)", "~Task(new)",
             R"(reply 0 {"has_not_index_share":true,"taskid":"new"})"}));
}

TEST(Start, TellsWhetherAShareIsNotIndexed) {
  const std::pair<const char*, const char*> rows[] = {
      {"/a/x,/b", "false"}, {"/a,/c,/b", "true"}, {"/a/b/c", "false"}, {"/c/a", "true"}};
  for (const auto& [folders, expected] : rows) {
    Script play = StartScript(folders);
    play.indexed = {"a", "b"};
    EXPECT_EQ(
        Keep(Serve(play, SearchAPIEntry), {"reply"}),
        Trace{std::string(R"(reply 0 {"has_not_index_share":)") + expected + R"(,"taskid":"new"})"})
        << folders;
  }
}

TEST(Start, FailuresAnswer401) {
  Script no_task = StartScript("/a");
  no_task.Arrange("throw Task");
  EXPECT_EQ(Keep(Serve(no_task, SearchAPIEntry), {"NLIBCProcFork", "log", "reply", "~Task"}),
            Trace{"reply 401 null"});
  Script no_fork = StartScript("/a");
  no_fork.fail = {"NLIBCProcFork"};
  EXPECT_EQ(Keep(Serve(no_fork, SearchAPIEntry), {"log", "Task.", "reply", "~Task"}),
            (Trace{"log S:862 Failed to fork().", "~Task(new)", "reply 401 null"}));
}

TEST(Start, LeavesNothingBehindHoweverItEnds) {
  Script refused = StartScript("/a");
  refused.fail = {"RunIdentity"};
  refused.wfm_error = 407;
  EXPECT_EQ(Serve(refused, SearchAPIEntry),
            (Trace{"WfmLibUmask()", "RunIdentity(null,ann)",
                   "log webfm_webapi:54 Failed to set UGID, Permission denied", "reply 407 null",
                   "WfmLibRestoreUmask(18)", "returned"}));
  Script thrown = StartScript("/a");
  thrown.Arrange("throw IsShareIndexed");
  EXPECT_EQ(Keep(Serve(thrown, SearchAPIEntry), {"reply", "~Task", "WfmLibRestore", "threw"}),
            (Trace{"~Task(new)", "WfmLibRestoreUmask(18)", "threw IsShareIndexed"}));
}

Script WorkerScript() {
  Script play = StartScript("/photo,/music");
  play.fork_result = 0;
  play.params["pattern"] = "a";
  play.properties = Parse(R"({"data":{"pid":1}})");
  return play;
}

const char kWalkData[] =
    R"(Task.set(data,{"pattern":"a","pid":1,"sdbid":"db1","sdbvol":"/volume1"}))";

TEST(Worker, RunsTheSearchInItsOrder) {
  Trace trace = Serve(WorkerScript(), SearchAPIEntry);
  std::erase_if(trace, [](const std::string& line) { return line.starts_with("GetParam"); });
  EXPECT_EQ(
      Told(trace, {""}),
      "WfmLibUmask(); RunIdentity(null,ann); Explode(\"/photo,/music\",,,2,keep); Task(ann,null); "
      "NLIBCProcFork(); WaitReady(data,60); SessionIdentity(sid,ann); createFindOp 0(); "
      "FileDB(/prefs/search_history.db); FileDB.IsGood(); FileDB.Max(10); FileDB.Key(pattern); "
      "FileDB.Delete(0,0,pattern=a); "
      R"(FileDB.Update({"folder_path":"/photo,/music","pattern":"a","recursive":false},3); )"
      "~FileDB; fromFile(/prefs/usersettings); toFile(/prefs/usersettings,"
      R"({"NUVA.VTX.App.PersonalSettings.Instance":{"search_count":1}}); )"
      "Walker(ann,sid); Walker.init(/photo /music [field 0 null,a]); Walker.current(false); "
      "Task.reload(); " +
          std::string(kWalkData) +
          R"(; Walk([]{"pattern":"a","recursive":true,"search_content":true}); )"
          "~Walker; ~field 0 null,a; Task.reload(); Task.begin(); Task.set(progress,1); " +
          kWalkData + "; Task.finish(new,false); _exit(0)");
}

TEST(Worker, RecordsItsOutcome) {
  const std::string walk_data = std::string(kWalkData) + "; ";
  const std::string finish = "Task.finish(new,false); ";
  const std::string end = finish + "_exit(0)";
  const std::string succeeded = "Task.set(progress,1); " + walk_data;
  const std::string failed = "Task.set(progress,-1); ";
  const std::string early_401 = failed + R"(Task.set(data,{"errno":401,"pid":1}); )";
  const std::string no_identity = "log S:891 Failed to set UGID for user=ann, sid=sid; ";
  const std::string no_record = "log S:909 Failed to get json data.; ~Task(new); ";
  const std::tuple<const char*, const char*, std::string> rows[] = {
      {"a failing write is logged", "fail Task.finish",
       walk_data + succeeded + finish + "log S:923 Failed to write progress.; _exit(0)"},
      {"identity refused", "fail SessionIdentity", no_identity + early_401 + end},
      {"identity refused while told to stop: recorded, then ended",
       "fail SessionIdentity, stop SessionIdentity", no_identity + early_401 + finish + end},
      {"criteria refused: neither remembered nor walked", "fail createFindOp 0, error 418",
       "log S:251 Failed To parse the find parameters, reason=[1A2]; " + failed +
           R"(Task.set(data,{"errno":418,"pid":1}); )" + end},
      {"a failure without a code is a failure", "fail createFindOp 0",
       "log S:251 Failed To parse the find parameters, reason=[0]; " + failed +
           R"(Task.set(data,{"errno":0,"pid":1}); )" + end},
      {"told to stop during the walk", "stop Walk, fail Walk", walk_data + end},
      {"told to stop before the walk", "stop WaitReady", walk_data + end},
      {"told to stop while it records", "stop Task.begin", walk_data + succeeded + finish + end},
      {"the walk throws", "throw Walk",
       walk_data + failed +
           R"(Task.set(data,{"errno":401,"pattern":"a","pid":1,"sdbid":"db1",)"
           R"("sdbvol":"/volume1"}); )" +
           end},
      {"the wait throws", "throw WaitReady", early_401 + end},
      {"a criterion of the wrong type", "text size_from", early_401 + end},
      {"recording throws", "throw Task.begin", walk_data + end},
      {"everything throws", "throw Task.reload, throw Task.finish", end},
      {"no record, search failed: back through the request's path", "lose Walk, fail Walk",
       walk_data + "log S:281 Failed To parse the find parameters, reason=[0]; " + no_record +
           "reply 401 null; returned"},
      {"no record, search succeeded", "lose Walk",
       walk_data + no_record +
           R"(reply 0 {"pattern":"a","recursive":true,"search_content":true}; returned)"},
      {"no record before the walk", "no data",
       "log S:100 Failed to get json data; "
       "log S:281 Failed To parse the find parameters, reason=[0]; " +
           no_record + "reply 401 null; returned"},
  };
  for (const auto& [why, arrange, expected] : rows) {
    Script play = WorkerScript();
    play.Arrange(arrange);
    const Trace trace = Serve(play, SearchAPIEntry);
    EXPECT_EQ(Told(trace, {"log", "Task.set", "Task.finish", "reply", "~Task", "_exit", "returned",
                           "threw", "signal"}),
              expected)
        << why;
    // Criteria and walker go on every road.
    EXPECT_EQ(Keep(trace, {"Walker("}).size(), Keep(trace, {"~Walker"}).size()) << why;
    const size_t made = play.fail.contains("createFindOp 0") ? 0 : Keep(trace, {"createF"}).size();
    EXPECT_EQ(Keep(trace, {"~field"}).size(), made) << why;
  }
}

TEST(Worker, MapsTheWalksErrors) {
  const std::pair<int, int> rows[] = {{0x0300, 407}, {0x0600, 408}, {0x1800, 405}, {0x1D00, 405},
                                      {0x9A00, 418}, {0x0200, 401}, {0, 401},      {0x0301, 401}};
  for (const auto& [error, code] : rows) {
    Script play = WorkerScript();
    play.fail = {"Walker.init"};
    play.platform_error = error;
    const Trace trace = Serve(play, SearchAPIEntry);
    char hex[8];
    snprintf(hex, sizeof(hex), "%X", static_cast<unsigned>(error));
    EXPECT_EQ(
        Keep(trace, {"log", "Task.set(data"}),
        (Trace{std::string("log S:281 Failed To parse the find parameters, reason=[") + hex + "]",
               R"(Task.set(data,{"errno":)" + std::to_string(code) + R"(,"pid":1}))"}));
  }
}

}  // namespace
