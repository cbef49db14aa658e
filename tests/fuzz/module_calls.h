#pragma once
// Calls of the module in this process, on the real platform over a state and a tree of its own.
// What would leave the process is played: forks, signals, and the shell command of clean-all.

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/webapi.h"

namespace fuzz {

// Makes the state, the volume and its files, once.
void PreparePlatform();
// The user whose calls they are, and the folders of that user's tasks and settings.
const std::string& User();
std::string Tasks();
std::string Preference();

// Which side of a fork a call goes on as.
enum class Side { kParent, kWorker, kNoFork };

struct Call {
  std::string method;
  int version = 1;
  Side side = Side::kParent;
  Json::Value params{Json::objectValue};
};

struct Outcome {
  // The replies that the call gave: one, or none from a process that has ended (as workers do) and
  // from a call that an exception left, which the server answers.
  std::optional<int> code;
  Json::Value data;
  bool ended = false;
  bool threw = false;
};

class Request : public NUVA::APIRequest {
 public:
  explicit Request(Call call) : call_(std::move(call)) {}
  std::string GetLoginUserName() const override { return User(); }
  std::string GetSessionID() const override { return "session"; }
  std::string GetPreferenceDir() const override { return Preference(); }
  std::string GetAPIMethod() const override { return call_.method; }
  int GetAPIVersion() const override { return call_.version; }
  bool HasParam(const std::string& name) const override { return call_.params.isMember(name); }
  Json::Value GetParam(const std::string& name, const Json::Value& fallback) const override {
    return HasParam(name) ? call_.params[name] : fallback;
  }

 private:
  const Call call_;
};

// Makes the call, and demands what holds of every call.
Outcome Make(const Call& call);

// The ids of the tasks that are stored.
std::vector<std::string> TaskIds();
// Removes tasks, results and histories.
void CleanPlatform();

}  // namespace fuzz
