#include "tests/fuzz/module_calls.h"

#include <pwd.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <exception>
#include <filesystem>

#include "module/table.h"
#include "nas/base/json_text.h"
#include "nas/base/utf8.h"
#include "nas/system/config.h"
#include "nas/system/user_state.h"
#include "platform/system.h"
#include "platform/task_record.h"
#include "search/search_state.h"
#include "tests/fuzz/fuzz.h"

namespace {

namespace fs = std::filesystem;

constexpr pid_t kWorkerPid = 4711;

fuzz::Side g_side = fuzz::Side::kParent;
bool g_playing = false;  // whether a call is being made

// The end of a played process.
struct Ended {};

// A worker waits for what its parent writes.
void WriteAsParent() {
  if (pTask == nullptr) return;
  Json::Value data;
  data[task_record::kTaskId] = pTask->getTaskId();
  data[task_record::kPid] = kWorkerPid;
  data[task_record::kLocation] = Json::Value(Json::arrayValue);
  pTask->setProperty(task_record::kData, data);
}

class Response : public NUVA::APIResponse {
 public:
  explicit Response(fuzz::Outcome* outcome) : outcome_(outcome) {}
  void SetError(int code, const Json::Value& data) override {
    DEMAND(!outcome_->code);
    outcome_->code = code;
    outcome_->data = data;
  }

 private:
  fuzz::Outcome* outcome_;
};

NUVA::APIEntry EntryOf(const std::string& method) {
  if (method == "get") return SearchHistoryGetEntry;
  if (method == "set") return SearchHistorySetEntry;
  if (method == "delete") return SearchHistoryDeleteEntry;
  return SearchAPIEntry;
}

void MakeFiles(const std::string& volume) {
  for (const char* folder : {"/photo/2024", "/photo/empty", "/music", "/homes"}) {
    fs::create_directories(volume + folder);
  }
  fs::create_directories(volume + "/homes/" + fuzz::User());
  for (const char* name : {"/photo/a.jpg", "/photo/IMG_10.JPEG", "/photo/caf\xc3\xa9.txt",
                           "/photo/2024/broken\xff.jpg", "/music/new\nline.mp3"}) {
    fuzz::WriteFile(volume + name, "some words\nof a text\n");
  }
  fuzz::WriteFile(volume + "/homes/" + fuzz::User() + "/mine.tar.gz", "mine");
  fs::create_symlink("/", volume + "/photo/out");
}

}  // namespace

extern "C" {
void syslog(int /*priority*/, const char* /*format*/, ...) {}
void __syslog_chk(int /*priority*/, int /*flag*/, const char* /*format*/, ...) {}
pid_t fork() noexcept {
  DEMAND(g_playing);
  if (g_side == fuzz::Side::kParent) return kWorkerPid;
  errno = EAGAIN;
  if (g_side == fuzz::Side::kNoFork) return -1;
  WriteAsParent();
  return 0;
}
// Nobody works on a task of this process's, so nobody may be told to stop.
int kill(pid_t /*pid*/, int /*signal_number*/) noexcept {
  DEMAND(!g_playing);
  return -1;
}
void _exit(int code) {
  if (g_playing) throw Ended();
  _Exit(code);
}
pid_t setsid() noexcept { return 0; }
// Clean-all's child gives its standard streams away, which are this process's.
int dup2(int /*fd*/, int to) noexcept { return to; }
}

// The command may name the user's own folder and nothing else.
int NLIBCExec(const char* program, const char* arg1, const char* arg2, const char* arg3, int) {
  DEMAND(std::string(program) == "/bin/sh" && std::string(arg1) == "-c" && arg3 == nullptr);
  DEMAND(std::string(arg2).find(fuzz::User()) != std::string::npos);
  return 0;
}

namespace fuzz {

const std::string& User() {
  static const std::string user = getpwuid(geteuid())->pw_name;
  return user;
}

std::string Tasks() { return nas::TaskFolder(User()); }
std::string Preference() { return nas::PreferenceFolder(User()); }

void PreparePlatform() {
  static const bool prepared = [] {
    fs::permissions(Scratch(), fs::perms::owner_all);
    nas::Config config;
    config.state_dir = Scratch() + "/state";
    config.volumes = {Scratch() + "/volume*"};
    nas::Configure(config);
    MakeFiles(Scratch() + "/volume1");
    DEMAND(nas::EnterUserState(User()).ok());
    return true;
  }();
  (void)prepared;
}

Outcome Make(const Call& call) {
  Outcome outcome;
  g_side = call.side;
  g_playing = true;
  pTask = nullptr;
  dbTask = nullptr;
  termination_flag = 0;
  try {
    Request request(call);
    Response response(&outcome);
    EntryOf(call.method)(&request, &response);
  } catch (const Ended&) {
    outcome.ended = true;
  } catch (const std::exception&) {
    outcome.threw = true;
  }
  g_playing = false;
  std::signal(SIGTERM, SIG_DFL);
  // Listing leaves it to the end of its process.
  delete dbTask;
  dbTask = nullptr;
  DEMAND(outcome.ended || outcome.threw || outcome.code);
  if (outcome.ended) DEMAND(call.side != Side::kParent);
  const std::string text = nas::JsonText(outcome.data, nas::JsonBytes::kClean);
  Json::Value again;
  DEMAND(nas::IsUtf8(text) && nas::ParseJson(text, &again));
  return outcome;
}

std::vector<std::string> TaskIds() {
  std::vector<std::string> ids;
  for (const auto& entry : fs::directory_iterator(Tasks())) {
    if (entry.path().extension() == ".json") ids.push_back(entry.path().stem());
  }
  return ids;
}

void CleanPlatform() {
  for (const auto& entry : fs::directory_iterator(Tasks())) fs::remove(entry.path());
  for (const auto& entry : fs::directory_iterator(Preference())) {
    if (entry.path().extension() == ".db") fs::remove(entry.path());
  }
  for (const char* volume : {"/volume1", "/state/volume0"}) {
    const std::string results = Scratch() + volume + "/@tmp/webfm/FBSearch/" + User();
    if (!fs::exists(results)) continue;
    for (const auto& entry : fs::directory_iterator(results)) fs::remove(entry.path());
  }
}

}  // namespace fuzz
