// The method table, the life of one call, and the dispatch by method name.

#include <gtest/gtest.h>

#include "api/webfm_webapi.h"
#include "module/table.h"
#include "search/find_handler.h"
#include "search/search_state.h"
#include "tests/module/scripted_platform.h"

namespace {

TEST(MethodTable, ListsElevenRowsBeforeItsEnd) {
  Trace rows;
  NUVA::APIEntry entry_of_version[3] = {};
  for (const NUVA::APIMethod* row = GetAPITable(); row->api != nullptr; ++row) {
    rows.push_back(std::string(row->api) + " " + std::to_string(row->version) + " " + row->method);
    if (std::string(row->api) == "NUVA.Arbory.Search") entry_of_version[row->version] = row->entry;
  }
  const Trace expected = {"NUVA.Arbory.Search 1 start",         "NUVA.Arbory.Search 1 list",
                          "NUVA.Arbory.Search 1 stop",          "NUVA.Arbory.Search 1 clean",
                          "NUVA.Arbory.Search 2 start",         "NUVA.Arbory.Search 2 list",
                          "NUVA.Arbory.Search 2 stop",          "NUVA.Arbory.Search 2 clean",
                          "NUVA.Arbory.Search.History 1 get",   "NUVA.Arbory.Search.History 1 set",
                          "NUVA.Arbory.Search.History 1 delete"};
  EXPECT_EQ(rows, expected);
  EXPECT_EQ(entry_of_version[1], entry_of_version[2]);
  EXPECT_EQ(GetAPITable()[11].entry, nullptr);
}

class ProbeHandler final : public FileWebAPI {
 public:
  ProbeHandler(std::function<void(FileWebAPI&)> work)
      : FileWebAPI(Request(), Response()), work_(std::move(work)) {}
  void Process() override { work_(*this); }

 private:
  std::function<void(FileWebAPI&)> work_;
};

TEST(Run, RepliesOnceWithWhatProcessSetLast) {
  const struct {
    const char* why;
    std::function<void(FileWebAPI&)> work;
    const char* reply;
  } rows[] = {
      {"nothing set is success", [](FileWebAPI&) {}, "reply 0 null"},
      {"an error discards the result",
       [](FileWebAPI& handler) {
         Json::Value result = "v";
         handler.SetResponse(result);
         handler.SetError(5);
       },
       "reply 5 null"},
      {"a result overrides the error",
       [](FileWebAPI& handler) {
         Json::Value result = "v";
         handler.SetError(5);
         handler.SetResponse(result);
       },
       "reply 0 \"v\""},
      {"a file error is an array of one",
       [](FileWebAPI& handler) { handler.SetFileError(408, "/a/b", 2); },
       R"(reply 408 [{"code":2,"path":"/a/b"}])"},
      {"errno is mapped by the library",
       [](FileWebAPI& handler) { handler.SetError(handler.ParseErrnoToError(41, "/a", nullptr)); },
       "reply 42 null"},
  };
  for (const auto& row : rows) {
    const Trace trace = Play(Script(), [&] { ProbeHandler(row.work).Run(); });
    EXPECT_EQ(Keep(trace, {"reply"}), Trace{row.reply}) << row.why;
    EXPECT_EQ(Keep(trace, {"WfmLibUmask", "RunIdentity", "WfmLibRestoreUmask"}),
              (Trace{"WfmLibUmask()", "RunIdentity(null,ann)", "WfmLibRestoreUmask(18)"}));
  }
}

TEST(Run, IdentityFailureIsLoggedWithItsOwnErrno) {
  Script play;
  play.method = "start";
  play.fail = {"RunIdentity"};
  play.wfm_error = 407;
  EXPECT_EQ(Serve(play, SearchAPIEntry),
            (Trace{"WfmLibUmask()", "RunIdentity(null,ann)",
                   "log webfm_webapi:54 Failed to set UGID, Permission denied", "reply 407 null",
                   "WfmLibRestoreUmask(18)", "returned"}));
}

TEST(Run, ExceptionPassesWithoutAReplyButNothingIsLeaked) {
  Script play;
  play.method = "start";
  play.params["folder_path"].append("");
  EXPECT_EQ(Keep(Serve(play, SearchAPIEntry), {"reply", "~Task", "WfmLibRestore", "threw"}).size(),
            3U);
  play.params["folder_path"][0] = "/x";
  play.Arrange("throw IsShareIndexed");
  EXPECT_EQ(Keep(Serve(play, SearchAPIEntry), {"reply", "~Task", "WfmLibRestore", "threw"}),
            (Trace{"~Task(new)", "WfmLibRestoreUmask(18)", "threw IsShareIndexed"}));
}

TEST(Dispatch, ChoosesByMethodThenByAction) {
  const struct {
    const char* method;
    const char* params;
    const char* mark;  // what only the chosen handler does
  } rows[] = {
      {"start", R"({"folder_path":"/x"})", "Task(ann,null)"},
      {"list", R"({"taskid":"t1"})", "SessionIdentity(sid,ann)"},
      {"stop", R"({"taskid":"t1"})", "Task.finish(t1,false)"},
      {"clean", R"({"taskid":"t1"})", "NLIBCProcFork()"},
      {"clean", R"({"taskid":"t1","action":"cleanall"})", "NLIBCProcFork()"},
      {"Clean", R"({"taskid":"t1","action":"cleanall"})", "fork()"},
      {"anything", R"({"action":"CLEANALL"})", "fork()"},
      {"cleanall", "{}", "reply 101 null"},
      {"Start", "{}", "reply 101 null"},
      {"x", R"({"action":"clean"})", "reply 101 null"},
      {"x", R"({"action":{}})", "reply 101 null"},
      {"start", "{}", "reply 400 null"},
      {"start", R"({"folder_path":""})", "reply 400 null"},
      {"start", R"({"folder_path":{}})", "reply 400 null"},
      {"list", "{}", "reply 400 null"},
      {"list", R"({"taskid":{}})", "reply 400 null"},
      {"stop", "{}", "reply 400 null"},
      {"clean", "{}", "reply 400 null"},
  };
  for (const auto& row : rows) {
    Script play;
    play.method = row.method;
    play.params = Parse(row.params);
    const Trace trace = Serve(play, SearchAPIEntry);
    EXPECT_EQ(Keep(trace, {row.mark}).size(), 1U) << row.method << ' ' << row.params;
    EXPECT_EQ(Keep(trace, {"reply"}).size(), 1U) << row.method << ' ' << row.params;
  }
}

TEST(StringExplodeCB, AppendsToItsContext) {
  std::vector<std::string> pieces;
  std::string piece = "a";
  ArboryFindHandler::StringExplodeCB(piece, 0);
  ArboryFindHandler::StringExplodeCB(piece, reinterpret_cast<long>(&pieces));
  EXPECT_EQ(pieces, Trace{"a"});
}

TEST(DelSigHandler, RaisesTheFlagForSigtermAlone) {
  const Trace trace = Play(Script(), [] {
    DelSigHandler(1);
    Note(StopRequested() ? "set" : "clear");
    DelSigHandler(15);
    Note(StopRequested() ? "set" : "clear");
  });
  EXPECT_EQ(trace, (Trace{"log S:57 Unknown Signal: 1", "clear", "set", "returned"}));
}

}  // namespace
