#pragma once
// The threads of a search: each reads folders, judges their entries and hands matches to the result
// database; then, when contents are asked for, reads the files that remain.
//
// Policy. Symbolic links are results, never followed. Devices, sockets and pipes are results, never
// opened. A folder on another file system is entered unless it is a pseudo file system (proc, sysfs
// and their like) below a location; the temporary folders "@tmp" of volumes are never entered. What
// cannot be read is counted and left out. The stop flag is looked at for every entry and every
// piece of a file.

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "nas/files/directory_reader.h"
#include "nas/match/content_query.h"
#include "nas/results/result_writer.h"
#include "nas/search/candidate_list.h"
#include "nas/search/criteria.h"
#include "nas/search/folder_stack.h"
#include "nas/search/location.h"
#include "nas/search/walk_entry.h"
#include "nas/search/walk_progress.h"

namespace nas {

// The criteria of a search, cheapest first. Comparators are borrowed.
struct Criteria {
  explicit Criteria(const std::vector<FileSearch::FindComp*>& comps);

  const PatternComp* pattern = nullptr;            // judged on its own: contents can stand in
  std::vector<const FileSearch::FindComp*> cheap;  // names and kinds
  std::vector<const FileSearch::FindComp*> attribute;
};

// What the threads of one search share. Set up before the first of them starts; after that only
// what is safe to use from several threads changes.
struct SharedWalk {
  using FolderIds = std::set<std::pair<dev_t, ino_t>>;

  SharedWalk(const std::vector<Location>& walk_locations,
             const std::vector<FileSearch::FindComp*>& comps, ResultWriter& result_writer,
             const int& flag)
      : locations(walk_locations), criteria(comps), writer(result_writer), stop_flag(flag) {}

  bool stopping() const {
    return __atomic_load_n(&stop_flag, __ATOMIC_RELAXED) != 0 ||
           failed.load(std::memory_order_relaxed);
  }

  const std::vector<Location>& locations;
  const Criteria criteria;
  ResultWriter& writer;
  const int& stop_flag;
  bool recursive = true;
  std::optional<ContentQuery> content;
  std::unique_ptr<CandidateList> candidates;  // set with content
  FolderIds never_entered;                    // the @tmp folders of volumes
  FolderIds location_ids;                     // filled when there is more than one
  WalkProgress progress;
  FolderStack stack;
  std::atomic<bool> failed = false;  // a thread has thrown: the others shall end
};

// One thread of a search: its buffers, and the rows it has found and not yet handed over.
class WalkThread {
 public:
  // `number`: which of the walk's threads it is, from 0.
  WalkThread(SharedWalk& shared, size_t number);

  // Reads folders until none is left.
  void WalkNames();
  // Reads candidates until none is left.
  void WalkContents();
  // Makes the rows found so far visible. Callable from any thread.
  void Flush();

 private:
  struct Folder {
    int fd = -1;
    std::uint16_t location = 0;
    std::string path;
    bool named_in_rows = false;  // whether rows_ was told of this folder
  };

  UniqueFd OpenFolder(const FolderStack::Item& item);
  bool MayEnter(int fd, std::string_view name, bool crossed) const;
  void ReadFolder(const FolderStack::Item& item, UniqueFd fd);
  void Judge(const DirectoryReader::Entry& entry);
  bool FetchAttributes(const char* name, FileAttributes& attributes);
  unsigned char TypeOf(const char* name) const;
  bool AttributesMatch() const;
  void AddRow(std::string_view name, const FileAttributes& attributes);
  void AddCandidate(const DirectoryReader::Entry& entry);
  void HandOverCandidates();
  void ScanRecord(const CandidateList::Record& record);
  void ScanFile(const char* name);

  SharedWalk& shared_;
  const size_t number_;
  DirectoryReader reader_;
  FoldedName folded_;
  FileSearch::WalkEntry entry_;
  Folder folder_;  // being read
  std::vector<std::pair<ino_t, std::string>> candidates_;
  std::optional<ContentScanner> scanner_;

  std::mutex rows_mutex_;  // guards rows_
  RowBlock rows_;
};

}  // namespace nas
