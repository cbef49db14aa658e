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
  std::string expected;
};

TEST(KillSearchWorker, LogsWhatIsNotAnEndedWorker) {
  const struct {
    int pid;
    int error;
    const char* expected;
  } rows[] = {
      {0, 0, "log S:580 invalid process id; false"},
      {-1, 0, "log S:580 invalid process id; false"},
      {5, 0, "kill(5,15); true"},
      {5, ESRCH, "kill(5,15); false"},
      {5, EPERM,
       "kill(5,15); log S:586 Failed to kill delete process, reason=Operation not permitted(1); "
       "false"},
  };
  for (const auto& row : rows) {
    Script play;
    play.kill_error = row.error;
    EXPECT_EQ(Told(Play(play, [&] { Note(KillSearchWorker(row.pid) ? "true" : "false"); }),
                   {"kill", "log", "true", "false"}),
              row.expected);
  }
}

TEST(Stop, EndsEachSearchThatItCanOpen) {
  const std::string open = "Task(ann,t1); WaitKeyReady(data,pid,60)";
  const std::string end = "; Task.finish(t1,false); ~Task(t1); reply 0 null";
  const Row rows[] = {
      {"an unknown id is skipped", R"("gone,t1")", "",
       "Task(ann,gone); " + open + "; kill(77,15)" + end},
      {"finished: no signal", R"(["t1",{}])", "finished", open + end},
      {"never ready", R"("t1")", "fail WaitKeyReady",
       open + "; log S:620 Failed to get json data" + end},
      {"no data", R"("t1")", "no data", open + "; log S:624 Failed to get json data" + end},
      {"no ids at all", "{}", "", "reply 0 null"},
  };
  for (const auto& row : rows) {
    Script play = EndScript("stop", row.ids);
    play.Arrange(row.arrange);
    EXPECT_EQ(Told(Serve(play, SearchAPIEntry),
                   {"Task", "~Task", "Wait", "kill", "log", "reply", "threw"}),
              row.expected)
        << row.why;
  }
}

TEST(Clean, AnswersAtOnce) {
  EXPECT_EQ(Told(Serve(EndScript("clean", R"("t1")"), SearchAPIEntry),
                 {"NLIBC", "Task", "reply", "_exit"}),
            "NLIBCProcFork(); reply 0 {}");
}

TEST(Clean, RemovesTheDatabaseBeforeTheTask) {
  const std::string opened = "Task(ann,t1); WaitKeyReady(data,sdbid,60); ";
  const std::string killed = "kill(77,15); ";
  const std::string database = "getDBTask(/volume1,db1); ";
  const std::string removed = database + "DBTask.remove(); ~DBTask; ";
  const std::string task = "Task.remove(t1); ~Task(t1); ";
  const std::string end = "_exit(0)";
  const Row rows[] = {
      {"running", R"("t1")", "child", opened + killed + removed + task + end},
      {"two, of which one is gone: nothing of the first is removed twice", R"("t1,gone")", "child",
       opened + killed + removed + task + "Task(ann,gone); " + end},
      {"finished", R"("t1")", "child, finished", opened + removed + task + end},
      {"never ready", R"("t1")", "child, fail WaitKeyReady",
       opened + "log S:682 Failed to get json data; " + task + end},
      {"no data", R"("t1")", "child, no data",
       opened + "log S:687 Failed to get json data; " + task + end},
      {"no volume", R"("t1")", "child, no volume", opened + killed + task + end},
      {"a process id that is none", R"("t1")", "child, spoil pid",
       opened + "log S:580 invalid process id; " + removed + task + end},
      {"no database", R"("t1")", "child, fail getDBTask", opened + killed + database + task + end},
      {"no child: the request process does the work and ends", R"("t1")", "fail NLIBCProcFork",
       "log S:668 Failed to fork().; " + opened + killed + removed + task + end},
      {"a record with an object for its database: the next one is cleaned all the same",
       R"("t1,t1")", "child, spoil sdbvol", opened + killed + task + opened + killed + task + end},
      {"an exception ends no more than its search", R"("t1")", "child, throw getDBTask",
       opened + killed + database + task + end},
  };
  for (const auto& row : rows) {
    Script play = EndScript("clean", row.ids);
    play.Arrange(row.arrange);
    EXPECT_EQ(Told(Serve(play, SearchAPIEntry), {"Task", "~Task", "Wait", "kill", "getDB", "DBTask",
                                                 "~DBTask", "log", "reply", "_exit", "threw"}),
              row.expected)
        << row.why;
  }
}

TEST(CleanAll, RemovesTheUsersFoldersByShell) {
  const std::string escape = "NLIBCEncShParam(ann,1477); ";
  const std::string remove =
      escape + "NLIBCExec(/bin/sh,-c,rm -rf /volume*/@tmp/webfm/FBSearch/<escaped>,null); _exit(0)";
  const Row rows[] = {
      {"the parent answers", "null", "", "fork(); reply 0 null"},
      {"no child", "null", "fail fork", "fork(); log S:741 Failed to fork().; reply 401 null"},
      {"searches are stopped first", R"("t1")", "child",
       "fork(); kill(77,15); Task.finish(t1,false); " + remove},
      {"no ids", "null", "child, no taskid", "fork(); " + remove},
      {"a name that cannot be escaped reaches no shell", "[]", "child, fail NLIBCEncShParam",
       "fork(); " + escape + "log S:764 Failed to escape string: ann; _exit(0)"},
      {"an exception ends the child", R"("t1")", "child, throw WaitKeyReady", "fork(); _exit(0)"},
  };
  for (const auto& row : rows) {
    Script play = EndScript("Clean", row.ids);
    play.params["action"] = "cleanall";
    play.Arrange(row.arrange);
    EXPECT_EQ(Told(Serve(play, SearchAPIEntry),
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
