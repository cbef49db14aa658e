#pragma once
// One search at work: threads that read folders, judge entries and hand matches to the result
// database, and, when contents are asked for, read the files that remain.
//
// Policy. Symbolic links are results, never followed. Devices, sockets and pipes are results, never
// opened. A folder on another file system is entered unless it is a pseudo file system (proc, sysfs
// and their like) below a location; the temporary folders "@tmp" of volumes are never entered. What
// cannot be read is counted and left out; nothing but a full disk, a broken result database or the
// stop flag ends the job. The flag is looked at for every entry and every piece of a file.

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <exception>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "nas/engine/candidate_list.h"
#include "nas/engine/content_query.h"
#include "nas/engine/criteria.h"
#include "nas/engine/directory_reader.h"
#include "nas/engine/folder_stack.h"
#include "nas/engine/location.h"
#include "nas/engine/result_writer.h"
#include "nas/engine/walk_entry.h"
#include "nas/engine/walk_progress.h"

namespace nas {

// The criteria of a search, cheapest first. Comparators are borrowed.
struct Criteria {
  explicit Criteria(const std::vector<FileSearch::FindComp*>& comps);

  const PatternComp* pattern = nullptr;            // judged on its own: contents can stand in
  std::vector<const FileSearch::FindComp*> cheap;  // names and kinds
  std::vector<const FileSearch::FindComp*> attribute;
};

class SearchJob {
 public:
  struct Settings {
    bool recursive = true;
    bool search_content = false;
    std::string temporary_folder;  // for the list of files to read
    // Called by the thread that runs the job, every few hundredths of a second, after the rows
    // found so far have been made visible.
    std::function<void(const WalkProgress&)> report;
  };

  SearchJob(const std::vector<Location>& locations, const std::vector<FileSearch::FindComp*>& comps,
            ResultWriter& writer, const int& stop_flag, Settings settings);
  ~SearchJob();

  // Runs to the end. False when the stop flag ended it. Throws what a thread failed with:
  // SqliteError, std::system_error, std::bad_alloc.
  bool Run();
  const WalkProgress& progress() const { return progress_; }

 private:
  class Thread;  // one thread's buffers and rows

  void RunPhase(void (Thread::*work)());
  void Wait();
  void Flush();
  bool stopping() const;
  void Fail(std::exception_ptr failure);

  const std::vector<Location>& locations_;
  const Criteria criteria_;
  ResultWriter& writer_;
  const int& stop_flag_;
  const Settings settings_;
  std::optional<ContentQuery> content_;
  std::unique_ptr<CandidateList> candidates_;
  std::set<std::pair<dev_t, ino_t>> never_entered_;  // the @tmp folders of volumes
  std::set<std::pair<dev_t, ino_t>> location_ids_;   // filled when there is more than one
  WalkProgress progress_;
  FolderStack stack_;
  std::vector<std::unique_ptr<Thread>> threads_;

  std::mutex mutex_;  // guards running_ and failure_
  std::condition_variable ended_;
  int running_ = 0;
  std::exception_ptr failure_;
  std::atomic<bool> failed_ = false;
};

}  // namespace nas
