// Calls made in a request child: what comes back whatever the entry function does, and what the
// child is given.

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <stdexcept>

#include "nas/base/json_text.h"
#include "nas/system/memory.h"
#include "nas/system/user_state.h"
#include "nas/system/volumes.h"
#include "nas/webapi/module.h"
#include "nas/webapi/runner.h"
#include "platform/filedb.h"
#include "platform/filesearch.h"
#include "platform/system.h"
#include "platform/task.h"
#include "platform/webfm.h"
#include "tests/nas/fixture.h"

namespace nas_test {
namespace {

using NUVA::APIRequest;
using NUVA::APIResponse;

constexpr char kGood[] = R"({"code":0,"data":true})";
constexpr char kNoReply[] = R"({"code":100,"data":null})";

class RunnerTest : public PlatformTest {
 protected:
  std::string Run(NUVA::APIEntry entry, const Json::Value& params = Json::Value(),
                  const std::string& user = Me()) {
    const NUVA::APIMethod row = {"Api", 2, "method", entry};
    return nas::RunCall(row, {"MeThod", params, user, "sid"}, nas::EncodeJsonReply).body;
  }
};

void Echo(APIRequest* request, APIResponse* response) {
  Json::Value data;
  data["user"] = request->GetLoginUserName();
  data["session"] = request->GetSessionID();
  data["preference"] = request->GetPreferenceDir();
  data["method"] = request->GetAPIMethod();
  data["version"] = request->GetAPIVersion();
  data["has"] = request->HasParam("a");
  data["a"] = request->GetParam("a", "fallback");
  data["b"] = request->GetParam("b", "fallback");
  response->SetError(0, data);
}

TEST_F(RunnerTest, TheRequestIsWhatTheClientSent) {
  Json::Value params;
  params["a"] = "\xFFx";
  const std::string head = "{\"code\":0,\"data\":{\"a\":";
  const std::string tail = ",\"method\":\"MeThod\",\"preference\":\"" +
                           nas::PreferenceFolder(Me()) + "\",\"session\":\"sid\",\"user\":\"" +
                           Me() + "\",\"version\":2}}";
  EXPECT_EQ(Run(Echo, params), head + "\"\xEF\xBF\xBDx\",\"b\":\"fallback\",\"has\":true" + tail);
  for (const Json::Value& none : {Json::Value(), Json::Value("a"), Json::Value(Json::arrayValue)}) {
    EXPECT_EQ(Run(Echo, none), head + "\"fallback\",\"b\":\"fallback\",\"has\":false" + tail);
  }
}

TEST_F(RunnerTest, SettingsAreMadeByAUsersFirstCallAlone) {
  const std::string settings = nas::PreferenceFolder(Me()) + "/usersettings";
  Run(Echo);
  EXPECT_EQ(ReadFile(settings), "{}\n");
  EXPECT_EQ(ModeOf(settings), 0600U);
  ASSERT_EQ(unlink(settings.c_str()), 0);
  Run(Echo);
  EXPECT_EQ(ReadFile(settings), "(none)");
  std::filesystem::remove_all(nas::TaskFolder(Me()));  // as a first call that was cut short
  Run(Echo);
  EXPECT_EQ(ReadFile(settings), "{}\n");
}

void ForkWorker(APIResponse* response, void (*work)(APIResponse*)) {
  if (NLIBCProcFork() == 0) {
    work(response);
    return;
  }
  response->SetError(0, "request");
}

TEST_F(RunnerTest, OneReplyComesWhateverTheEntryDoes) {
  const std::tuple<const char*, NUVA::APIEntry, std::string> rows[] = {
      {"an error with detail", [](APIRequest*, APIResponse* r) { r->SetError(408, "x"); },
       R"({"code":408,"data":"x"})"},
      {"no reply at all", [](APIRequest*, APIResponse*) {}, kNoReply},
      {"the last one counts",
       [](APIRequest*, APIResponse* r) {
         r->SetError(401, "x");
         r->SetError(0, Json::Value());
       },
       R"({"code":0,"data":null})"},
      {"an exception", [](APIRequest*, APIResponse*) { throw std::runtime_error("x"); }, kNoReply},
      {"an exception after a reply",
       [](APIRequest*, APIResponse* r) {
         r->SetError(0, 1);
         throw 5;
       },
       kNoReply},
      {"killed", [](APIRequest*, APIResponse*) { raise(SIGKILL); }, kNoReply},
      {"ended by itself", [](APIRequest*, APIResponse*) { _exit(0); }, kNoReply},
      {"killed, while a worker holds the pipe",
       [](APIRequest*, APIResponse*) {
         if (fork() == 0) {
           sleep(5);
           _exit(0);
         }
         raise(SIGKILL);
       },
       kNoReply},
      {"a worker that lives on",
       [](APIRequest*, APIResponse* r) {
         ForkWorker(r, [](APIResponse*) {
           sleep(5);
           _exit(0);
         });
       },
       R"({"code":0,"data":"request"})"},
      {"a worker that falls back and replies too",
       [](APIRequest*, APIResponse* r) {
         ForkWorker(r, [](APIResponse* copy) { copy->SetError(401, "worker"); });
       },
       R"({"code":0,"data":"request"})"},
  };
  for (const auto& [why, entry, reply] : rows) {
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(Run(entry), reply) << why;
    const auto took = std::chrono::steady_clock::now() - start;
    EXPECT_LT(took, std::chrono::seconds(4)) << why << ": waited for a worker";
  }
}

// A call whose failure has no number of its own is not answered with that of an earlier one.
TEST_F(RunnerTest, ACallKnowsNothingOfItsCallersFailures) {
  EXPECT_LT(WfmLibUGIDSet(nullptr, "no-such-user-here"), 0);
  ASSERT_EQ(WfmLibGetErr(), 405);
  const std::string reply =
      Run([](APIRequest*, APIResponse* r) { r->SetError(WfmLibGetErr(), NLIBCErrGet()); });
  EXPECT_EQ(reply, R"({"code":401,"data":0})");
}

// What the module makes while it serves a call is its user's alone.
TEST_F(RunnerTest, TheFileManagersUmaskClosesFiles) {
  umask(0);
  EXPECT_EQ(WfmLibUmask(), 0U);
  WriteFile(dir_ + "/made", "");
  EXPECT_EQ(ModeOf(dir_ + "/made"), 0600U);
  WfmLibRestoreUmask(027);
  EXPECT_EQ(umask(022), 027U);
}

TEST_F(RunnerTest, AReplyOfManyMegabytesComesWhole) {
  constexpr size_t kBytes = 12 << 20;
  const std::string reply =
      Run([](APIRequest*, APIResponse* r) { r->SetError(0, std::string(kBytes, 'x')); });
  EXPECT_EQ(reply.size(), kBytes + std::string(R"({"code":0,"data":""})").size());
  EXPECT_EQ(reply.find_first_not_of('x', 18), reply.size() - 2);
}

TEST_F(RunnerTest, AWorkersReplyNeitherComesFirstNorTearsTheRequests) {
  const std::string reply = Run([](APIRequest*, APIResponse* r) {
    const bool worker = fork() == 0;
    if (!worker) usleep(50'000);
    r->SetError(0, std::string(8 << 20, worker ? 'w' : 'r'));
  });
  EXPECT_EQ(std::count(reply.begin(), reply.end(), 'r'), 8 << 20);
  EXPECT_EQ(std::count(reply.begin(), reply.end(), 'w'), 0);
}

TEST_F(RunnerTest, TheChildHasNothingOfItsCaller) {
  const int leaked = open("/", O_RDONLY);
  const int high = fcntl(leaked, F_DUPFD, 700);
  signal(SIGTERM, SIG_IGN);
  sigset_t blocked, before;
  sigemptyset(&blocked);
  sigaddset(&blocked, SIGUSR1);
  sigprocmask(SIG_BLOCK, &blocked, &before);
  fputs("buffered", stdout);  // must not be written a second time by the child

  unsetenv("ARBORY_CHILD_STDERR");
  const std::string reply = Run([](APIRequest*, APIResponse* r) {
    Json::Value open_files(Json::arrayValue);
    for (int fd = 0; fd < 1024; ++fd) {
      struct stat info;
      if (fstat(fd, &info) != 0) continue;
      open_files.append(S_ISFIFO(info.st_mode) ? "pipe" : S_ISCHR(info.st_mode) ? "null" : "other");
    }
    Json::Value data;
    data["files"] = open_files;
    data["term"] = signal(SIGTERM, SIG_DFL) == SIG_DFL;
    data["pipe"] = signal(SIGPIPE, SIG_IGN) == SIG_IGN;
    sigset_t mask;
    sigprocmask(SIG_SETMASK, nullptr, &mask);
    data["mask"] = sigismember(&mask, SIGUSR1);
    r->SetError(0, data);
  });
  EXPECT_EQ(reply, R"({"code":0,"data":{"files":["null","null","null","pipe"],)"
                   R"("mask":0,"pipe":true,"term":true}})");
  sigprocmask(SIG_SETMASK, &before, nullptr);
  signal(SIGTERM, SIG_DFL);
  close(leaked);
  close(high);
}

TEST_F(RunnerTest, WorksWithStandardStreamsClosed) {
  EXPECT_TRUE(InChild([&] {
    unsetenv("ARBORY_CHILD_STDERR");  // set for sanitizers, it would keep the closed stream
    for (const int fd : {0, 1, 2}) close(fd);
    const std::string reply = Run([](APIRequest*, APIResponse* r) {
      int kept = 0;  // for what the call may execute
      for (const int fd : {0, 1, 2}) kept += fcntl(fd, F_GETFD) == 0;
      r->SetError(0, kept);
    });
    if (reply != R"({"code":0,"data":3})") _exit(1);
  }));
}

TEST_F(RunnerTest, WithoutAStateTheEntryIsNotCalled) {
  const NUVA::APIEntry entry = [](APIRequest*, APIResponse* r) { r->SetError(0, "called"); };
  EXPECT_EQ(Run(entry, Json::Value(), "no-such-user-here"), R"({"code":405,"data":null})");
  WriteFile(state_, "a file where the folder should be");
  const std::string reply = Run(entry);
  EXPECT_EQ(reply.find("called"), std::string::npos);
  EXPECT_EQ(reply, R"({"code":408,"data":null})");
}

// The real, effective, saved and file system's user ids of this process.
std::string UserIds() {
  const std::string status = ReadFile("/proc/self/status");
  const size_t at = status.find("Uid:");
  return status.substr(at, status.find('\n', at) - at);
}

// Values that are six times as long in a reply.
Json::Value LongInText(int count) {
  Json::Value values(Json::arrayValue);
  for (int at = 0; at < count; ++at) values.append(std::string(256 << 10, '\x01'));
  return values;
}
std::string TextOfLong(int count) {
  return R"({"code":0,"data":)" + nas::JsonText(LongInText(count), nas::JsonBytes::kClean) + "}";
}

// From where a call reads what its user can write, nothing leads back to root.
TEST_F(RunnerTest, RootsCallsGiveRootUpBeforeTheyReadWhatTheUserWrote) {
  SKIP_UNLESS_ROOT();
  MakeFolder("volume1");
  const std::pair<const char*, NUVA::APIEntry> rows[] = {
      {"a history",
       [](APIRequest* request, APIResponse* r) {
         const NUVA::WEBFM::FileDB store(request->GetPreferenceDir() + "/search_history.db");
         r->SetError(0, UserIds());
       }},
      {"a result database",
       [](APIRequest* request, APIResponse* r) {
         const std::string user = request->GetLoginUserName();
         const std::string volume = nas::ListVolumes().at(0);
         if (!nas::MakeResultFolder(volume, user)) return;
         const FileSearch::WfmSearchDBTaskMgr databases(user.c_str());
         delete databases.getDBTask(volume.c_str(), std::string(32, 'a').c_str());
         r->SetError(0, UserIds());
       }},
      {"a search that begins, with the folders for its results there",
       [](APIRequest* request, APIResponse* r) {
         const std::string user = request->GetLoginUserName();
         OKT::Task task(user.c_str(), nullptr);
         const bool has = nas::ResultVolume(nas::ListVolumes().at(0), user).ok();
         r->SetError(0, has ? UserIds() : "no folder");
         task.remove();
       }},
      {"a command",
       [](APIRequest*, APIResponse* r) {
         NLIBCExec("/bin/true", nullptr, nullptr, nullptr, 0);
         r->SetError(0, UserIds());
       }},
  };
  const NUVA::APIEntry first = [](APIRequest*, APIResponse* r) { r->SetError(0, UserIds()); };
  EXPECT_EQ(Run(first, Json::Value(), kOtherUser),
            R"({"code":0,"data":"Uid:\t65534\t65534\t0\t65534"})")
      << "until then it may";
  for (const auto& [why, entry] : rows) {
    EXPECT_EQ(Run(entry, Json::Value(), kOtherUser),
              R"({"code":0,"data":"Uid:\t65534\t65534\t65534\t65534"})")
        << why;
  }
}

template <size_t kMegabytes>
void Take(APIRequest*, APIResponse* response) {
  response->SetError(0, std::string(kMegabytes << 20, 'x').size() > 0);
}
template <size_t kMegabytes>
void TakeWithPermit(APIRequest* request, APIResponse* response) {
  if (nas::TakeLargePermit(request->GetLoginUserName())) Take<kMegabytes>(request, response);
}

TEST_F(RunnerTest, ACallMayNotTakeAllMemory) {
  if (!kMemoryIsBounded) GTEST_SKIP() << "sanitizers map more than they use";
  nas::Config config = nas::CurrentConfig();
  config.call_memory_mb = 64;
  config.large_call_memory_mb = 256;
  config.large_calls_per_user = 1;
  nas::Configure(config);
  const std::string too_large =
      R"({"code":100,"data":{"error":)"
      R"("The reply takes more memory than a call may have; ask for fewer rows."}})";
  const struct {
    const char* why;
    NUVA::APIEntry entry;
    std::string reply;
  } rows[] = {
      {"within the bound", Take<30>, kGood},
      {"beyond it", Take<100>, too_large},
      {"its reply is beyond it",
       [](APIRequest*, APIResponse* r) { r->SetError(0, std::string(30 << 20, '\n')); }, too_large},
      {"with a permit", TakeWithPermit<100>, kGood},
      {"beyond what a permit gives", TakeWithPermit<300>, too_large},
      {"in a worker there is no bound",
       [](APIRequest*, APIResponse* r) {
         const pid_t worker = NLIBCProcFork();
         if (worker == 0) _exit(std::string(100 << 20, 'x').size() > 0 ? 0 : 1);
         int status = -1;
         waitpid(worker, &status, 0);
         r->SetError(0, status);
       },
       R"({"code":0,"data":0})"},
  };
  for (const auto& row : rows) EXPECT_EQ(Run(row.entry), row.reply) << row.why;
  // A long reply's text is on the disk, as far as there is room.
  const NUVA::APIEntry entries[] = {
      [](APIRequest*, APIResponse* r) { r->SetError(0, LongInText(60)); },
      [](APIRequest*, APIResponse* r) {
        const rlimit small = {2 << 20, 2 << 20};
        setrlimit(RLIMIT_FSIZE, &small);
        r->SetError(0, LongInText(10));
      }};
  for (const bool room : {true, false}) {
    const std::string reply = Run(entries[room ? 0 : 1]);
    EXPECT_TRUE(reply == TextOfLong(room ? 60 : 10)) << room << reply.substr(0, 100);
  }
}

TEST_F(RunnerTest, OneUserHasFewLargeCallsAtOnce) {
  if (!kMemoryIsBounded) GTEST_SKIP() << "without a bound there are no permits";
  nas::Config config = nas::CurrentConfig();
  config.large_calls_per_user = 2;
  nas::Configure(config);
  // Three at once: the third has its permit when one of the others ends, and not before.
  const NUVA::APIMethod row = {
      "Api", 2, "method", [](APIRequest* request, APIResponse* r) {
        const std::string user = request->GetLoginUserName();
        const auto permit = nas::TakeLargePermit(user);
        const std::string held = nas::TaskFolder(user) + "/held";
        const std::string mine = held + std::to_string(getpid());
        WriteFile(mine, "");
        usleep(300'000);
        int count = 0;
        for (const auto& entry : std::filesystem::directory_iterator(nas::TaskFolder(user))) {
          count += entry.path().string().starts_with(held);
        }
        unlink(mine.c_str());
        r->SetError(0, permit.ok() && count <= 2);
      }};
  ASSERT_TRUE(nas::EnterUserState(Me()));
  std::vector<nas::Child> calls;
  for (int call = 0; call < 3; ++call) {
    calls.push_back(
        nas::StartCall(row, {"method", Json::Value(), Me(), "sid"}, nas::EncodeJsonReply));
  }
  for (nas::Child& call : calls) {
    EXPECT_EQ(nas::FinishCall(std::move(call), nas::EncodeJsonReply).body, kGood);
  }
}

TEST_F(RunnerTest, ACallIsAmongTheFirstToGoAndKnowsOfNoFailure) {
  NUVAUSER* nobody = nullptr;
  ASSERT_LT(NUVAUserGet("no-such-user-here", &nobody), 0);
  ASSERT_NE(NLIBCErrGet(), 0);
  const NUVA::APIEntry entry = [](APIRequest*, APIResponse* r) {
    Json::Value data;
    data["failure"] = NLIBCErrGet();
    nas::SetLastError(nas::kErrorOther);
    const pid_t worker = NLIBCProcFork();
    if (worker == 0) {
      const bool good = NLIBCErrGet() == 0 && ReadFile("/proc/self/oom_score_adj") == "500\n";
      _exit(good ? 0 : 1);
    }
    int status = -1;
    waitpid(worker, &status, 0);
    data["worker"] = status;
    r->SetError(0, data);
  };
  for (const std::string& user : {Me(), std::string(AmRoot() ? kOtherUser : Me())}) {
    EXPECT_EQ(Run(entry, Json::Value(), user), R"({"code":0,"data":{"failure":0,"worker":0}})")
        << user;
  }
}

std::string Frame(const std::string& text) {
  const std::uint64_t length = text.size();
  return std::string(reinterpret_cast<const char*>(&length), sizeof length) + text;
}

using State = nas::ReplyReader::State;

TEST(ReplyReader, RefusesWhatIsNoFrame) {
  const std::tuple<const char*, std::string, State> rows[] = {
      {"cut within the length", Frame("200 0\n\n").substr(0, 7), State::kMore},
      {"cut within the head", Frame("200 0\nName: x\n\n").substr(0, 20), State::kMore},
      {"ends within the head", Frame("200 0\n"), State::kBroken},
      {"no numbers", Frame("hello\n\n"), State::kBroken},
      {"one number", Frame("200\n\n"), State::kBroken},
      {"more than a number", Frame("200 0x\n\n"), State::kBroken},
      {"a field without a value", Frame("200 0\nName\n\n"), State::kBroken},
      {"a head without an end", Frame(std::string(17 << 10, 'x')), State::kBroken},
      {"a length that cannot be", std::string(100, '\x7F'), State::kBroken},
  };
  for (const auto& [why, bytes, state] : rows)
    EXPECT_EQ(nas::ReplyReader().Feed(bytes), state) << why;
}

TEST_F(RunnerTest, WhatIsNotAModuleIsRefused) {
  WriteFile(dir_ + "/text.so", "not a library");
  for (const std::string& path : {dir_ + "/none.so", dir_ + "/text.so", std::string("text.so")}) {
    EXPECT_THROW(nas::Module module(path), std::runtime_error) << path;
  }
}

}  // namespace
}  // namespace nas_test
