#pragma once
// The judging of entries, apart from where they come from (name_source.h) and where the results go
// (row_sink.h): names first, attributes only where a name has passed, contents last. Each rule that
// leaves an entry out is one named return (refusal.h).

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "nas/files/directory_reader.h"
#include "nas/match/content_scanner.h"
#include "nas/results/row_sink.h"
#include "nas/search/candidate_list.h"
#include "nas/search/criteria.h"
#include "nas/search/refusal.h"
#include "nas/search/walk_entry.h"
#include "nas/search/walk_progress.h"

namespace nas {

// The criteria of a search, cheapest first. Comparators are borrowed.
struct Criteria {
  explicit Criteria(const std::vector<FileSearch::FindComp*>& comps);

  struct Criterion {
    const FileSearch::FindComp* comp;
    Refusal refusal;  // of what does not match it
  };
  const PatternComp* pattern = nullptr;  // judged on its own: contents can stand in
  std::vector<Criterion> cheap;          // names and kinds
  std::vector<Criterion> attribute;
};

// What the threads of one search share. Set up before the first of them starts; after that only
// what is safe to use from several threads changes. Comparators, sink and flag are borrowed.
struct SharedSearch {
  SharedSearch(const std::vector<FileSearch::FindComp*>& comps, RowSink& row_sink, const int& flag)
      : criteria(comps), sink(row_sink), stop_flag(flag) {}

  // Lets contents stand in for names, where the pattern is one that can be looked for in them.
  void AskContents();
  // The same, with somebody to read them: the files to read wait in a file without a name in
  // `temporary_folder`. Throws std::system_error.
  void SearchContents(const std::string& temporary_folder);
  bool stopped() const { return __atomic_load_n(&stop_flag, __ATOMIC_RELAXED) != 0; }
  bool stopping() const { return stopped() || failed.load(std::memory_order_relaxed); }

  const Criteria criteria;
  RowSink& sink;
  const int& stop_flag;
  std::optional<ContentQuery> content;
  std::unique_ptr<CandidateList> candidates;  // of SearchContents
  WalkProgress progress;
  std::atomic<bool> failed = false;  // a thread has thrown: the others shall end
};

// The judge of one thread: its buffers, and the rows it has found and not yet handed over. All but
// Flush are for that thread alone. They throw what the sink and the list of candidates throw.
class Judge {
 public:
  explicit Judge(SharedSearch& search) : search_(search) {}

  // The entries that follow lie in the folder open at `fd`, at `path` below the root of the share
  // of location number `location`. Both are borrowed until Leave.
  void Enter(int fd, std::uint16_t location, std::string_view path);
  // Judges an entry by everything but contents; what passes has become a row, and what contents may
  // still decide (kContentsUnread) a candidate.
  Refusal Entry(const DirectoryReader::Entry& entry);
  // Judges a candidate, a regular file, by its contents.
  Refusal Contents(const char* name);
  // Hands over the folder's candidates.
  void Leave();
  // What the last kVanished or kFileUnreadable came of.
  int error_number() const { return error_number_; }

  // Makes the rows found so far visible. Callable from any thread.
  void Flush();

 private:
  struct Folder {
    int fd = -1;
    std::uint16_t location = 0;
    std::string_view path;
    bool named_in_rows = false;  // whether rows_ was told of this folder
  };

  Result<FileAttributes> Look(const char* name);
  void Skip(int error_number);
  void AddRow(std::string_view name, const FileAttributes& attributes);

  SharedSearch& search_;
  FoldedName folded_;
  FileSearch::WalkEntry entry_;
  Folder folder_;
  int error_number_ = 0;
  std::vector<std::pair<ino_t, std::string>> candidates_;
  std::optional<ContentScanner> scanner_;

  std::mutex rows_mutex_;  // guards rows_
  RowBlock rows_;
};

}  // namespace nas
