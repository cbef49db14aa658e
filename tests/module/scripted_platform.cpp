#include "tests/module/scripted_platform.h"

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <json/reader.h>
#include <json/writer.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <sstream>
#include <stdexcept>
#include <type_traits>

#include "platform/filedb.h"
#include "platform/filesearch.h"
#include "platform/json_file.h"
#include "platform/system.h"
#include "platform/task.h"
#include "platform/webfm.h"

Script script;

namespace {

int trace_fd = -1;
constexpr char kSource[] = "NUVA.Arbory.Search:";

std::string Shown(const char* text) { return text == nullptr ? "null" : text; }
std::string Shown(const std::string& text) { return text; }
std::string Shown(const Json::Value& value) { return Text(value); }
template <typename Number>
requires std::is_arithmetic_v<Number> std::string Shown(Number number) {
  return std::to_string(number);
}

// Traces the call and lets the script act in it. True when it is to succeed.
template <typename... Arguments>
bool Called(const std::string& operation, const Arguments&... arguments) {
  std::string list;
  ((list += Shown(arguments) + ","), ...);
  if (!list.empty()) list.pop_back();
  Note(operation + "(" + list + ")");
  if (const auto act = script.at.find(operation); act != script.at.end()) act->second();
  if (!script.fail.contains(operation)) return true;
  errno = EACCES;
  return false;
}

// The same of what cannot fail and answers `value`.
template <typename Value, typename... Arguments>
Value Answer(Value value, const std::string& operation, const Arguments&... arguments) {
  Called(operation, arguments...);
  return value;
}

// The arguments that a criterion was made with. The key is not its address, in which a leak check
// would see an owner.
std::string& MadeWith(const FileSearch::FindComp* comp) {
  static std::map<std::uintptr_t, std::string> arguments;
  return arguments[~reinterpret_cast<std::uintptr_t>(comp)];
}

}  // namespace

struct FileSearch::Criterion {};

namespace {

class TextComp : public FileSearch::FindComp {
 public:
  explicit TextComp(const std::string& text) { MadeWith(this) = text; }
  ~TextComp() override { Note("~" + MadeWith(this)); }
  FileSearch::Criterion criterion() const override { return {}; }
};

template <class Comps>
std::string Describe(const Comps& comps) {
  std::string text;
  for (const FileSearch::FindComp* comp : comps) {
    const char* kind = "";
    if (dynamic_cast<const FileSearch::FindMTimeComp*>(comp) != nullptr) kind = "mtime ";
    if (dynamic_cast<const FileSearch::FindCRTimeComp*>(comp) != nullptr) kind = "crtime ";
    if (dynamic_cast<const FileSearch::FindATimeComp*>(comp) != nullptr) kind = "atime ";
    text += (text.empty() ? "" : "; ") + std::string(kind) + MadeWith(comp);
  }
  return "[" + text + "]";
}

class ScriptedRequest : public NUVA::APIRequest {
 public:
  std::string GetLoginUserName() const override { return script.user; }
  std::string GetSessionID() const override { return "sid"; }
  std::string GetPreferenceDir() const override { return "/prefs"; }
  std::string GetAPIMethod() const override { return script.method; }
  int GetAPIVersion() const override { return script.version; }
  bool HasParam(const std::string& name) const override { return script.params.isMember(name); }
  Json::Value GetParam(const std::string& name, const Json::Value& fallback) const override {
    Called("GetParam", name);
    return script.params.get(name, fallback);
  }
};

class ScriptedResponse : public NUVA::APIResponse {
 public:
  void SetError(int code, const Json::Value& data) override {
    Note("reply " + std::to_string(code) + " " + Text(data));
  }
};

pid_t RealFork() {
  static const auto real = reinterpret_cast<pid_t (*)()>(dlsym(RTLD_NEXT, "fork"));
  return real();
}

void LogLine(int priority, const char* format, va_list args) {
  char line[8192];
  vsnprintf(line, sizeof(line), format, args);
  std::string text = line;
  if (text.starts_with(kSource)) text.replace(0, strlen(kSource), "S:");
  Note((priority == LOG_ERR ? "log " : "log at another priority ") + text);
}

}  // namespace

