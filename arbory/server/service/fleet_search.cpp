#include "arbory/server/service/fleet_search.h"

#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <memory>
#include <utility>

#include "arbory/running_search.h"
#include "arbory/server/service/fronts.h"
#include "arbory/server/service/user_calls.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/deadline.h"
#include "nas/base/json_text.h"
#include "nas/base/pause.h"
#include "nas/fleet/question.h"
#include "nas/results/result_file.h"
#include "nas/results/result_reader.h"
#include "nas/results/sort_key.h"
#include "nas/search/criteria.h"
#include "nas/system/config.h"
#include "nas/system/identity.h"
#include "nas/system/shares.h"
#include "platform/filesearch.h"
#include "platform/system.h"
#include "platform/task.h"
#include "platform/task_record.h"
#include "platform/webfm.h"

namespace arbory {
namespace {

namespace record = task_record;

constexpr char kTask[] = "task";
constexpr char kNotUnderstood[] = "This box does not understand the question.";
// Tenths of a second: the parent writes right after the fork.
constexpr int kFirstWriteBound = 60;

int g_stop = 0;
void Stop(int /*signal_number*/) { __atomic_store_n(&g_stop, 1, __ATOMIC_RELAXED); }

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

// The rows go to the front, which sorts them.
void LeaveUnsorted() {
  nas::Config config = nas::CurrentConfig();
  config.keep_orderings = false;
  nas::Configure(std::move(config));
}

// "/" stands for all shares that the user can enter.
std::vector<std::string> LocationsOf(const nas::FleetQuestion& question) {
  std::vector<std::string> locations;
  for (const std::string& location : question.locations) {
    if (location != "/") {
      locations.push_back(location);
      continue;
    }
    for (const nas::Share& share : nas::ListShares()) {
      if (CanList(share.root)) locations.push_back("/" + share.name);
    }
  }
  return locations;
}

bool Search(const std::string& user, const nas::FleetQuestion& question, OKT::Task* task) {
  nas::NodeComp criteria(question.query);
  FileSearch::WfmSearchWalker walker(user.c_str(), "", task, &g_stop);
  const std::vector<std::string> locations = LocationsOf(question);
  // Nothing that could be entered holds nothing.
  if (locations.empty()) return true;
  if (!walker.init(locations, {&criteria})) return false;
  walker.setSearchCurrentDir(!question.recursive);
  task->reload();
  Json::Value data = task->getProperty(record::kData);
  data[record::kDatabaseId] = walker.getDBTaskId();
  data[record::kDatabaseVolume] = walker.getDBVol();
  if (!task->setProperty(record::kData, data)) return false;
  Json::Value options;
  options["recursive"] = question.recursive;
  options["search_content"] = question.contents;
  return walker.Walk({}, options);
}

// What a search's worker does, the module's aside (search/start.cpp).
[[noreturn]] void RunWorker(const std::string& user, const nas::FleetQuestion& question,
                            OKT::Task* task) try {
  WaitForTaskDataReady(task, record::kData, kFirstWriteBound);
  LeaveUnsorted();
  const bool found = Search(user, question, task);
  if (g_stop == 0) {
    task->beginUpdate();
    task->setProperty(record::kProgress, found ? record::kSucceeded : record::kFailed);
    if (!found) {
      Json::Value data = task->getProperty(record::kData);
      data[record::kErrno] = NLIBCErrGet();
      task->setProperty(record::kData, data);
    }
  }
  task->finish(false);
  _exit(0);
} catch (const std::exception& error) {
  syslog(LOG_ERR, "fleet search: %s", error.what());
  _exit(0);  // the task is finished with its last process
}

// The new search's id; empty where it could not be begun.
std::string Begin(const std::string& user, const nas::FleetQuestion& question) try {
  OKT::Task task(user.c_str(), nullptr);
  pid_t pid = 0;
  {
    const HeldStop held;
    pid = NLIBCProcFork();
    if (pid == 0) std::signal(SIGTERM, Stop);
  }
  if (pid == 0) RunWorker(user, question, &task);
  if (pid < 0) {
    task.remove();
    return {};
  }
  Json::Value data;
  data[record::kTaskId] = task.getTaskId();
  data[record::kPid] = pid;
  for (const std::string& location : question.locations) data[record::kLocation].append(location);
  task.beginUpdate();
  task.setProperty(record::kProgress, record::kRunning);
  task.setProperty(record::kData, data);
  task.endUpdate();
  return task.getTaskId();
} catch (const std::exception& error) {
  syslog(LOG_NOTICE, "fleet search: %s", error.what());
  return {};
}

// What there is of a search, and up to where the rows were told.
struct Rows {
  std::uint64_t total = 0;
  std::uint64_t next = 0;
};

bool HasResults(const RunningSearch& search) {
  return !search.results.empty() && access(search.results.c_str(), F_OK) == 0;
}

Rows ReadRows(const RunningSearch& search, const nas::FleetPageRequest& page,
              nas::FleetPageWriter* writer) {
  Rows rows{0, page.after};
  if (!HasResults(search)) return rows;
  nas::ResultReader reader(search.results);
  reader.Begin();
  rows.total = reader.rows();
  const std::uint64_t end = std::min(rows.total, page.after + page.limit);
  for (; rows.next < end && (writer == nullptr || !writer->full()); ++rows.next) {
    const auto row = static_cast<std::uint32_t>(rows.next);
    if (writer != nullptr && !reader.purged(row)) writer->Add(reader.Row(row), row);
  }
  reader.End();
  return rows;
}

// In the order of a column. "Next" stays where it was, unless this is all there will be.
Rows ReadFirstRows(const RunningSearch& search, const nas::FleetPageRequest& page,
                   nas::FleetPageWriter* writer) {
  Rows rows{0, page.after};
  if (!HasResults(search)) return rows;
  nas::ResultReader reader(search.results);
  reader.Begin();
  rows.total = reader.rows();
  auto behind = page.behind;
  if (behind && *behind >= rows.total) behind.reset();
  size_t told = 0;
  for (const auto row : nas::FirstRows(reader, page.column, page.ascending, page.limit, behind)) {
    if (writer->full()) break;
    writer->Add(reader.Row(row), row);
    ++told;
  }
  reader.End();
  if (search.finished && !page.behind && rows.total <= told) rows.next = rows.total;
  return rows;
}

void Remove(const std::string& user, const std::string& id, const RunningSearch& search) {
  if (!search.results.empty()) nas::RemoveResultFile(search.results);
  OKT::Task(user.c_str(), id.c_str()).remove();
}

// Waits, as long as the front likes, for so many rows or the search's end.
RunningSearch WaitForRows(const std::string& user, const std::string& id,
                          const nas::FleetPageRequest& page, std::uint64_t enough) {
  nas::GrowingPause pause{std::chrono::milliseconds(page.wait_ms)};
  for (;;) {
    RunningSearch search = ReadSearch(user, id);
    if (!search.exists || search.finished) return search;
    // The first in an order are known when all are.
    if (page.column == nas::SortColumn::kFound) {
      if (ReadRows(search, page, nullptr).next >= page.after + enough) return search;
    }
    if (!pause.Wait()) return search;
  }
}

void AnswerPage(const std::string& user, const std::string& id, const nas::FleetPageRequest& page,
                std::uint64_t enough, NUVA::APIResponse* response) try {
  const RunningSearch search = WaitForRows(user, id, page, enough);
  if (!search.exists) return RefuseOwn(response, kNotFound, "There is no such search.");
  nas::FleetPageWriter writer;
  const Rows rows = page.column == nas::SortColumn::kFound ? ReadRows(search, page, &writer)
                                                           : ReadFirstRows(search, page, &writer);
  Json::Value body;
  body["protocol"] = nas::kFleetProtocol;
  body["version"] = ARBORY_VERSION;
  body[kTask] = id;
  body["finished"] = search.finished;
  body["error"] = search.progress < 0 ? search.error : 0;
  body["source"] = search.source;
  body["index"] = search.index;
  body["total"] = Json::UInt64{rows.total};
  body["next"] = Json::UInt64{rows.next};
  writer.Finish(&body);
  response->SetError(kOk, body);
  if (search.finished && rows.next >= rows.total) Remove(user, id, search);
} catch (const std::exception& error) {
  syslog(LOG_ERR, "fleet search: %s", error.what());
  RefuseOwn(response, kUnavailable, "The results cannot be read.");
}

// Table rows carry plain functions, so what the search needs waits here for the child, which is
// forked at once.
std::string g_front;

Json::Value ParamsOf(const NUVA::APIRequest& request, std::initializer_list<const char*> names) {
  Json::Value params(Json::objectValue);
  for (const char* name : names) params[name] = request.GetParam(name, Json::Value());
  return params;
}

void SearchEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  const auto question = nas::ReadFleetQuestion(
      ParamsOf(*request, {"protocol", "query", "contents", "recursive", "locations", "limit",
                          "wait_ms", "after", "sort_by", "descending", "behind"}));
  if (!question) return RefuseOwn(response, kBadRequest, kNotUnderstood);
  const std::string user = request->GetLoginUserName();
  if (const auto refusal = TakeSearchPlace(g_front)) {
    return RefuseOwn(response, refusal->status, "This front has as many searches as it may.");
  }
  const std::string id = Begin(user, *question);
  if (id.empty()) {
    return RefuseOwn(response, kUnavailable, "This user has as many searches as a user may.");
  }
  nas::GiveUpRoot();
  AnswerPage(user, id, question->page, question->page.limit, response);
}

void RowsEntry(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  nas::GiveUpRoot();
  const auto page = nas::ReadFleetPageRequest(
      ParamsOf(*request, {"limit", "wait_ms", "after", "sort_by", "descending", "behind"}));
  const Json::Value id = request->GetParam(kTask, Json::Value());
  if (!page || !id.isString()) return RefuseOwn(response, kBadRequest, kNotUnderstood);
  // Where there was none so far, somebody may be waiting for the first.
  const std::uint64_t enough = page->after == 0 ? 1 : page->limit;
  AnswerPage(request->GetLoginUserName(), id.asString(), *page, enough, response);
}

// Names of files need not be UTF-8, and go on as they are.
nas::Reply EncodePage(int code, const Json::Value& data) {
  if (data.isNull() || code < kOk) return EncodeOwnReply(code, data);
  return {{code, code}, nas::JsonText(data, nas::JsonBytes::kRaw)};
}

}  // namespace

nas::Child StartFleetSearch(const std::string& front, const nas::ApiCall& call) {
  g_front = front;
  return nas::StartCall({"arbory", 1, "", SearchEntry}, call, EncodePage);
}

nas::Child StartFleetRows(const nas::ApiCall& call) {
  return nas::StartCall({"arbory", 1, "", RowsEntry}, call, EncodePage);
}

}  // namespace arbory
