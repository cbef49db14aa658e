// Task records read back: whatever stands in the file, calls on it end at once, nobody is sent a
// signal (module_calls.cpp demands it), and what is written into a readable one keeps the rest.

#include <filesystem>

#include "nas/base/json_text.h"
#include "platform/task.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/module_calls.h"

namespace {

namespace fs = std::filesystem;
using fuzz::Side;

constexpr char kId[] = "0123456789abcdef0123456789abcdef";

std::string Path(const char* suffix) { return fuzz::Tasks() + "/" + kId + suffix; }

void Store(std::string_view record) {
  fuzz::WriteFile(Path(".json"), record);
  fuzz::WriteFile(Path(".lock"), "");
}

// Writing one property leaves the others as they were.
void CheckWriting() {
  const std::string user = fuzz::User();
  try {
    OKT::Task task(user.c_str(), kId);
    DEMAND(task.isFinished());
    const Json::Value data = task.getProperty("data");
    DEMAND(task.setProperty("fuzz", "new"));
    OKT::Task again(user.c_str(), kId);
    DEMAND(again.getProperty("fuzz") == "new" && again.getProperty("data") == data);
    DEMAND(WaitForTaskDataKeyReady(&again, "data", "sdbid", 0) ==
           (data.isObject() && data.isMember("sdbid") ? 1 : 0));
    DEMAND(again.finish(false) && again.remove());
  } catch (const std::runtime_error&) {
    // Not a record: it stays as it is.
  }
}

void CheckCalls() {
  Json::Value params;
  params["taskid"] = kId;
  for (const char* method : {"list", "stop"}) {
    const auto outcome = fuzz::Make({method, 2, Side::kParent, params});
    DEMAND(outcome.threw || outcome.code);
  }
  fuzz::Make({"clean", 2, Side::kNoFork, params});
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::PreparePlatform();
  const std::string_view record = fuzz::Text(data, size);
  Store(record);
  CheckWriting();
  Store(record);
  CheckCalls();
  fuzz::CleanPlatform();
  return fuzz::kUsed;
}
