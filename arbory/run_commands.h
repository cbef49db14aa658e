#pragma once
// The commands of --exec and --exec-batch. No shell is between: a path is a word, or a part of one,
// whatever it holds.

#include <sys/types.h>

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "arbory/options.h"
#include "arbory/path_template.h"
#include "nas/base/unique_fd.h"

namespace arbory {

// For one thread. Commands have the process's identity, which must be the user's for good. Those of
// --exec run several at a time, without input, and what each one writes is kept until it ends, so
// that it stays together; a single one at a time, and those of --exec-batch, have the terminal.
class CommandRunner {
 public:
  // Throws UsageError for words that cannot be a command.
  explicit CommandRunner(const OutputOptions& options);
  ~CommandRunner();
  CommandRunner(const CommandRunner&) = delete;
  CommandRunner& operator=(const CommandRunner&) = delete;

  // Takes paths that each end with a NUL byte; waits while as many commands run as may. False where
  // no more are wanted: interrupted, the command cannot be run, or nobody takes what it writes.
  bool Take(std::string_view paths);
  // Runs what is left and waits for all. False where that did not come to its end, as above.
  bool Finish();
  // Why what a command wrote did not get on, as errno's value; 0 where all did.
  int failure() const { return failure_; }
  // Of all that have ended.
  bool all_succeeded() const { return all_succeeded_; }

 private:
  struct Job {
    pid_t pid = -1;
    nas::UniqueFd ended;  // its pidfd
    // What it has written; invalid where that went to this program's own.
    nas::UniqueFd output;
    nas::UniqueFd errors;
  };

  bool RunFor(std::string_view path);
  bool AddToBatch(std::string_view path);
  bool RunBatch();
  bool Start(std::vector<std::string> words, bool has_terminal);
  // Waits until fewer than `most` run.
  bool WaitFor(size_t most);
  bool End(Job job);
  bool Failed(int error_number);
  void StopAll();

  const bool batch_;
  const size_t jobs_;
  std::vector<PathTemplate> words_;
  size_t path_word_ = 0;            // of a batch: the one that stands for every path
  std::vector<std::string> paths_;  // of the batch that comes together
  size_t path_bytes_ = 0;
  size_t most_bytes_ = 0;
  std::vector<Job> running_;
  bool all_succeeded_ = true;
  bool broken_ = false;
  int failure_ = 0;
};

}  // namespace arbory
