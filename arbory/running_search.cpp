#include "arbory/running_search.h"

#include <exception>
#include <memory>
#include <optional>

#include "nas/base/pause.h"
#include "nas/results/result_file.h"
#include "nas/results/result_reader.h"
#include "nas/system/volumes.h"
#include "nas/tasks/task_files.h"
#include "platform/task.h"
#include "platform/task_record.h"

namespace arbory {
namespace {

namespace record = task_record;

constexpr int kLooksAfterWriting = 2;

int IntOf(const Json::Value& value) { return value.isInt() ? value.asInt() : 0; }
std::uint64_t CountOf(const Json::Value& value) { return value.isUInt64() ? value.asUInt64() : 0; }

std::string TextOf(const Json::Value& value) { return value.isString() ? value.asString() : ""; }

const Json::Value& Member(const Json::Value& value, const char* name) {
  return value.isObject() ? value[name] : Json::Value::nullSingleton();
}

std::string ResultsOf(const std::string& user, const Json::Value& data) {
  const Json::Value& volume = Member(data, record::kDatabaseVolume);
  const Json::Value& id = Member(data, record::kDatabaseId);
  if (!volume.isString() || !id.isString() || !nas::IsResultId(id.asString())) return {};
  return nas::ResultPath(nas::ResultFolderPath(volume.asString(), user), id.asString());
}

void ReadWalk(Json::Value walk, RunningSearch* search) {
  search->all_found = Member(walk, record::kPhase) == record::kDonePhase;
  search->reads_contents = Member(walk, record::kPhase) == record::kContentsPhase;
  search->folders = CountOf(Member(walk, record::kFolders));
  search->entries = CountOf(Member(walk, record::kEntries));
  search->matches = CountOf(Member(walk, record::kMatches));
  const Json::Value& skipped = Member(walk, record::kSkipped);
  search->unreadable = CountOf(Member(skipped, record::kPermission));
  search->troubled = CountOf(Member(skipped, record::kOther));
  const Json::Value& files = Member(walk, record::kFiles);
  search->unreadable_files = CountOf(Member(files, record::kUnreadable));
  search->not_text = CountOf(Member(files, record::kNotText));
  const Json::Value& reading = Member(walk, record::kReading);
  search->content_files = CountOf(Member(reading, record::kFiles));
  search->content_of = CountOf(Member(reading, record::kOf));
  search->content_bytes = CountOf(Member(reading, record::kBytes));
  search->content_path = TextOf(Member(reading, record::kPath));
  const Json::Value& unread = Member(walk, record::kUnread);
  for (Json::ArrayIndex i = 0; unread.isArray() && i < unread.size(); ++i) {
    search->unread_folders.push_back(
        {TextOf(Member(unread[i], record::kPath)), IntOf(Member(unread[i], record::kUnreadErrno))});
  }
  search->source = TextOf(Member(walk, record::kSource));
  search->index = TextOf(Member(walk, record::kIndex));
  search->walk.swap(walk);
}

}  // namespace

RunningSearch ReadSearch(const std::string& user, const std::string& task_id) {
  RunningSearch search;
  try {
    const std::unique_ptr<OKT::Task> task(
        OKT::TaskMgr(user.c_str()).getTaskWithThrow(task_id.c_str()));
    search.exists = true;
    search.finished = task->isFinished();
    search.progress = IntOf(task->getProperty(record::kProgress));
    const Json::Value data = task->getProperty(record::kData);
    search.error = IntOf(Member(data, record::kErrno));
    search.pid = IntOf(Member(data, record::kPid));
    search.results = ResultsOf(user, data);
    search.location = Member(data, record::kLocation);
    ReadWalk(task->getProperty(record::kWalk), &search);
  } catch (const std::exception&) {
    // Somebody cleaned it.
  }
  return search;
}

void WaitForFirstRows(const std::string& user, const std::string& task_id, int tenths) try {
  const auto tasks = nas::TaskFiles::Open(user.c_str());
  if (!tasks) return;
  nas::GrowingPause pause(tenths);
  std::optional<nas::ResultReader> results;
  std::optional<nas::ResultWatch> watch;
  // What is written becomes visible a moment later, so the first look may come too soon.
  int looks = 0;
  const auto written = [&] {
    if (watch && watch->Changed()) looks = kLooksAfterWriting;
    return looks > 0 && looks-- > 0;
  };
  do {
    // In this order, so that the last rows are seen.
    const bool ended = !tasks->IsAlive(task_id);
    if (!results) {
      // The file's name is known when it is whole.
      const std::string path = ReadSearch(user, task_id).results;
      if (!path.empty()) {
        watch.emplace(path);
        results.emplace(path);
      }
    }
    if (results) {
      results->Begin();
      const bool any = results->rows() > 0;
      results->End();
      if (any) return;
    }
    if (ended) return;
  } while (pause.Wait(written));
} catch (const std::exception&) {
  // Whoever lists them says what is wrong.
}

nas::UniqueFd AskAfter(const std::string& user, const std::string& task_id) {
  const auto tasks = nas::TaskFiles::Open(user.c_str());
  return tasks ? tasks->Ask(task_id) : nas::UniqueFd();
}

std::vector<std::string> UnfinishedSearches(const std::string& user) {
  std::vector<std::string> unfinished;
  const auto tasks = nas::TaskFiles::Open(user.c_str());
  if (!tasks) return unfinished;  // a user who never searched has no tasks
  for (const std::string& id : tasks->Ids()) {
    const RunningSearch search = ReadSearch(user, id);
    if (search.exists && !search.finished) unfinished.push_back(id);
  }
  return unfinished;
}

}  // namespace arbory
