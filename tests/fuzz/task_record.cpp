// Task records read back: whatever stands in the file, calls on it end at once, nobody is sent a
// signal (module_calls.cpp demands it), and what is written into a readable one keeps the rest.

#include "platform/task.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/module_calls.h"

namespace {

using fuzz::Side;

constexpr char kId[] = "0123456789abcdef0123456789abcdef";

void Store(std::string_view record) {
  fuzz::WriteFile(fuzz::Tasks() + "/" + kId + ".json", record);
  fuzz::WriteFile(fuzz::Tasks() + "/" + kId + ".lock", "");
}

void CheckWriting() {
  const std::string user = fuzz::User();
  try {
    OKT::Task task(user.c_str(), kId);
    DEMAND(task.isFinished());
    const Json::Value data = task.getProperty("data");
    DEMAND(task.setProperty("fuzz", "new"));
    OKT::Task again(user.c_str(), kId);
    DEMAND(again.getProperty("fuzz") == "new" && again.getProperty("data") == data);
    DEMAND(again.finish(false) && again.remove());
  } catch (const std::runtime_error&) {
    // Not a record: it stays as it is.
  }
}

}  // namespace

int fuzz::Target(std::string_view record) {
  PreparePlatform();
  Store(record);
  CheckWriting();
  Store(record);
  Json::Value params;
  params["taskid"] = kId;
  for (const char* method : {"list", "stop"}) Make({method, 2, Side::kParent, params});
  Make({"clean", 2, Side::kNoFork, params});
  CleanPlatform();
  return kUsed;
}
