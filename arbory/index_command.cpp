#include "arbory/index_command.h"

#include <fcntl.h>
#include <unistd.h>

#include <ctime>
#include <stdexcept>
#include <string>

#include "arbory/caller.h"
#include "arbory/index_table.h"
#include "arbory/terminal.h"
#include "nas/base/json_text.h"
#include "nas/index/broker.h"
#include "nas/index/client.h"
#include "nas/index/frames.h"
#include "nas/search/index_answer.h"

namespace arbory {
namespace {

void Say(const std::string& line) { Print(line + "\n"); }

Json::Value Report() {
  const auto text = nas::AskDaemon(nas::HelloKind::kReport);
  if (!text) throw std::runtime_error("no index daemon answers: " + text.error().Text());
  Json::Value report;
  if (!nas::ParseJson(*text, &report)) throw std::runtime_error("the daemon's report is broken");
  return report;
}

int ShowStatus(bool json) {
  const Json::Value report = Report();
  Print(json ? nas::JsonText(report, nas::JsonBytes::kClean) + "\n"
             : IndexTable(report, std::time(nullptr)));
  return report["current"].asBool() ? kExitSuccess : kExitNothing;
}

int Rebuild() {
  const auto answer = nas::AskDaemon(nas::HelloKind::kRebuild);
  if (!answer) throw std::runtime_error("no index daemon answers: " + answer.error().Text());
  Say(*answer);
  return *answer == "rebuilding" ? kExitSuccess : kExitError;
}

// Prints the differences of the file system that the tree is on. How many there are, or -1.
long long CheckTree(const std::string& tree) {
  const nas::UniqueFd folder(open(tree.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!folder) {
    Complain(tree + " cannot be opened");
    return -1;
  }
  const nas::IndexAnswer answer = nas::AskToCheck(folder.get());
  if (!answer.connection) {
    Complain(tree + " is not compared: " + answer.state);
    return -1;
  }
  nas::FrameReader reader(answer.connection.get(), nas::kMaxAnswerBytes);
  nas::Frame frame;
  while (reader.Read(-1, &frame) == nas::FrameReader::State::kFrame) {
    if (frame.type == nas::FrameType::kRows) Say(Escaped(frame.payload));
    if (frame.type != nas::FrameType::kEnd) continue;
    if (frame.payload.find_first_not_of("0123456789") == std::string::npos) {
      return std::stoll(frame.payload);
    }
    Complain(tree + ": " + frame.payload);
    return -1;
  }
  Complain(tree + ": the comparing broke off");
  return -1;
}

int Check() {
  const Json::Value report = Report();
  int code = kExitSuccess;
  for (const Json::Value& file_system : report["file_systems"]) {
    if (!file_system.isMember("trees")) throw UsageError("only root and the daemon's user may ask");
    const long long differences = CheckTree(file_system["trees"][0].asString());
    if (differences < 0) code = kExitError;
    if (differences > 0 && code == kExitSuccess) code = kExitNothing;
  }
  return code;
}

int RunDaemon() {
  const nas::Status ended = nas::RunIndexDaemon(
      nas::AnswerQuestion, [] { WriteOut(STDOUT_FILENO, "The index daemon answers.\n"); });
  if (!ended) throw std::runtime_error("the index daemon cannot start: " + ended.error().Text());
  return kExitSuccess;
}

}  // namespace

int RunIndexCommand(const IndexOptions& options) {
  if (!options.common.user.empty()) {
    throw UsageError("the index is everybody's; --user makes no difference to it");
  }
  const Caller caller(options.common);
  if (options.status) return ShowStatus(options.json);
  if (options.rebuild) return Rebuild();
  if (options.check) return Check();
  return RunDaemon();
}

}  // namespace arbory
