#include "arbory/running_search.h"

#include <exception>
#include <memory>

#include "nas/results/result_file.h"
#include "nas/system/volumes.h"
#include "platform/task.h"
#include "platform/webfm.h"

namespace arbory {
namespace {

int IntOf(const Json::Value& value) { return value.isInt() ? value.asInt() : 0; }
std::uint64_t CountOf(const Json::Value& value) { return value.isUInt64() ? value.asUInt64() : 0; }

// The member of an object; null of anything else, as a record is no better than its last writer.
const Json::Value& Member(const Json::Value& value, const char* name) {
  return value.isObject() ? value[name] : Json::Value::nullSingleton();
}

std::string Grouped(std::uint64_t number) {
  constexpr int kGroup = 3;
  std::string text = std::to_string(number);
  for (int at = static_cast<int>(text.size()) - kGroup; at > 0; at -= kGroup) text.insert(at, ",");
  return text;
}

std::string ResultsOf(const std::string& user, const Json::Value& data) {
  const Json::Value& volume = Member(data, "sdbvol");
  const Json::Value& id = Member(data, "sdbid");
  if (!volume.isString() || !id.isString() || !nas::IsResultId(id.asString())) return {};
  return nas::ResultPath(nas::ResultFolderPath(volume.asString(), user), id.asString());
}

// A table row of the program's own: makes a task as the user and removes it again, because the
// module keeps to itself why it could not make one.
void TryTask(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  const std::string user = request->GetLoginUserName();
  try {
    if (WfmLibUGIDSet(nullptr, user.c_str()) < 0) throw std::runtime_error("no such user");
    OKT::Task(user.c_str(), nullptr).remove();
    response->SetError(0, "");
  } catch (const std::exception& error) {
    response->SetError(nas::kCodeUnknownFailure, error.what());
  }
}

}  // namespace

SearchState ReadSearch(const std::string& user, const std::string& task_id) {
  SearchState state;
  try {
    const std::unique_ptr<OKT::Task> task(
        OKT::TaskMgr(user.c_str()).getTaskWithThrow(task_id.c_str()));
    state.exists = true;
    state.finished = task->isFinished();
    state.progress = IntOf(task->getProperty("progress"));
    const Json::Value data = task->getProperty("data");
    state.error = IntOf(Member(data, "errno"));
    state.pid = IntOf(Member(data, "pid"));
    state.results = ResultsOf(user, data);
    const Json::Value walk = task->getProperty("walk");
    if (Member(walk, "phase").isString()) state.phase = walk["phase"].asString();
    state.folders = CountOf(Member(walk, "folders"));
    state.entries = CountOf(Member(walk, "entries"));
    state.matches = CountOf(Member(walk, "matches"));
    state.unreadable = CountOf(Member(Member(walk, "skipped"), "permission"));
    state.troubled = CountOf(Member(Member(walk, "skipped"), "other"));
  } catch (const std::exception&) {
    // Somebody cleaned it: what was read so far is all there is.
  }
  return state;
}

std::string Counted(std::uint64_t number, const char* one, const char* many) {
  return Grouped(number) + " " + (number == 1 ? one : many);
}

std::string ProgressText(const SearchState& state, long seconds) {
  std::string text = "Searching " + std::to_string(seconds) + " s";
  if (state.phase.empty()) return text;
  text += ": " + Counted(state.folders, "folder", "folders") + ", " +
          Counted(state.entries, "entry", "entries") + ", " + Grouped(state.matches) + " found";
  if (state.phase == "contents") text += ", reading contents";
  return text;
}

std::string WhyNoTask(const Caller& caller) {
  const NUVA::APIMethod row = {"", 1, "", TryTask};
  const auto encode = [](int code, const Json::Value& data) {
    // Without a text the call did not come as far as making a task.
    if (data.isString()) return data.asString();
    return "the state directory " + nas::CurrentConfig().state_dir + " cannot be used (code " +
           std::to_string(code) + ")";
  };
  return caller.Call(row, "", Json::Value(), encode);
}

}  // namespace arbory