// There only in builds with the leak sanitizer.
extern "C" int __lsan_do_recoverable_leak_check() __attribute__((weak));

// The C library's own, as far as the module's calls to them matter.
extern "C" {
void syslog(int priority, const char* format, ...) {
  va_list args;
  va_start(args, format);
  LogLine(priority, format, args);
  va_end(args);
}
void __syslog_chk(int priority, int /*flag*/, const char* format, ...) {
  va_list args;
  va_start(args, format);
  LogLine(priority, format, args);
  va_end(args);
}
[[noreturn]] void _exit(int code) {
  Note("_exit(" + std::to_string(code) + ")");
  syscall(SYS_exit_group, code);
  __builtin_unreachable();
}
pid_t fork() noexcept {
  if (trace_fd < 0) return RealFork();
  return Called("fork") ? script.fork_result : -1;
}
int kill(pid_t pid, int signal_number) noexcept {
  Note("kill(" + std::to_string(pid) + "," + std::to_string(signal_number) + ")");
  errno = script.kill_error;
  return script.kill_error == 0 ? 0 : -1;
}
int access(const char* path, int /*mode*/) noexcept {
  return script.vanished.contains(path) ? -1 : 0;
}
}

void Script::Arrange(const std::string& words) {
  std::istringstream in(words);
  for (std::string item; std::getline(in >> std::ws, item, ',');) {
    const std::string verb = item.substr(0, item.find(' '));
    const std::string what = verb == item ? "" : item.substr(verb.size() + 1);
    if (verb == "child") fork_result = 0;
    if (verb == "finished") finished = true;
    if (verb == "error") wfm_error = std::stoi(what);
    if (verb == "text") params[what] = "x";
    if (verb == "fail") fail.insert(what);
    if (verb == "throw") at[what] = [what] { throw std::runtime_error(what); };
    if (verb == "stop") at[what] = [] { raise(SIGTERM); };
    if (verb == "spoil") properties["data"][what] = Json::Value(Json::objectValue);
    if (verb == "lose") at[what] = [] { script.properties.clear(); };
    if (verb != "no") continue;
    if (what == "tasks") tasks.clear();
    if (what == "accounts") accounts.clear();
    if (what == "data") properties.clear();
    if (what == "volume") properties["data"].removeMember("sdbvol");
    if (what == "taskid") params.removeMember("taskid");
  }
}

void Note(const std::string& line) {
  const int saved = errno;
  const std::string text = line + "\n";
  if (trace_fd >= 0 && write(trace_fd, text.data(), text.size()) < 0) abort();
  errno = saved;
}

Json::Value Parse(const std::string& text) {
  Json::Value value;
  std::istringstream(text) >> value;
  return value;
}

std::string Text(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  return Json::writeString(builder, value);
}

NUVA::APIRequest* Request() {
  static ScriptedRequest request;
  return &request;
}

NUVA::APIResponse* Response() {
  static ScriptedResponse response;
  return &response;
}

Trace Play(const Script& play, const std::function<void()>& body) {
  int ends[2];
  if (pipe(ends) != 0) throw std::runtime_error("pipe");
  const pid_t pid = RealFork();
  if (pid == 0) {
    close(ends[0]);
    script = play;
    trace_fd = ends[1];
    bool leaked = false;
    try {
      body();
      leaked = &__lsan_do_recoverable_leak_check != nullptr && __lsan_do_recoverable_leak_check();
      Note("returned");
    } catch (const std::exception& e) {
      Note(std::string("threw ") + e.what());
    }
    syscall(SYS_exit_group, leaked ? 1 : 0);
  }
  close(ends[1]);
  FILE* in = fdopen(ends[0], "r");
  Trace trace;
  char* line = nullptr;
  size_t size = 0;
  for (ssize_t n = 0; (n = getline(&line, &size, in)) > 0;) trace.emplace_back(line, n - 1);
  free(line);
  fclose(in);
  int status = 0;
  waitpid(pid, &status, 0);
  EXPECT_EQ(status, 0) << "killed, leaking or found wanting by a sanitizer";
  return trace;
}

Trace Serve(const Script& play, NUVA::APIEntry entry) {
  return Play(play, [entry] { entry(Request(), Response()); });
}

