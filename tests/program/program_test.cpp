#include "tests/program/program_test.h"

#include <pwd.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <memory>

#include "nas/base/file_io.h"
#include "nas/base/json_text.h"
#include "nas/base/unique_fd.h"
#include "nas/system/user_state.h"
#include "nas/webapi/module.h"
#include "platform/task.h"

namespace program_test {

namespace fs = std::filesystem;

namespace {

const nas::Module& LoadedModule() {
  static const nas::Module module(std::string(ARBORY_BIN_DIR) + "/NUVA.Arbory.Search.so");
  return module;
}

Reply MakeCall(const std::string& api, int version, const std::string& method,
               const Json::Value& params, const std::string& user) {
  const NUVA::APIMethod* row = LoadedModule().Find(api, version, method);
  if (row == nullptr) return {};
  // With a lease, so that a test run that is killed leaves no search behind.
  const nas::ApiCall call = {method, params, user, "test", /*leased=*/true};
  const std::string text = nas::RunCall(*row, call, nas::EncodeJsonReply).body;
  const Json::Value reply = Json_(text);
  return {reply["code"].asInt(), reply["data"]};
}

std::vector<std::string> FilesIn(const std::string& folder) {
  std::vector<std::string> files;
  std::error_code none;
  for (const auto& entry : fs::directory_iterator(folder, none)) files.push_back(entry.path());
  return files;
}

// Where this process and its calls log.
std::string g_log;

void LogTo(const std::string& path, const char* format, va_list arguments) {
  char line[1024];
  const int length = vsnprintf(line, sizeof line - 1, format, arguments);
  const nas::UniqueFd file(open(path.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC));
  const std::string text(line, std::min<size_t>(length, sizeof line - 1));
  if (!nas::WriteAll(file.get(), text + "\n")) abort();
}

}  // namespace

Json::Value Json_(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(nas::ParseJson(text, &value)) << text;
  return value;
}

std::vector<std::string> Pieces(const std::string& text, char end) {
  std::vector<std::string> pieces;
  size_t from = 0;
  for (size_t at; (at = text.find(end, from)) != std::string::npos; from = at + 1) {
    pieces.push_back(text.substr(from, at - from));
  }
  EXPECT_EQ(from, text.size()) << "the last piece has no end";
  return pieces;
}

void ProgramTest::SetUp() {
  LoadedModule();  // what loading opens is not what a test leaves open
  PlatformTest::SetUp();
  g_log = dir_ + "/log";
  WriteFile(g_log, "");
  ASSERT_EQ(chmod(g_log.c_str(), 0666), 0);  // calls log as their users
  share_ = MakeFolder("volume1/share");
  const std::string bin = MakeFolder("bin");
  for (const char* file : {"arbory", "libarbory_nas.so", "NUVA.Arbory.Search.so"}) {
    fs::copy_file(fs::path(ARBORY_BIN_DIR) / file, fs::path(bin) / file);
  }
  program_ = bin + "/arbory";
  PrepareFor(nas_test::Me(), state_);
  if (nas_test::AmRoot()) PrepareFor(nas_test::kOtherUser, dir_ + "/other-state");
}

// A folder of the user's own for their state, configuration and output.
void ProgramTest::PrepareFor(const std::string& user, const std::string& state) {
  const std::string own = MakeFolder("as-" + user);
  fs::create_directories(state);
  WriteFile(own + "/arbory.toml",
            "state_dir = \"" + state + "\"\nvolumes = [\"" + dir_ + "/volume*\"]\n");
  const passwd* account = getpwnam(user.c_str());
  ASSERT_NE(account, nullptr);
  ASSERT_EQ(chown(own.c_str(), account->pw_uid, account->pw_gid), 0);
  ASSERT_EQ(chown(state.c_str(), account->pw_uid, account->pw_gid), 0);
}

// Leaks are looked for by tracing, which the system forbids in a process that has become a user.
static void LookForNoLeaks() {
  const char* options = getenv("ASAN_OPTIONS");
  const std::string without =
      (options == nullptr ? "" : std::string(options) + ":") + "detect_leaks=0";
  setenv("ASAN_OPTIONS", without.c_str(), 1);
}

std::string ProgramTest::OwnFolder() const { return dir_ + "/as-" + nas_test::Me(); }

pid_t ProgramTest::Launch(const std::vector<std::string>& arguments) {
  const std::string own = OwnFolder();
  const std::string config = own + "/arbory.toml";
  std::vector<std::string> words = {program_};
  words.insert(words.end(), arguments.begin(), arguments.end());
  std::vector<char*> pointers;
  for (std::string& word : words) pointers.push_back(word.data());
  pointers.push_back(nullptr);
  const pid_t child = fork();
  if (child != 0) return child;
  const int flags = O_WRONLY | O_CREAT | O_TRUNC;
  dup2(open((own + "/out").c_str(), flags, 0600), STDOUT_FILENO);
  dup2(open((own + "/err").c_str(), flags, 0600), STDERR_FILENO);
  setenv("ARBORY_CONFIG", config.c_str(), 1);
  if (geteuid() == 0 && std::ranges::find(words, "--user") != words.end()) LookForNoLeaks();
  if (chdir(share_.c_str()) == 0) execv(program_.c_str(), pointers.data());
  _exit(127);
}

Output ProgramTest::Finish(pid_t program) {
  int status = -1;
  const bool ended = Eventually([&] { return waitpid(program, &status, WNOHANG) == program; },
                                std::chrono::minutes(1));
  EXPECT_TRUE(ended) << "the program hangs";
  if (!ended) {
    kill(program, SIGKILL);
    waitpid(program, &status, 0);
  }
  const std::string own = OwnFolder();
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status),
          nas_test::ReadFile(own + "/out"), nas_test::ReadFile(own + "/err")};
}

