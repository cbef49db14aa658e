// Starting a search: the request process answers at once with the task's id, and a forked worker
// runs the search and records its outcome in the task.
//
// Protocol of the fork: the parent writes the task record once; the worker waits for that write
// before it touches the record, and is its only writer from then on. The parent never waits for
// the worker. SIGTERM is held back over the fork until the worker has its handler: a stop may come
// as soon as the parent has written, and must find a worker that ends in order. The worker holds no
// lock and no database handle of the parent's. It ends with _exit(0), so that none of the server's
// exit handlers run in it, with one exception: when the record is gone there is nothing to write
// the outcome to, and it returns through the handler as the request process would, replying through
// its own copy of the response. No exception leaves the worker.

#include <syslog.h>
#include <unistd.h>

#include <csignal>

#include "api/codes.h"
#include "api/log.h"
#include "platform/system.h"
#include "platform/task_record.h"
#include "search/find_handler.h"
#include "search/search_state.h"

namespace {

// Tenths of a second: the parent writes right after the fork.
constexpr int kFirstWriteBound = 60;

// "/SHARE/below" and "/SHARE" name the share SHARE. Throws std::out_of_range for an empty text.
std::string ShareOf(const std::string& location) {
  return location.substr(1, location.find('/', 1) - 1);
}

bool HasUnindexedShare(const Json::Value& locations) {
  if (!locations.isArray()) return false;
  for (const Json::Value& location : locations) {
    if (FILEIDXIsShareIndexed(ShareOf(location.asString()).c_str()) == 0) return true;
  }
  return false;
}

// Holds SIGTERM back while it lives.
class HeldStop {
 public:
  HeldStop() {
    sigset_t stop;
    sigemptyset(&stop);
    sigaddset(&stop, SIGTERM);
    sigprocmask(SIG_BLOCK, &stop, &before_);
  }
  ~HeldStop() { sigprocmask(SIG_SETMASK, &before_, nullptr); }
  HeldStop(const HeldStop&) = delete;
  HeldStop& operator=(const HeldStop&) = delete;

 private:
  sigset_t before_;
};

// Ends a worker that has no outcome to record: nobody may take the search for a running one.
[[noreturn]] void FinishAndExit() noexcept {
  try {
    if (pTask != nullptr) pTask->finish(false);
    if (dbTask != nullptr) dbTask->remove();
  } catch (...) {
    // The task manager finds the worker dead, and cleaning removes the database.
  }
  _exit(0);
}

}  // namespace

bool ArboryFindHandler::WebFMFindHandler() {
  if (!request()->HasParam("folder_path")) {
    SetError(kCodeBadParameter);
    return false;
  }
  Json::Value locations = StringExplodeEx(request()->GetParam("folder_path", ""), ",",
                                          request()->GetAPIVersion(), false);
  if (locations.empty()) {
    SetError(kCodeBadParameter);
    return false;
  }
  locations = RemoveDuplicatedLocations(locations);
  try {
    pTask = new OKT::Task(request()->GetLoginUserName().c_str(), nullptr);
  } catch (...) {
    SetError(kCodeFailed);
    return false;
  }
  pid_t pid = 0;
  {
    const HeldStop held;
    pid = NLIBCProcFork();
    if (pid == 0) std::signal(SIGTERM, DelSigHandler);
  }
  if (pid < 0) {
    syslog(LOG_ERR, "%s:%d Failed to fork().", kLogSource, log_line::kStartFork);
    SetError(kCodeFailed);
    return false;
  }
  return pid == 0 ? RunWorker(locations) : AnswerStart(pid, locations);
}

bool ArboryFindHandler::AnswerStart(pid_t worker, const Json::Value& locations) {
  Json::Value data;
  data[task_record::kTaskId] = pTask->getTaskId();
  data[task_record::kPid] = worker;
  data[task_record::kLocation] = locations;
  pTask->beginUpdate();
  pTask->setProperty(task_record::kProgress, task_record::kRunning);
  pTask->setProperty(task_record::kData, data);
  if (!pTask->endUpdate()) {
    syslog(LOG_ERR, "%s:%d Failed to write progress.", kLogSource, log_line::kStartTaskWrite);
  }
  Json::Value reply;
  reply["taskid"] = pTask->getTaskId();
  reply["has_not_index_share"] = HasUnindexedShare(locations);
  SetResponse(reply);
  return true;
}

bool ArboryFindHandler::RunWorker(const Json::Value& locations) {
  Json::Value result;
  bool succeeded = false;
  bool as_user = true;
  try {
    WaitForTaskDataReady(pTask, task_record::kData, kFirstWriteBound);
    const std::string session = request()->GetSessionID();
    std::vector<std::string> folders;
    for (const Json::Value& location : locations) folders.push_back(location.asString());
    as_user = TakeSessionIdentity(session);
    if (as_user) succeeded = WebFMFindAction(folders, result);
  } catch (...) {
    if (GetError() == 0) SetError(kCodeFailed);
  }
  // An identity failure is recorded even when the search was stopped meanwhile.
  if (as_user && StopRequested()) FinishAndExit();
  try {
    if (!RecordOutcome(succeeded, result)) return succeeded;
  } catch (...) {
    FinishAndExit();
  }
  if (StopRequested()) FinishAndExit();
  _exit(0);
}

bool ArboryFindHandler::TakeSessionIdentity(const std::string& session) {
  const std::string user = request()->GetLoginUserName();
  if (WfmLibUGIDSet(session.c_str(), user.c_str()) >= 0) return true;
  SetError(kCodeFailed);
  syslog(LOG_ERR, "%s:%d Failed to set UGID for user=%s, sid=%s", kLogSource,
         log_line::kWorkerIdentity, user.c_str(), session.c_str());
  return false;
}

// False when there is no record to write to.
bool ArboryFindHandler::RecordOutcome(bool succeeded, Json::Value& result) {
  pTask->reload();
  Json::Value data = pTask->getProperty(task_record::kData);
  if (data.isNull()) {
    syslog(LOG_ERR, "%s:%d Failed to get json data.", kLogSource, log_line::kWorkerNoTaskData);
    if (succeeded) SetResponse(result);
    return false;
  }
  pTask->beginUpdate();
  if (succeeded && GetError() == 0) {
    pTask->setProperty(task_record::kProgress, task_record::kSucceeded);
  } else {
    pTask->setProperty(task_record::kProgress, task_record::kFailed);
    data[task_record::kErrno] = GetError();
  }
  pTask->setProperty(task_record::kData, data);
  if (!pTask->finish(false)) {
    syslog(LOG_ERR, "%s:%d Failed to write progress.", kLogSource, log_line::kWorkerTaskWrite);
  }
  return true;
}
