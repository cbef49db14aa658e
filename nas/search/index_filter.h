#pragma once
// Which names of an index a search has to look at: what can be told from the table alone, without a
// system call. It leaves out only what cannot match as the table has it; the judge decides about
// the rest.

#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/index/changes.h"
#include "nas/match/text_finder.h"
#include "nas/search/judge.h"

namespace nas {

// Does not change once made; what it is made of is borrowed.
class IndexFilter {
 public:
  IndexFilter(const IndexSnapshot& snapshot, const SharedSearch& search);

  // Whether there are texts without which nothing matches, so that Find tells where to look.
  bool finds() const { return !needles_.empty(); }
  // The entries of [begin, end) that have one, in order.
  void Find(NameTable::EntryId begin, NameTable::EntryId end,
            std::vector<NameTable::EntryId>* found) const;

 private:
  friend class EntryFilter;

  const IndexSnapshot& snapshot_;
  const SharedSearch& search_;
  std::vector<TextFinder> needles_;
  bool asks_attributes_ = false;  // and the table's are believed
  bool by_texts_ = false;         // texts say of names in ASCII what the names say
  bool decides_ = false;          // what Find finds needs no further question
};

// One thread's.
class EntryFilter {
 public:
  EntryFilter(const IndexFilter& filter, const Location& location);

  // The entries of the folders [begin, end) that can match; `path_of` tells the path of a folder,
  // and is asked where criteria do.
  void Find(NameTable::FolderId begin, NameTable::FolderId end,
            const std::function<std::string(NameTable::FolderId)>& path_of,
            std::vector<NameTable::EntryId>* found);

  // The entries that follow lie in this folder, below the root of the location's share; borrowed.
  // Attributes do not count where the user could not look at the files: whether there is more than
  // names to ask is then nothing that may show.
  void Enter(std::string_view path, bool by_attributes = true);
  // Whether the entry can match, as the table has it.
  bool MayMatch(NameTable::EntryId entry);

 private:
  void SetName(NameTable::EntryId entry);
  bool LearnAttributes(NameTable::EntryId entry, unsigned char type);

  const IndexFilter& filter_;
  const NameTable& table_;
  FoldedName name_;
  EntryPath path_;
  bool by_attributes_ = true;
  QueryAttributes attributes_;
  std::vector<NameTable::EntryId> hits_;
};

}  // namespace nas
