// A module for the server's tests: its methods are slow, large, or end in ways that a real module's
// should not.

#include <signal.h>
#include <unistd.h>

#include <stdexcept>
#include <string>

#include "platform/webapi.h"

namespace {

constexpr char kApi[] = "Test";

int IntOf(NUVA::APIRequest* request, const char* name) {
  return request->GetParam(name, 0).asInt();
}

void Echo(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  Json::Value data;
  data["user"] = request->GetLoginUserName();
  data["method"] = request->GetAPIMethod();
  data["text"] = request->GetParam("text", "");
  response->SetError(0, data);
}

void Sleep(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  usleep(1000 * IntOf(request, "ms"));
  response->SetError(0, Json::Value());
}

void Big(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  response->SetError(0, std::string(static_cast<size_t>(IntOf(request, "bytes")), 'x'));
}

void Throw(NUVA::APIRequest*, NUVA::APIResponse*) { throw std::runtime_error("thrown"); }
void Die(NUVA::APIRequest*, NUVA::APIResponse*) { _exit(1); }

// Leaves a process behind that keeps the reply's pipe open and ends only by a signal.
void Worker(NUVA::APIRequest* request, NUVA::APIResponse* response) {
  const pid_t pid = fork();
  if (pid == 0) {
    for (;;) pause();
  }
  if (IntOf(request, "die") != 0) _exit(1);
  response->SetError(0, pid);
}

NUVA::APIMethod table[] = {
    {kApi, 1, "echo", Echo},        {kApi, 1, "sleep", Sleep}, {kApi, 1, "big", Big},
    {kApi, 1, "throw", Throw},      {kApi, 1, "die", Die},     {kApi, 1, "worker", Worker},
    {nullptr, 0, nullptr, nullptr},
};

}  // namespace

extern "C" NUVA::APIMethod* GetAPITable() { return table; }
