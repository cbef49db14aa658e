#pragma once
// The names below one location as an index knows them, as a source of names: equal to a walk that
// begins when the snapshot is taken.
//
// The table and the changes only say where to look. Every folder on the way from the location to an
// entry is opened, under the process's identity and through the gate of a walk (folder_gate.h), and
// has to be the folder that the table means; every entry is looked up in its folder before it is
// judged. So nothing is told that a walk could not have found, and what lies below a folder that is
// closed shows in no count: of folders that cannot be read those alone are counted that can be told
// from their own mode, whatever lies in them.
//
// Names that are noted as changed are looked up, folders noted as a whole are read. A folder that
// is met there and that the table does not have at that very place is walked, and so is one that
// turns out to be another than the table says. What is mounted below the location is left to the
// asker, who says where that is.

#include <atomic>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "nas/index/changes.h"
#include "nas/search/folder_walk.h"
#include "nas/search/index_filter.h"
#include "nas/search/location.h"
#include "nas/search/name_source.h"

namespace nas {

// The paths of a table's folders, each made from that of the one before it: quick where they are
// asked for in order.
class FolderPaths {
 public:
  // `path`: that of the folder `top`, below which the others are.
  FolderPaths(const NameTable& table, NameTable::FolderId top, std::string_view path);
  // Good until the next call.
  std::string_view Of(NameTable::FolderId folder);

 private:
  struct Level {
    NameTable::FolderId folder;
    size_t length;
  };
  const NameTable& table_;
  std::vector<Level> levels_;
  std::vector<NameTable::FolderId> way_;
  std::string path_;
};

class IndexNames : public NameSource {
 public:
  using FolderId = NameTable::FolderId;

  // What the table has of the location, or kNoFolder.
  static FolderId FolderOf(const IndexSnapshot& snapshot, const Location& location);

  struct Place {
    // The location alone: its number in rows is 0.
    const std::vector<Location>& locations;
    FolderId folder;  // as of FolderOf
    // Where something is mounted, by its path below the location.
    std::vector<std::string> mounts = {};
    FolderGate::Rules rules = {};
  };
  // Everything is borrowed but the gate's rules.
  IndexNames(const IndexSnapshot& snapshot, const Place& place, SharedSearch& search);

  // The entries that can match, as the table has them, in pieces of it that several threads may
  // take at once: nothing of it is verified, so nobody may be told of it. Returns how many entries
  // were looked at; 0 when there are no more pieces.
  size_t NextCandidates(EntryFilter& filter, std::vector<NameTable::EntryId>* found);
  // All pieces come once more. While no thread takes any.
  void StartOver() { next_ = 0; }
  const IndexFilter& filter() const { return filter_; }
  // What is gone through: the location's folder, and the one behind the last.
  FolderId top() const { return top_; }
  FolderId end() const { return end_; }
  // The names that are noted as changed in the location, likewise.
  struct NotedName {
    FolderId folder;
    const std::string* name;
  };
  std::vector<NotedName> NotedNames() const;

  void Feed(size_t thread, Judge& judge) override;
  void Abort() override { walk_.Abort(); }

 private:
  friend class IndexVisit;

  // A folder of which something is known beside the table.
  struct Special {
    FolderId folder;
    bool whole = false;
    const Changes::InFolder* changed = nullptr;
    std::vector<std::string> mounts = {};
    bool Holds(std::string_view name) const;
  };
  struct Piece {
    FolderId begin;
    FolderId end;
  };

  void FindSpecials();
  void AddMount(std::string_view path);
  Piece PieceOf(size_t number) const;
  const Special* SpecialOf(FolderId folder) const;
  // Whether the caller is the first to take the folder, to walk or to count it.
  bool Claim(FolderId folder);

  const IndexSnapshot& snapshot_;
  const NameTable& table_;
  const std::vector<Location>& locations_;
  const FolderId top_;
  const FolderId end_;
  SharedSearch& search_;
  const FolderGate gate_;
  const IndexFilter filter_;
  std::vector<Special> specials_;  // sorted; does not change once made
  FolderWalk walk_;
  const size_t pieces_;
  std::atomic<size_t> next_ = 0;
  std::atomic<size_t> done_ = 0;

  std::mutex mutex_;  // guards claimed_
  std::set<FolderId> claimed_;
};

}  // namespace nas
