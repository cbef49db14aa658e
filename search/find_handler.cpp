// Method dispatch of the search API.

#include "search/find_handler.h"

#include <strings.h>

#include "api/codes.h"
#include "search/search_state.h"

namespace {

// The pointer keeps the old address; the process serves no second request.
struct TaskRelease {
  TaskRelease() = default;
  TaskRelease(const TaskRelease&) = delete;
  TaskRelease& operator=(const TaskRelease&) = delete;
  ~TaskRelease() { delete pTask; }
};

bool AsksForCleanAll(const NUVA::APIRequest& request) {
  if (!request.HasParam("action")) return false;
  const Json::Value action = request.GetParam("action", "");
  return action.isString() && strcasecmp(action.asCString(), "cleanall") == 0;
}

}  // namespace

void ArboryFindHandler::Process() {
  const std::string method = request()->GetAPIMethod();
  const TaskRelease release;
  if (method == "start") {
    WebFMFindHandler();
  } else if (method == "list") {
    WebFMFindRemainResultHandler();
  } else if (method == "stop") {
    WebFMFindCancelHandler();
  } else if (method == "clean") {
    WebFMFindCleanHandler();
  } else if (AsksForCleanAll(*request())) {
    WebFMFindCleanAllHandler();
  } else {
    SetError(kCodeBadCall);
  }
}

void ArboryFindHandler::StringExplodeCB(std::string& piece, long context) {
  if (context == 0) return;
  // NOLINTNEXTLINE(performance-no-int-to-ptr): splitters carry their context as a long.
  reinterpret_cast<std::vector<std::string>*>(context)->push_back(piece);
}
