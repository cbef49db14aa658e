#pragma once
// A platform that does what a script says and keeps a trace of every call, in order, so that the
// module can be taken down each of its roads without a disk, a task store or a second user.
//
// A call is traced as "Operation(arguments)"; the module's log lines as "log TEXT" (with "S" for
// its source name "NUVA.Arbory.Search"), its reply as "reply CODE DATA", and how it ended as
// "returned", "threw TEXT" or "_exit(N)". A child that is killed or leaks fails the test.

#include <json/value.h>

#include <functional>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "platform/webapi.h"

using Trace = std::vector<std::string>;

struct ScriptedRow {
  std::string root, share, path;
  bool is_dir = false;
};

struct Script {
  std::string method;
  int version = 1;
  Json::Value params{Json::objectValue};
  std::string user = "ann";

  std::set<std::string> fail;                       // operations that report failure (EACCES)
  std::map<std::string, std::function<void()>> at;  // what happens inside an operation

  // Takes what happens in words, separated by ", ": "child" (forks are seen from the child),
  // "finished" (so are the tasks), "error N" (WfmLibGetErr), "no KEY" (of what there is), "text
  // KEY" (as a parameter's value), "spoil KEY" (of the task's data, an object now); and in
  // operation OP "fail OP", "throw OP", "stop OP" (SIGTERM comes), "lose OP" (the tasks' properties
  // are gone).
  void Arrange(const std::string& words);

  std::map<std::string, unsigned> accounts;  // users and groups
  std::map<std::string, std::string> homes;  // user, home directory
  bool home_enabled = true;
  std::set<std::string> tasks{"t1", "t2"};    // that can be opened
  Json::Value properties{Json::objectValue};  // of every task
  bool finished = false;
  int wfm_error = 0;
  int platform_error = 0;
  int fork_result = 4711;
  int kill_error = 0;
  std::set<std::string> indexed;
  std::vector<ScriptedRow> rows;
  std::set<std::string> vanished;
  std::vector<Json::Value> history;
  Json::Value settings{Json::objectValue};
};

// The script of the running process.
extern Script script;

// Adds a line to the trace.
void Note(const std::string& line);

Json::Value Parse(const std::string& text);
std::string Text(const Json::Value& value);

NUVA::APIRequest* Request();
NUVA::APIResponse* Response();

// Runs `body` under the script in a child process and returns its trace.
Trace Play(const Script& play, const std::function<void()>& body);
// As the server calls an entry.
Trace Serve(const Script& play, NUVA::APIEntry entry);

// The lines that begin with one of the words.
Trace Keep(const Trace& trace, const std::vector<std::string>& words);
// The same as one text, a line after the other with "; " between.
std::string Told(const Trace& trace, const std::vector<std::string>& words);
