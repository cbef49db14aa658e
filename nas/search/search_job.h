#pragma once
// One search from its first entry to its last: starts threads, as many as the machine can use, on
// each source of names in turn, makes their rows visible in time, reports, and ends them.

#include <sys/types.h>

#include <chrono>
#include <condition_variable>
#include <exception>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <thread>
#include <vector>

#include "nas/search/judge.h"
#include "nas/search/name_source.h"

namespace nas {

class SearchJob {
 public:
  struct Settings {
    // Called by the thread that runs the job, every few hundredths of a second, after the rows
    // found so far have been made visible.
    std::function<void(const WalkProgress&)> report;
    // Called once, on the same thread, when threads are still at work some time after the stop
    // flag: inside an expression that finds no end, or waiting for a file server that does not
    // answer. All rows are visible then. Run cannot return before those threads do, but a process
    // may choose to end.
    std::function<void()> stuck = {};
    int threads = 0;  // so many and no more; 0: as many as are of use
  };

  // `search` is borrowed.
  SearchJob(SharedSearch& search, Settings settings)
      : settings_(std::move(settings)), search_(search) {}

  // Runs to the end, once: all of `names`, then `contents` if the search asks for them. False when
  // the stop flag ended it. Every thread has ended when it returns, all rows are with the sink.
  // Throws what a thread failed with: what the sink or a source throws, std::bad_alloc.
  bool Run(NameSource& names, NameSource& contents);

 private:
  void RunPhase(NameSource& source);
  void StartThread(NameSource& source);
  void Tend(NameSource& source);
  void TakePlace();
  void StepBehind();
  void LookForStuckThreads(std::chrono::steady_clock::time_point now);
  void Flush();
  void Fail(std::exception_ptr failure);

  const Settings settings_;
  SharedSearch& search_;
  std::vector<std::unique_ptr<Judge>> judges_;  // by thread
  NameSource* source_ = nullptr;                // that threads feed from
  std::optional<std::chrono::steady_clock::time_point> stop_seen_;
  bool told_stuck_ = false;

  std::mutex mutex_;  // guards all up to failure_
  std::condition_variable ended_;
  int running_ = 0;
  std::vector<pid_t> threads_;  // that run
  bool behind_ = false;         // others
  std::exception_ptr failure_;

  // Last, so that they are joined before what they use goes.
  std::vector<std::jthread> handles_;
};

}  // namespace nas