Trace Keep(const Trace& trace, const std::vector<std::string>& words) {
  Trace kept;
  for (const std::string& line : trace) {
    if (std::any_of(words.begin(), words.end(),
                    [&](const std::string& word) { return line.starts_with(word); })) {
      kept.push_back(line);
    }
  }
  return kept;
}

std::string Told(const Trace& trace, const std::vector<std::string>& words) {
  std::string text;
  for (const std::string& line : Keep(trace, words)) text += (text.empty() ? "" : "; ") + line;
  return text;
}

// --- web file manager -------------------------------------------------------------------------

unsigned int WfmLibUmask() { return Answer(022U, "WfmLibUmask"); }
void WfmLibRestoreUmask(unsigned int mask) { Called("WfmLibRestoreUmask", mask); }
int WfmLibUGIDSet(const char* session, const char* user) {
  return Called(session == nullptr ? "RunIdentity" : "SessionIdentity", session, user) ? 0 : -1;
}
int WfmLibGetErr() {
  errno = ENOENT;  // what came after the failure that is to be logged
  return script.wfm_error;
}
int WfmParseErrnoToError(int error, const char* path, const char* other_path) {
  return Answer(error + 1, "WfmParseErrnoToError", path, other_path);
}
Json::Value StringExplodeEx(const Json::Value& value, const char* separator, int version,
                            bool drop_empty) {
  Called("Explode", value, separator, version, drop_empty ? "drop" : "keep");
  if (value.isArray()) return value;
  Json::Value pieces(Json::arrayValue);
  if (!value.isString()) return pieces;
  std::istringstream in(value.asString());
  for (std::string piece; std::getline(in, piece, *separator);) pieces.append(piece);
  return pieces;
}
void DumpFileInfo(int additional, const DIRENTRY_INFO& e, Json::Value& out, int, int) {
  std::ostringstream text;
  text << e.path << (e.is_dir ? " dir" : "") << " mask=" << additional;
  if (!e.real_path.empty()) text << " real=" << e.real_path;
  if (!e.type.empty()) text << " type=" << e.type;
  if (e.size != 0) text << " size=" << e.size;
  if (!e.user.empty())
    text << " owner=" << e.user << ',' << e.group << ',' << e.uid << ',' << e.gid;
  if (e.mtime != 0) {
    text << " time=" << e.atime << ',' << e.mtime << ',' << e.ctime << ',' << e.crtime;
  }
  if (e.mode != 0) text << " perm=" << e.mode << ',' << e.acl_privilege << ',' << e.acl_mode;
  out = text.str();
}
int GetACLPrivilege(const char* path) { return Answer(7, "GetACLPrivilege", path); }

// --- system -----------------------------------------------------------------------------------

int NUVAUserGet(const char* name, NUVAUSER** out) {
  if (!Called("NUVAUserGet", name) || !script.accounts.contains(name)) return -1;
  *out = new NUVAUSER{strdup(name), script.accounts[name], 0, nullptr};
  return 0;
}
void NUVAUserFree(NUVAUSER* user) {
  Note("NUVAUserFree");
  free(user->szName);
  delete user;
}
int NUVAGroupGet(const char* name, NUVAGROUP** out) {
  if (!Called("NUVAGroupGet", name) || !script.accounts.contains(name)) return -1;
  *out = new NUVAGROUP{strdup(name), script.accounts[name]};
  return 0;
}
void NUVAGroupFree(NUVAGROUP* group) {
  Note("NUVAGroupFree");
  free(group->szName);
  delete group;
}
int NUVAServiceHomePathGet(const char* user, char* buffer, size_t size) {
  if (!Called("HomePath", user, size)) return -1;
  errno = ENOENT;
  if (!script.homes.contains(user)) return -1;
  snprintf(buffer, size, "%s", script.homes[user].c_str());
  return 0;
}
int NUVAServiceUserHomeIsEnabled(const char* user, uid_t uid) {
  return Answer(script.home_enabled ? 1 : 0, "HomeIsEnabled", user, uid);
}
int NUVAACLIsSupport(const char* path, int fd, int flags) {
  return Answer(5, "ACLIsSupport", path, fd, flags);
}
int FILEIDXIsShareIndexed(const char* share) {
  return Answer(script.indexed.contains(share) ? 1 : 0, "IsShareIndexed", share);
}
pid_t NLIBCProcFork() { return Called("NLIBCProcFork") ? script.fork_result : -1; }
int NLIBCExec(const char* program, const char* arg1, const char* arg2, const char* arg3, int) {
  return Answer(0, "NLIBCExec", program, arg1, arg2, arg3);
}
int NLIBCEncShParam(const char* text, char* buffer, size_t size) {
  snprintf(buffer, size, "<escaped>");
  return Called("NLIBCEncShParam", text, size) ? 0 : -1;
}
int NLIBCErrGet() { return script.platform_error; }

