// Stop, clean and clean-all.

#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>

#include "module/table.h"
#include "search/stop_clean.h"
#include "tests/module/scripted_platform.h"

namespace {

Script EndScript(const char* method, const char* ids) {
  Script play;
  play.method = method;
  play.params["taskid"] = Parse(ids);
  play.properties = Parse(R"({"data":{"pid":77,"sdbid":"db1","sdbvol":"/volume1"}})");
  return play;
}

struct Row {
  const char* why;
  const char* ids;
  const char* arrange;
  Trace expected;
};

TEST(KillSearchWorker, LogsWhatIsNotAnEndedWorker) {
  const struct {
    int pid;
    int error;
    Trace expected;
  } rows[] = {
      {0, 0, {"log S:580 invalid process id", "false"}},
      {-1, 0, {"log S:580 invalid process id", "false"}},
      {5, 0, {"kill(5,15)", "true"}},
      {5, ESRCH, {"kill(5,15)", "false"}},
      {5,
       EPERM,
       {"kill(5,15)",
        "log S:586 Failed to kill delete process, "
        "reason=Operation not permitted(1)",
        "false"}},
  };
  for (const auto& row : rows) {
    Script play;
    play.kill_error = row.error;
    EXPECT_EQ(Keep(Play(play, [&] { Note(KillSearchWorker(row.pid) ? "true" : "false"); }),
                   {"kill", "log", "true", "false"}),
              row.expected);
  }
}

TEST(Stop, EndsEachSearchThatItCanOpen) {
  const Row rows[] = {
      {"an unknown id is skipped",
       R"("gone,t1")",
       "",
       {"Task(ann,gone)", "Task(ann,t1)", "WaitKeyReady(data,pid,60)", "kill(77,15)",
        "Task.finish(t1,false)", "~Task(t1)", "reply 0 null"}},
      {"finished: no signal",
       R"(["t1",{}])",
       "finished",
       {"Task(ann,t1)", "WaitKeyReady(data,pid,60)", "Task.finish(t1,false)", "~Task(t1)",
        "reply 0 null"}},
      {"never ready",
       R"("t1")",
       "fail WaitKeyReady",
       {"Task(ann,t1)", "WaitKeyReady(data,pid,60)", "log S:620 Failed to get json data",
        "Task.finish(t1,false)", "~Task(t1)", "reply 0 null"}},
      {"no data",
       R"("t1")",
       "no data",
       {"Task(ann,t1)", "WaitKeyReady(data,pid,60)", "log S:624 Failed to get json data",
        "Task.finish(t1,false)", "~Task(t1)", "reply 0 null"}},
      {"no ids at all", "{}", "", {"reply 0 null"}},
  };
  for (const auto& row : rows) {
    Script play = EndScript("stop", row.ids);
    play.Arrange(row.arrange);
    EXPECT_EQ(Keep(Serve(play, SearchAPIEntry),
                   {"Task", "~Task", "Wait", "kill", "log", "reply", "threw"}),
              row.expected)
        << row.why;
  }
}

TEST(Clean, AnswersAtOnce) {
  EXPECT_EQ(Keep(Serve(EndScript("clean", R"("t1")"), SearchAPIEntry),
                 {"NLIBC", "Task", "reply", "_exit"}),
            (Trace{"NLIBCProcFork()", "reply 0 {}"}));
}

TEST(Clean, RemovesTheDatabaseBeforeTheTask) {
  const Trace database = {"getDBTask(/volume1,db1)", "DBTask.remove()", "~DBTask"};
  const Trace task = {"Task.remove(t1)", "~Task(t1)", "_exit(0)"};
  const Trace open = {"Task(ann,t1)", "WaitKeyReady(data,sdbid,60)"};
  const auto join = [](std::initializer_list<Trace> parts) {
    Trace all;
    for (const Trace& part : parts) all.insert(all.end(), part.begin(), part.end());
    return all;
  };
  const Row rows[] = {
      {"running", R"("t1")", "child", join({open, {"kill(77,15)"}, database, task})},
      {"two, of which one is gone: nothing of the first is removed twice", R"("t2,gone")", "child",
       join({{"Task(ann,t2)", open[1], "kill(77,15)"},
             database,
             {"Task.remove(t2)", "~Task(t2)", "Task(ann,gone)", "_exit(0)"}})},
      {"finished", R"("t1")", "child, finished", join({open, database, task})},
      {"never ready", R"("t1")", "child, fail WaitKeyReady",
       join({open, {"log S:682 Failed to get json data"}, task})},
      {"no data", R"("t1")", "child, no data",
       join({open, {"log S:687 Failed to get json data"}, task})},
      {"no volume", R"("t1")", "child, no volume", join({open, {"kill(77,15)"}, task})},
      {"a process id that is none", R"("t1")", "child, spoil pid",
       join({open, {"log S:580 invalid process id"}, database, task})},
      {"no database", R"("t1")", "child, fail getDBTask",
       join({open, {"kill(77,15)", database[0]}, task})},
      {"no child: the request process does the work and ends", R"("t1")", "fail NLIBCProcFork",
       join({{"log S:668 Failed to fork()."}, open, {"kill(77,15)"}, database, task})},
      {"a record with an object for its database: the next one is cleaned all the same",
       R"("t1,t2")", "child, spoil sdbvol",
       join(
           {open,
            {"kill(77,15)", "Task.remove(t1)", "~Task(t1)", "Task(ann,t2)", open[1], "kill(77,15)"},
            {"Task.remove(t2)", "~Task(t2)", "_exit(0)"}})},
      {"an exception ends no more than its search", R"("t1")", "child, throw getDBTask",
       join({open, {"kill(77,15)", database[0]}, task})},
  };
  for (const auto& row : rows) {
    Script play = EndScript("clean", row.ids);
    play.Arrange(row.arrange);
    EXPECT_EQ(Keep(Serve(play, SearchAPIEntry), {"Task", "~Task", "Wait", "kill", "getDB", "DBTask",
                                                 "~DBTask", "log", "reply", "_exit", "threw"}),
              row.expected)
        << row.why;
  }
}

TEST(CleanAll, RemovesTheUsersFoldersByShell) {
  const Trace remove = {"NLIBCEncShParam(ann,1477)",
                        "NLIBCExec(/bin/sh,-c,rm -rf /volume*/@tmp/webfm/FBSearch/<escaped>,null)",
                        "_exit(0)"};
  const Row rows[] = {
      {"the parent answers", "null", "", {"fork()", "reply 0 null"}},
      {"no child",
       "null",
       "fail fork",
       {"fork()", "log S:741 Failed to fork().", "reply 401 null"}},
      {"searches are stopped first",
       R"("t1")",
       "child",
       {"fork()", "kill(77,15)", "Task.finish(t1,false)", remove[0], remove[1], remove[2]}},
      {"no ids", "null", "child, no taskid", {"fork()", remove[0], remove[1], remove[2]}},
      {"a name that cannot be escaped reaches no shell",
       "[]",
       "child, fail NLIBCEncShParam",
       {"fork()", remove[0], "log S:764 Failed to escape string: ann", remove[2]}},
      {"an exception ends the child",
       R"("t1")",
       "child, throw WaitKeyReady",
       {"fork()", "_exit(0)"}},
  };
  for (const auto& row : rows) {
    Script play = EndScript("Clean", row.ids);
    play.params["action"] = "cleanall";
    play.Arrange(row.arrange);
    EXPECT_EQ(Keep(Serve(play, SearchAPIEntry),
                   {"fork", "kill", "Task.", "NLIBC", "log", "reply", "_exit", "threw"}),
              row.expected)
        << row.why;
  }
}

TEST(CleanAll, ChildHoldsNoStreamOfTheServer) {
  Script play = EndScript("Clean", "[]");
  play.params["action"] = "cleanall";
  play.fork_result = 0;
  play.at["NLIBCExec"] = [] {
    for (const char* link : {"/proc/self/fd/0", "/proc/self/fd/1", "/proc/self/fd/2"}) {
      char target[64] = {};
      if (readlink(link, target, sizeof(target) - 1) > 0) Note(std::string("stream ") + target);
    }
  };
  EXPECT_EQ(Keep(Serve(play, SearchAPIEntry), {"stream"}),
            Trace(3, std::string("stream /dev/null")));
}

}  // namespace
