#pragma once
// Which names of an index a search has to look at: what can be told from the table alone, without a
// system call. It leaves out only what cannot match as the table has it; the judge decides about
// the rest.

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>
#include <vector>

#include "nas/index/changes.h"
#include "nas/match/regex_scan.h"
#include "nas/match/text_finder.h"
#include "nas/search/index_ranges.h"
#include "nas/search/judge.h"

namespace nas {

// Any thread may ask; what it is made of is borrowed.
class IndexFilter {
 public:
  IndexFilter(const IndexSnapshot& snapshot, const SharedSearch& search);

  // Whether there are texts, or an expression, without which nothing matches, so that Find tells
  // where to look.
  bool finds() const { return !needles_.empty() || scan_ != nullptr; }
  // The entries of [begin, end) that may have one, in order. Whether they surely match, as far as
  // can be told from the table (EntryFilter::Passes).
  bool Find(NameTable::EntryId begin, NameTable::EntryId end,
            std::vector<NameTable::EntryId>* found) const;
  // Those whose text (name_table.h) begins with one of the words, or has one that stands by itself
  // (word_finder.h), likewise.
  bool FindBeginnings(const std::vector<std::string>& words, NameTable::EntryId begin,
                      NameTable::EntryId end, std::vector<NameTable::EntryId>* found) const;
  bool FindWords(const std::vector<std::string>& words, NameTable::EntryId begin,
                 NameTable::EntryId end, std::vector<NameTable::EntryId>* found) const;
  // Whether paths decide what matches.
  bool asks_paths() const { return search_.criteria.ask_paths; }

 private:
  friend class EntryFilter;
  using EntryId = NameTable::EntryId;

  void PrepareScan(const QueryNode& root);
  // False, with less than all of it, where they tell so little that scan_ is the quicker way.
  bool FindNeedles(EntryId begin, EntryId end, std::vector<EntryId>* found) const;
  bool HasNeedle(std::string_view text) const;
  bool Scan(EntryId begin, EntryId end, std::vector<EntryId>* found) const;
  // Puts those whose name is not ASCII right, of which an expression that is run over texts tells
  // nothing.
  bool ScanOthers(EntryId begin, EntryId end, std::vector<EntryId>* found) const;

  const IndexSnapshot& snapshot_;
  const SharedSearch& search_;
  std::vector<TextFinder> needles_;
  std::shared_ptr<const RegexScan> scan_;         // over texts
  std::shared_ptr<const RegexScan> others_scan_;  // of expressions, over names
  // What asks for attributes and holds of every match; where nothing is found by names.
  IndexRanges ranges_;
  bool only_ranges_ = false;      // there is nothing else
  bool asks_attributes_ = false;  // and the table's are believed
  bool asks_names_ = false;
  bool by_texts_ = false;  // texts say of names in ASCII what the names say
  bool has_regex_ = false;
  bool decides_ = false;                            // there is nothing but what Find looks for
  bool roughly_ = false;                            // where a text is not ASCII
  mutable std::atomic<bool> needles_fail_ = false;  // as FindNeedles has said
};

// One thread's.
class EntryFilter {
 public:
  EntryFilter(const IndexFilter& filter, const Location& location);

  // What Find leaves out from now on, beside what cannot match: names that do not begin with one of
  // the words, or that have none that stands by itself. The words are borrowed.
  enum class Only : std::uint8_t { kAny, kBeginnings, kWords };
  void set_only(Only only, const std::vector<std::string>* words) {
    only_ = only;
    words_ = words;
  }
  // The entries of the folders [begin, end) that can match; `path_of` tells the path of a folder,
  // good until it is called again, and is asked where criteria do.
  void Find(NameTable::FolderId begin, NameTable::FolderId end,
            const std::function<std::string_view(NameTable::FolderId)>& path_of,
            std::vector<NameTable::EntryId>* found);

  // The entries that follow lie in this folder, below the root of the location's share; borrowed.
  // Attributes do not count where the user could not look at the files: whether there is more than
  // names to ask is then nothing that may show. False where nothing in it can match.
  bool Enter(std::string_view path, bool by_attributes = true);
  // Of one of a folder that was entered: whether the entry can match, as the table has it.
  bool MayMatch(NameTable::EntryId entry);
  // The same of one that Find of the index filter has found, and what that has said.
  bool Passes(NameTable::EntryId entry, bool told);
  // All of [begin, end), in folders that were entered, that can match.
  void FindAmong(NameTable::EntryId begin, NameTable::EntryId end,
                 std::vector<NameTable::EntryId>* found);

 private:
  void SetName(NameTable::EntryId entry);
  bool LearnAttributes(NameTable::EntryId entry);

  const IndexFilter& filter_;
  const NameTable& table_;
  Only only_ = Only::kAny;
  const std::vector<std::string>* words_ = nullptr;
  FoldedName name_;
  EntryPath path_;
  bool by_attributes_ = true;
  QueryAttributes attributes_;
  std::vector<NameTable::EntryId> hits_;
  std::vector<NameTable::EntryId> in_ranges_;
};

}  // namespace nas
