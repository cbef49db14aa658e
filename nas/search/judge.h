#pragma once
// The judging of entries, apart from where they come from (name_source.h) and where the results go
// (row_sink.h): names first, attributes only where a name has passed, contents last. Each rule that
// leaves an entry out has a name (refusal.h).

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "nas/files/directory_reader.h"
#include "nas/match/content_scanner.h"
#include "nas/results/row_sink.h"
#include "nas/search/candidate_list.h"
#include "nas/search/criteria.h"
#include "nas/search/ignore_files.h"
#include "nas/search/location.h"
#include "nas/search/refusal.h"
#include "nas/search/unread_folders.h"
#include "nas/search/walk_progress.h"

namespace nas {

// Is told of entries that a search leaves out, by whoever wants to know what it came close to.
class MissSink {
 public:
  virtual ~MissSink() = default;
  // With everything known of the entry but its contents. Callable from any thread.
  virtual void See(const QuerySubject& subject) = 0;
};

// How terms about paths see a location.
EntryPath::Base PathBaseOf(const Location& location);

// What of a search has been told already, by a source that came to no end: whoever goes over the
// same folders again leaves it out.
class ToldEntries {
 public:
  // `names` are NUL-ended. Callable from any thread.
  void Add(std::uint16_t location, std::string_view folder, std::string_view names);
  bool Has(std::uint16_t location, std::string_view folder, std::string_view name) const;

 private:
  std::atomic<bool> any_ = false;
  mutable std::mutex mutex_;  // guards told_
  std::set<std::string> told_;
};

// What the threads of one search share. Set up before the first of them starts; after that only
// what is safe to use from several threads changes. Comparators, sink and flag are borrowed.
struct SharedSearch {
  SharedSearch(const std::vector<FileSearch::FindComp*>& comps, RowSink& row_sink, const int& flag)
      : criteria(comps), sink(row_sink), stop_flag(flag) {}

  // Lets contents be judged where the criteria ask for them; with `texts_too` also in the place of
  // names, where the pattern is one that can be looked for in them.
  void AskContents(bool texts_too);
  // The same, with somebody to read them: the files to read wait in a file without a name in
  // `temporary_folder`. Throws std::system_error.
  void SearchContents(const std::string& temporary_folder, bool texts_too);
  // What the criteria say of an entry, by its name or, where that is enough, by its contents.
  Answer Ask(const QuerySubject& subject) const;
  bool stopped() const { return __atomic_load_n(&stop_flag, __ATOMIC_RELAXED) != 0; }
  // Of a folder, below the root of the share of that location.
  void CannotRead(int error_number, std::uint16_t location, std::string_view path) {
    progress.AddSkipped(error_number);
    if (unread != nullptr) unread->AddUnread(error_number, location, path);
  }
  bool stopping() const { return stopped() || failed.load(std::memory_order_relaxed); }

  const Criteria criteria;
  RowSink& sink;
  const int& stop_flag;
  std::optional<ContentQuery> content;
  std::unique_ptr<CandidateList> candidates;  // of SearchContents
  CandidateSink* candidate_sink = nullptr;    // borrowed: that list, or somebody else's
  bool names_alone = false;                   // rows tell of attributes no more than types
  MissSink* misses = nullptr;                 // borrowed; null: nobody asks
  UnreadSink* unread = nullptr;               // borrowed, likewise
  WalkProgress progress;
  ToldEntries told;
  std::atomic<bool> failed = false;  // a thread has thrown: the others shall end
};

// The judge of one thread: its buffers, and the rows it has found and not yet handed over. All but
// Flush are for that thread alone. They throw what the sink and the list of candidates throw.
class Judge {
 public:
  // Telling which criterion an entry does not meet takes asking them again: who does not `explain`
  // is told kName of all of them.
  explicit Judge(SharedSearch& search, bool explain = false) : search_(search), explain_(explain) {}

  // The entries that follow lie in the folder open at `fd`, at `path` below the root of the share
  // of `location`, whose number is `number`. The path is borrowed until Leave, and so are the
  // ignore files that are to be obeyed.
  void Enter(int fd, std::uint16_t number, const Location& location, std::string_view path,
             const IgnoreFiles* ignores = nullptr);
  // Judges an entry by everything but contents; what passes has become a row, and what contents may
  // still decide (kContentsUnread) a candidate.
  Refusal Entry(const DirectoryReader::Entry& entry);
  // The same of one that is known by hearsay, which may be old: it is looked up before anything is
  // told of it. What has gone is left out without a word, and what may not be looked at is counted
  // only where `tell_forbidden` says so.
  Refusal KnownEntry(const DirectoryReader::Entry& entry, bool tell_forbidden);
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
    const IgnoreFiles* ignores = nullptr;
    bool named_in_rows = false;  // whether rows_ was told of this folder
  };

  void Meet(std::string_view name, unsigned char type);
  bool IsIgnored(std::string_view name, unsigned char type) const;
  Answer Ask() const { return search_.Ask(subject_); }
  Refusal Decide(Answer answer, const DirectoryReader::Entry& entry,
                 const FileAttributes& attributes);
  Refusal Refuse(const char* name);
  bool IsEmptyFolder(const char* name);
  Result<FileAttributes> Look(const char* name);
  void Learn(const FileAttributes& attributes, const char* name);
  void Skip(int error_number);
  void AddRow(std::string_view name, const FileAttributes& attributes);

  SharedSearch& search_;
  const bool explain_;
  FoldedName folded_;
  EntryPath path_;
  std::optional<std::uint16_t> path_base_;  // the location of which path_ knows
  QueryAttributes attributes_;
  QuerySubject subject_;
  std::function<bool()> is_empty_folder_;
  std::optional<DirectoryReader> emptiness_;  // that it asks
  Folder folder_;
  int error_number_ = 0;
  std::vector<std::pair<ino_t, std::string>> candidates_;
  std::optional<ContentScanner> scanner_;

  std::mutex rows_mutex_;  // guards rows_
  RowBlock rows_;
};

}  // namespace nas
