#include "arbory/search_text.h"

#include <cstdio>
#include <exception>
#include <iterator>

#include "arbory/terminal.h"
#include "nas/system/child.h"
#include "nas/system/config.h"
#include "nas/system/identity.h"
#include "nas/system/user_state.h"
#include "nas/webapi/runner.h"
#include "platform/errors.h"
#include "platform/task.h"
#include "platform/task_record.h"
#include "platform/webfm.h"

namespace arbory {
namespace {

std::string Grouped(std::uint64_t number) {
  constexpr int kGroup = 3;
  std::string text = std::to_string(number);
  for (int at = static_cast<int>(text.size()) - kGroup; at > 0; at -= kGroup) text.insert(at, ",");
  return text;
}

// "1.2 GB", 1024-based.
std::string SizeText(std::uint64_t bytes) {
  constexpr double kUnit = 1024;
  const char* const units[] = {"bytes", "KB", "MB", "GB", "TB", "PB"};
  auto size = static_cast<double>(bytes);
  size_t unit = 0;
  for (; size >= kUnit && unit + 1 < std::size(units); ++unit) size /= kUnit;
  char text[sizeof("1023.9 bytes")];
  std::snprintf(text, sizeof text, unit == 0 ? "%.0f %s" : "%.1f %s", size, units[unit]);
  return text;
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

std::string Counted(std::uint64_t number, const char* one, const char* many) {
  return Grouped(number) + " " + (number == 1 ? one : many);
}

std::string ProgressText(const RunningSearch& search, long seconds) {
  std::string text = "Searching " + std::to_string(seconds) + " s";
  if (search.walk.isNull()) return text;
  text += ": " + Counted(search.folders, "folder", "folders") + ", " +
          Counted(search.entries, "entry", "entries") + ", " + Grouped(search.matches) + " found";
  if (!search.reads_contents) return text;
  text = "Reading " + std::to_string(seconds) + " s: " + Grouped(search.content_files) + " of " +
         Counted(search.content_of, "file", "files") + ", " + SizeText(search.content_bytes) +
         ", " + Grouped(search.matches) + " found, " + Escaped(search.content_path);
  return text;
}

std::string SourceText(const RunningSearch& search) {
  namespace record = task_record;
  if (search.source == record::kFromIndex) return "from the index, " + search.index;
  if (search.source == record::kFromBoth) {
    return "from the index, and by walking (" + search.index + ")";
  }
  return "by walking (" + (search.index.empty() ? "index unknown" : search.index) + ")";
}

std::string FailureSentence(int code, const std::vector<std::string>& folders) {
  std::string where;
  for (const std::string& folder : folders) where += (where.empty() ? "'" : ", '") + folder + "'";
  switch (code) {
    case web_code::kPermission:
      return "permission denied: " + where;
    case web_code::kNoSuchFolder:
      return "no such folder: " + where;
    case web_code::kNoSuchAccount:
      return "unknown user or group";
    case web_code::kIllegal:
      return "illegal pattern, file type or folder: " + where;
    case web_code::kFailed:
      return "the search failed: there may be no space for its results; the system log tells more";
    default:
      return "the search failed (code " + std::to_string(code) + "); the system log may tell";
  }
}

std::string WhyNoSearch(const Caller& caller) {
  const NUVA::APIMethod row = {"", 1, "", TryTask};
  const auto encode = [](int code, const Json::Value& data) {
    return nas::Reply{{.code = code}, data.isString() ? data.asString() : ""};
  };
  const nas::Reply tried = caller.Call(row, "", Json::Value(), encode);
  if (tried.head.code == 0 || !tried.body.empty()) return tried.body;
  // The call did not come as far as making a task: what was in its way is in another child's too.
  const auto tell = [&](int pipe) {
    const nas::Status entered = nas::EnterUserState(caller.user());
    nas::SendReply(pipe, {{.code = 0}, entered ? "" : entered.error().Text()});
  };
  const nas::Config& config = nas::CurrentConfig();
  const std::string trouble =
      nas::FinishCall(nas::StartChild(tell, config.call_memory_bytes()), encode).body;
  if (trouble.empty()) return "code " + std::to_string(tried.head.code);
  return "the state directory " + config.state_dir + " cannot be used (" + trouble +
         "); state_dir in a configuration file" +
         (nas::CanBeRoot() ? "" : ", or $XDG_STATE_HOME,") + " names another";
}

}  // namespace arbory
