// Stopping searches, cleaning them up, and cleaning up everything a user's searches left behind.
//
// Both cleans fork a child for the slow work, which outlives the request: the parent answers at
// once and waits for nothing; the child opens its own tasks and databases after the fork, writes to
// no stream of the server's, lets no exception out and ends with _exit(0).

#include "search/stop_clean.h"

#include <fcntl.h>
#include <sys/types.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <memory>

#include "api/codes.h"
#include "api/log.h"
#include "platform/system.h"
#include "platform/task_record.h"
#include "search/find_handler.h"
#include "search/search_state.h"

namespace {

// Tenths of a second: a search that never got so far is stopped or cleaned as it is.
constexpr int kCleanBound = 60;

// Every temporary search folder of the user, on whatever volume.
constexpr char kRemoveCommand[] = "rm -rf /volume*/%s/%s";
constexpr char kSearchFolder[] = "@tmp/webfm/FBSearch";
// Room for a user's name as one shell word: some 360 bytes of it if each had to be escaped, and no
// name is longer than 255. One that does not fit is not put into a command.
constexpr size_t kEscapedNameBytes = 1477;
// A command that was cut could remove another folder than the user's.
constexpr size_t kCommandBytes = 5088;
static_assert(kCommandBytes >= sizeof(kRemoveCommand) + sizeof(kSearchFolder) + kEscapedNameBytes);

// Null for an id that names no task.
OKT::Task* OpenTask(const OKT::TaskMgr& tasks, const Json::Value& id) {
  try {
    return tasks.getTaskWithThrow(id.asString().c_str());
  } catch (...) {
    return nullptr;
  }
}

// Null when the search never got so far as to write the member, or its data are gone. Logged.
Json::Value WaitForData(OKT::Task* task, const char* member, int not_ready_line, int null_line) {
  if (WaitForTaskDataKeyReady(task, task_record::kData, member, kCleanBound) == 0) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, not_ready_line);
    return Json::Value();
  }
  Json::Value data = task->getProperty(task_record::kData);
  if (data.isNull()) {
    syslog(LOG_ERR, "%s:%d Failed to get json data", kLogSource, null_line);
  }
  return data;
}

void StopWorker(const OKT::Task& task, const Json::Value& data) {
  if (task.isFinished()) return;
  // A record that was tampered with must not keep the others from being stopped.
  const Json::Value& pid = data[task_record::kPid];
  KillSearchWorker(pid.isInt() ? pid.asInt() : 0);
}

// Opens the search's task and database into the globals, as far as there are any.
void OpenSearch(const Json::Value& id, const OKT::TaskMgr& tasks,
                const FileSearch::WfmSearchDBTaskMgr& databases) {
  pTask = OpenTask(tasks, id);
  if (pTask == nullptr) return;
  const Json::Value data = WaitForData(pTask, task_record::kDatabaseId, log_line::kCleanNotReady,
                                       log_line::kCleanNoTaskData);
  if (data.isNull()) return;
  StopWorker(*pTask, data);
  if (data.isMember(task_record::kDatabaseId) && data.isMember(task_record::kDatabaseVolume)) {
    dbTask = databases.getDBTask(data[task_record::kDatabaseVolume].asString().c_str(),
                                 data[task_record::kDatabaseId].asString().c_str());
  }
}

template <class T>
void RemoveAndForget(T*& object) {
  if (object == nullptr) return;
  object->remove();
  delete object;
  object = nullptr;
}

// Nothing the child prints may reach the web server.
void DetachStreams() {
  const int fd = open("/dev/null", O_RDWR | O_CLOEXEC);
  if (fd < 0) return;
  for (const int stream : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) dup2(fd, stream);
  if (fd > STDERR_FILENO) close(fd);
}

}  // namespace

bool KillSearchWorker(int pid) {
  if (pid <= 0) {
    syslog(LOG_ERR, "%s:%d invalid process id", kLogSource, log_line::kInvalidPid);
    return false;
  }
  if (kill(pid, SIGTERM) == 0) return true;
  const int error = errno;
  if (error == ESRCH) return false;
  syslog(LOG_ERR, "%s:%d Failed to kill delete process, reason=%s(%d)", kLogSource,
         log_line::kKillFailed, strerror(error), error);
  return false;
}