// --- files ------------------------------------------------------------------------------------

bool Json::fromFile(const std::string& path, Json::Value& out) {
  out = script.settings;
  return Called("fromFile", path);
}
bool Json::toFile(const std::string& path, const Json::Value& value) {
  return Called("toFile", path, value);
}

namespace NUVA::WEBFM {

class FileDB::Store {};
FileDB::FileDB(const std::string& path) { Called("FileDB", path); }
FileDB::~FileDB() { Note("~FileDB"); }
bool FileDB::IsGood() const { return Called("FileDB.IsGood"); }
void FileDB::SetMaxRecordNum(int count) { Called("FileDB.Max", count); }
void FileDB::SetPrimaryKey(const std::string& key) { Called("FileDB.Key", key); }
bool FileDB::Insert(const Json::Value& record) { return Called("FileDB.Insert", record); }
bool FileDB::UpdateLastByTime(const Json::Value& record, long slots) {
  return Called("FileDB.Update", record, slots);
}
static std::string ConditionText(const FileDB::Condition& condition) {
  std::string text = std::to_string(condition.offset) + "," + std::to_string(condition.limit);
  for (const auto& [key, value] : condition.equal) text.append("," + key + "=" + value);
  return text;
}
bool FileDB::Delete(const Condition& condition) {
  return Called("FileDB.Delete", ConditionText(condition));
}
bool FileDB::Select(const Condition& condition, std::vector<Json::Value>& out) const {
  out = script.history;
  return Called("FileDB.Select", ConditionText(condition));
}
FileDB::Condition& FileDB::Condition::SetCondition(const std::string& key,
                                                   const std::string& value) {
  equal[key] = value;
  return *this;
}

}  // namespace NUVA::WEBFM

// --- tasks ------------------------------------------------------------------------------------

namespace OKT {

class Task::Record {
 public:
  std::string id;
};
Task::Task(const char* owner, const char* id) : record_(new Record{id == nullptr ? "new" : id}) {
  Called("Task", owner, id);
  if (!script.tasks.contains(record_->id) && id != nullptr) throw std::runtime_error("no task");
}
Task::~Task() { Note("~Task(" + record_->id + ")"); }
std::string Task::getTaskId() const { return record_->id; }
void Task::beginUpdate() { Called("Task.begin"); }
bool Task::endUpdate() { return Called("Task.end"); }
bool Task::setProperty(const char* name, const Json::Value& value) {
  const bool done = Called("Task.set", name, value);
  if (done) script.properties[name] = value;
  return done;
}
bool Task::reload() { return Called("Task.reload"); }
Json::Value Task::getProperty(const char* name) const {
  return script.properties.get(name, Json::Value());
}
bool Task::finish(bool keep_running) {
  return Called("Task.finish", record_->id, keep_running ? "true" : "false");
}
bool Task::isFinished() const { return script.finished; }
bool Task::remove() { return Called("Task.remove", record_->id); }

TaskMgr::TaskMgr(const char* owner) : owner_(owner) {}
Task* TaskMgr::getTaskWithThrow(const char* id) const { return new Task(owner_.c_str(), id); }

}  // namespace OKT

int WaitForTaskDataReady(OKT::Task* /*task*/, const char* name, int bound) {
  return Called("WaitReady", name, bound) ? 1 : 0;
}
int WaitForTaskDataKeyReady(OKT::Task* /*task*/, const char* name, const char* member, int bound) {
  return Called("WaitKeyReady", name, member, bound) ? 1 : 0;
}

// --- search engine ----------------------------------------------------------------------------

