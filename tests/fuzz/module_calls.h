#pragma once
// Calls of the module in this process, on the real platform over a state and a tree of its own.
// What would leave the process is played: forks, signals, and the shell command of clean-all.

#include <json/value.h>

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace fuzz {

// Makes the state, the volume and its files, once.
void PreparePlatform();
// The user whose calls they are, and the folders of that user's tasks and settings.
const std::string& User();
std::string Tasks();
std::string Preference();

// Which side of a fork the next calls go on as.
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

// Makes the call, and demands what holds of every call.
Outcome Make(const Call& call);

// The ids of the tasks that are stored.
std::vector<std::string> TaskIds();
// Removes tasks, results and histories.
void CleanPlatform();

}  // namespace fuzz