Json::Value ArboryFindHandler::RequestedTaskIds() const {
  return StringExplodeEx(request()->GetParam("taskid", Json::Value()), ",",
                         request()->GetAPIVersion(), true);
}

bool ArboryFindHandler::WebFMFindCancelHandler() {
  if (!request()->HasParam("taskid")) {
    SetError(kCodeBadParameter);
    return false;
  }
  const Json::Value ids = RequestedTaskIds();
  const OKT::TaskMgr tasks(request()->GetLoginUserName().c_str());
  for (const Json::Value& id : ids) {
    const std::unique_ptr<OKT::Task> task(OpenTask(tasks, id));
    if (task == nullptr) continue;
    const Json::Value data = WaitForData(task.get(), task_record::kPid, log_line::kStopNotReady,
                                         log_line::kStopNoTaskData);
    if (!data.isNull()) StopWorker(*task, data);
    task->finish(false);
  }
  Json::Value nothing;
  SetResponse(nothing);
  return true;
}

// Where no child can be had the request process does the work itself and ends without a reply: the
// searches are gone in any case.
bool ArboryFindHandler::WebFMFindCleanHandler() {
  if (!request()->HasParam("taskid")) {
    SetError(kCodeBadParameter);
    return false;
  }
  const Json::Value ids = RequestedTaskIds();
  const std::string user = request()->GetLoginUserName();
  auto tasks = std::make_unique<OKT::TaskMgr>(user.c_str());
  auto databases = std::make_unique<FileSearch::WfmSearchDBTaskMgr>(user.c_str());
  const pid_t pid = NLIBCProcFork();
  if (pid > 0) {
    Json::Value nothing(Json::objectValue);
    SetResponse(nothing);
    return true;
  }
  if (pid < 0) syslog(LOG_ERR, "%s:%d Failed to fork().", kLogSource, log_line::kCleanFork);
  try {
    CleanSearches(ids, *tasks, *databases);
  } catch (...) {
    // What is left is removed when it has aged.
  }
  databases.reset();
  tasks.reset();
  _exit(0);
}

// The database goes first: while the task is there, the database can be found again. A record that
// was tampered with goes too, and keeps no other from being cleaned.
void ArboryFindHandler::CleanSearches(const Json::Value& ids, OKT::TaskMgr& tasks,
                                      const FileSearch::WfmSearchDBTaskMgr& databases) {
  for (const Json::Value& id : ids) {
    try {
      OpenSearch(id, tasks, databases);
    } catch (...) {
      // It names no database that could be opened.
    }
    RemoveAndForget(dbTask);
    RemoveAndForget(pTask);
  }
}

bool ArboryFindHandler::WebFMFindCleanAllHandler() {
  const pid_t pid = fork();
  if (pid < 0) {
    syslog(LOG_ERR, "%s:%d Failed to fork().", kLogSource, log_line::kCleanAllFork);
    SetError(kCodeFailed);
    return true;
  }
  if (pid > 0) {
    Json::Value nothing;
    SetResponse(nothing);
    fflush(stdout);
    return true;
  }
  try {
    DetachStreams();
    if (request()->HasParam("taskid")) WebFMFindCancelHandler();
    RemoveSearchFolders();
  } catch (...) {
    // The folders are removed when they have aged.
  }
  _exit(0);
}

void ArboryFindHandler::RemoveSearchFolders() {
  const std::string user = request()->GetLoginUserName();
  char escaped[kEscapedNameBytes] = {};
  if (NLIBCEncShParam(user.c_str(), escaped, sizeof(escaped)) < 0) {
    syslog(LOG_ERR, "%s:%d Failed to escape string: %s", kLogSource, log_line::kCleanAllEscape,
           user.c_str());
    return;
  }
  char command[kCommandBytes] = {};
  snprintf(command, sizeof(command), kRemoveCommand, kSearchFolder, escaped);
  NLIBCExec("/bin/sh", "-c", command, nullptr, 0);
}
