// The parameters of every method: a few calls one after the other, on one user's state.

#include <filesystem>

#include "nas/base/json_text.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/module_calls.h"

namespace {

using fuzz::Call;
using fuzz::Outcome;
using fuzz::Side;

constexpr int kMostCalls = 4;
constexpr char kLastTask[] = "@";  // stands for the id of the search begun last

// "METHOD VERSION SIDE {PARAMETERS}"; nothing for a line that is no call.
std::optional<Call> ReadCall(std::string_view line, const std::string& last_task) {
  Call call;
  call.method = fuzz::Take(&line, ' ');
  call.version = fuzz::Take(&line, ' ') == "2" ? 2 : 1;
  const std::string_view side = fuzz::Take(&line, ' ');
  call.side = side == "worker" ? Side::kWorker : side == "nofork" ? Side::kNoFork : Side::kParent;
  if (!nas::ParseJson(line, &call.params, nas::kRequestMaxDepth) || !call.params.isObject()) {
    return {};
  }
  if (call.params["taskid"] == kLastTask) call.params["taskid"] = last_task;
  if (call.params["taskid"].isNull()) call.params.removeMember("taskid");
  return call;
}

void CheckPage(const Call& call, const Outcome& listed) {
  const Json::Value& files = listed.data["files"];
  DEMAND(files.size() <= listed.data["total"].asUInt64());
  const Json::Value& limit = call.params["limit"];
  if (limit.isUInt() && limit.asUInt() > 0) DEMAND(files.size() <= limit.asUInt());
  for (const Json::Value& file : files) {
    const std::string path = file["path"].asString();
    const bool home = path.starts_with("/home/");
    const std::string root = fuzz::Scratch() + "/volume1";
    const std::string real = root + (home ? "/homes/" + fuzz::User() + path.substr(5) : path);
    // Nothing is listed that is not there, and nothing outside the shares.
    DEMAND(std::filesystem::exists(std::filesystem::symlink_status(real)));
    DEMAND(path.find("/out/") == std::string::npos);
    DEMAND(path.find("@tmp") == std::string::npos);
  }
  const Outcome again = fuzz::Make(call);
  DEMAND(again.data == listed.data);
}

void CheckCall(const Call& call, std::string* last_task) {
  const Outcome outcome = fuzz::Make(call);
  if (call.method == "start") {
    const auto ids = fuzz::TaskIds();
    if (!ids.empty()) *last_task = ids.front();
    // Either side of a fork that was made leaves a record.
    if (outcome.ended || outcome.code == 0) DEMAND(!ids.empty());
  }
  if (call.method == "list" && outcome.code == 0 && outcome.data.isMember("files"))
    CheckPage(call, outcome);
}

}  // namespace

int fuzz::Target(std::string_view input) {
  fuzz::PreparePlatform();
  std::string last_task;
  for (int i = 0; i < kMostCalls && !input.empty(); ++i) {
    const auto call = ReadCall(fuzz::Take(&input, '\n'), last_task);
    if (!call) break;
    CheckCall(*call, &last_task);
  }
  fuzz::CleanPlatform();
  return fuzz::kUsed;
}