Output ProgramTest::Run(const std::vector<std::string>& arguments) {
  return Finish(Launch(arguments));
}

Reply ProgramTest::Call(const std::string& method, const Json::Value& params,
                        const std::string& user) {
  return MakeCall("NUVA.Arbory.Search", 2, method, params, user);
}

Reply ProgramTest::CallHistory(const std::string& method, const Json::Value& params) {
  return MakeCall("NUVA.Arbory.Search.History", 1, method, params, nas_test::Me());
}

std::string ProgramTest::Start(const Json::Value& params, const std::string& user) {
  const Reply reply = Call("start", params, user);
  EXPECT_EQ(reply.code, 0);
  return reply.data["taskid"].asString();
}

Reply ProgramTest::ListToEnd(const std::string& id, const std::string& user) {
  Json::Value params;
  params["taskid"] = id;
  params["additional"] = "real_path,size,time,owner,perm,type";
  Reply reply;
  EXPECT_TRUE(Eventually([&] {
    reply = Call("list", params, user);
    return reply.code != 0 || reply.data["finished"].asBool();
  })) << "the search does not end";
  return reply;
}

Json::Value ProgramTest::TaskProperty(const std::string& id, const char* name,
                                      const std::string& user) {
  try {
    const std::unique_ptr<OKT::Task> task(OKT::TaskMgr(user.c_str()).getTaskWithThrow(id.c_str()));
    return task->getProperty(name);
  } catch (const std::exception&) {
    return "gone";
  }
}

std::string ProgramTest::Logged() const { return nas_test::ReadFile(g_log); }

std::vector<std::string> ProgramTest::Databases(const std::string& volume,
                                                const std::string& user) {
  std::vector<std::string> databases;
  for (const std::string& file : FilesIn(volume + "/@tmp/webfm/FBSearch/" + user)) {
    if (file.ends_with(".db")) databases.push_back(file);
  }
  return databases;
}

std::vector<std::string> ProgramTest::Remains(const std::string& user) {
  std::vector<std::string> remains;
  const std::string results = "/@tmp/webfm/FBSearch/" + user;
  for (const std::string& folder :
       {dir_ + "/volume1" + results, state_ + "/volume0" + results, nas::TaskFolder(user)}) {
    for (const std::string& file : FilesIn(folder)) {
      // The lock stays for the next task; a writer killed half-way leaves a file for the sweep.
      const std::string name = fs::path(file).filename();
      if (name != "lock" && !name.starts_with(nas::kTemporaryPrefix)) remains.push_back(file);
    }
  }
  return remains;
}

void ProgramTest::MakeEndlessFile(const std::string& path) {
  constexpr size_t kTextBytes = size_t{1} << 18;  // its beginning must look like text
  constexpr off_t kEndlessBytes = off_t{1} << 42;
  WriteFile(path, std::string(kTextBytes, 'a'));
  ASSERT_EQ(truncate(path.c_str(), kEndlessBytes), 0);
}

}  // namespace program_test

// Found before the C library's own by every library that this process loads.
extern "C" {
void syslog(int /*priority*/, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  program_test::LogTo(program_test::g_log, format, arguments);
  va_end(arguments);
}

void __syslog_chk(int /*priority*/, int /*flag*/, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  program_test::LogTo(program_test::g_log, format, arguments);
  va_end(arguments);
}
}