namespace FileSearch {

FindSizeComp::FindSizeComp(const char* op, long long bytes) : at_least_(*op == 'g'), bytes_(bytes) {
  MadeWith(this) = std::string("size ") + op + " " + std::to_string(bytes);
}
Criterion FindSizeComp::criterion() const { return {}; }
FindTimeComp::FindTimeComp(const char* op, long seconds) : after_(*op == 'a'), seconds_(seconds) {
  MadeWith(this) = std::string(op) + " " + std::to_string(seconds);
}
Criterion FindMTimeComp::criterion() const { return {}; }
Criterion FindCRTimeComp::criterion() const { return {}; }
Criterion FindATimeComp::criterion() const { return {}; }

int FindFactory::createFindOp(_tag_FIND_FIELD_ field, const char* arg1, const char* arg2,
                              std::vector<FindComp*>& comps) {
  const std::string what = "field " + Shown(int{field}) + " " + Shown(arg1) + "," + Shown(arg2);
  if (!Called("createFindOp " + std::to_string(field))) return 0;
  comps.push_back(new TextComp(what));
  return 1;
}

class WfmSearchWalker::Impl {};
WfmSearchWalker::WfmSearchWalker(const char* user, const char* session, OKT::Task* task,
                                 int* stop_flag) {
  Called(
      "Walker", user,
      Shown(session) + (task == nullptr ? ",no task" : "") + (*stop_flag != 0 ? ",stopped" : ""));
}
WfmSearchWalker::~WfmSearchWalker() { Note("~Walker"); }
bool WfmSearchWalker::init(const std::vector<std::string>& locations,
                           const std::vector<FindComp*>& comps) {
  std::string text;
  for (const std::string& location : locations) text.append(location + " ");
  return Called("Walker.init", text + Describe(comps));
}
void WfmSearchWalker::setSearchCurrentDir(bool current_only) {
  Called("Walker.current", current_only ? "true" : "false");
}
const char* WfmSearchWalker::getDBTaskId() { return "db1"; }
const char* WfmSearchWalker::getDBVol() { return "/volume1"; }
bool WfmSearchWalker::Walk(const std::vector<FindATimeComp*>& comps, const Json::Value& options) {
  return Called("Walk", Describe(comps) + Text(options));
}

class WfmSearchDBTask::Impl {};
WfmSearchDBTask::WfmSearchDBTask(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}
WfmSearchDBTask::~WfmSearchDBTask() { Note("~DBTask"); }
bool WfmSearchDBTask::remove() { return Called("DBTask.remove"); }
bool WfmSearchDBTask::delRecs(std::string share_name, std::string real_path) {
  if (!Called("DBTask.delRecs", share_name, real_path)) return false;
  std::erase_if(script.rows, [&](const ScriptedRow& row) { return real_path.ends_with(row.path); });
  return true;
}
bool WfmSearchDBTask::queryResult(unsigned long offset, unsigned long limit, const char* sort_by,
                                  const bool* ascending, const _tag_dir_entry_type_* type,
                                  const char* pattern, SelectCallback callback, void* context,
                                  unsigned long long* total) const {
  const bool done = Called("DBTask.query", offset, limit, sort_by, *ascending ? "asc" : "desc",
                           int{*type}, pattern);
  const std::vector<ScriptedRow> rows = script.rows;  // the selection is not disturbed by purges
  *total = rows.size();
  for (ScriptedRow row : rows) {
    char name[] = "n", extension[] = "Tar.gz", owner[] = "o", group[] = "g";
    const long past = (1L << 32) + 1;  // stamps keep their low 32 bits
    char* const root = row.root.data();
    char* const share = row.share.data();
    __tag_FILE_INFO_DATA data{
        root, share, name,       row.path.data(), extension, 0644,     owner,    group,
        10,   20,    row.is_dir, 1234567890123,   past,      past + 1, past + 2, past + 3};
    if (callback(&data, context) == 0) break;
  }
  return done;
}

WfmSearchDBTaskMgr::WfmSearchDBTaskMgr(const char* user) : user_(user) {}
WfmSearchDBTask* WfmSearchDBTaskMgr::getDBTask(const char* volume, const char* id) const {
  return Called("getDBTask", volume, id) ? new WfmSearchDBTask(nullptr) : nullptr;
}

}  // namespace FileSearch
