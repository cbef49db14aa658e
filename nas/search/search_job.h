#pragma once
// One search from its first folder to its last: starts the threads (walk_thread.h), as many as the
// machine can use, makes their rows visible in time, reports, and ends them.

#include <sys/types.h>

#include <chrono>
#include <condition_variable>
#include <exception>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "nas/search/walk_thread.h"

namespace nas {

class SearchJob {
 public:
  struct Settings {
    bool recursive = true;
    bool search_content = false;
    std::string temporary_folder;  // for the list of files to read
    std::vector<int> unopened;     // errno of each location asked for that is not searched
    // Called by the thread that runs the job, every few hundredths of a second, after the rows
    // found so far have been made visible.
    std::function<void(const WalkProgress&)> report;
    // Called once, on the same thread, when threads are still at work some time after the stop
    // flag: inside an expression that finds no end, or waiting for a file server that does not
    // answer. All rows are visible then. Run cannot return before those threads do, but a process
    // may choose to end.
    std::function<void()> stuck;
  };

  SearchJob(const std::vector<Location>& locations, const std::vector<FileSearch::FindComp*>& comps,
            ResultWriter& writer, const int& stop_flag, Settings settings);

  // Runs to the end. False when the stop flag ended it. Throws what a thread failed with:
  // SqliteError, std::system_error, std::bad_alloc.
  bool Run();
  const WalkProgress& progress() const { return shared_.progress; }

 private:
  using Work = void (WalkThread::*)();

  void PushLocations();
  void RunPhase(Work work);
  void StartThread(Work work);
  void Tend(Work work);
  void LookForStuckThreads(std::chrono::steady_clock::time_point now);
  void Flush();
  void Fail(std::exception_ptr failure);

  const Settings settings_;
  SharedWalk shared_;
  std::vector<std::unique_ptr<WalkThread>> threads_;
  std::optional<std::chrono::steady_clock::time_point> stop_seen_;
  bool told_stuck_ = false;

  std::mutex mutex_;  // guards running_ and failure_
  std::condition_variable ended_;
  int running_ = 0;
  std::exception_ptr failure_;

  // Last, so that they are joined before what they use goes.
  std::vector<std::jthread> handles_;
};

}  // namespace nas
