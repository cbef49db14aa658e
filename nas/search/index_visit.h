#pragma once
// One thread's part of going through an index (index_names.h): the folders that are open, and what
// is done in each.

#include <sys/types.h>

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "nas/files/directory_reader.h"
#include "nas/search/index_names.h"

namespace nas {

// What mode bits say of the process's identity. They are believed for the order of work and for
// counts, never for what is shown.
class OwnRights {
 public:
  OwnRights();
  bool all() const { return all_; }  // root's
  // `bits`: of 4 (read) and 1 (enter).
  bool Have(const NameTable::Attributes& file, unsigned bits) const;

 private:
  const bool all_;
  const uid_t user_;
  std::vector<gid_t> groups_;
};

class IndexVisit {
 public:
  IndexVisit(IndexNames& names, size_t thread, Judge& judge);

  // Goes through the folders [begin, end) of the table.
  void Visit(NameTable::FolderId begin, NameTable::FolderId end);

  // Single ones, in any order: whether the entry, or the name in the folder of the table, is there
  // and a match; then `judge` has its row. What is noted as changed is no entry.
  bool VisitEntry(NameTable::EntryId entry, Judge& judge);
  bool VisitName(NameTable::FolderId folder, const std::string& name, Judge& judge);

 private:
  using FolderId = NameTable::FolderId;
  using EntryId = NameTable::EntryId;
  using Special = IndexNames::Special;

  struct Level {
    FolderId folder;
    UniqueFd fd;
    size_t path_length;
    IgnoreFiles::Ptr ignores;
  };

  void CollectLooks(FolderId begin, FolderId end);
  // By mode bits.
  bool MayEnterBelow(FolderId folder) const;
  bool SeemsClosed(FolderId folder) const;
  FolderId NextFolder(FolderId at, FolderId end) const;
  void VisitFolder(FolderId folder);
  void CollectEntries(FolderId folder, const Special* special);
  void JudgeEntries(FolderId folder, const Special* special);
  bool ReadingIsBetter(FolderId folder) const;
  void JudgeByReading(FolderId folder);
  void LookAt(FolderId folder, const std::string& name);
  void ReadWhole(FolderId folder);

  // Opens the way to the folder; false where it cannot be had, with skip_until_ behind what lies
  // below the one that is in the way.
  bool Open(FolderId folder);
  bool OpenLevel(FolderId folder);
  bool OpenInAnyOrder(FolderId folder);
  void Skip(FolderId folder);
  bool OpenTop();
  void Refused(FolderId folder, const FolderGate::Opened& opened);
  bool IsSame(FolderId folder, int fd, bool by_key) const;
  bool MayEnter(std::string_view name) const;
  std::string PathOf(std::string_view name) const;
  // What a walk does at a folder that it meets in the open one, but for what the table has of it:
  // `folder`, or kNoFolder.
  void EnterFolder(const char* name, FolderId folder);
  FolderId FolderAt(FolderId parent, std::string_view name) const;
  void Walk(std::string_view name);
  int fd() const { return levels_.back().fd.get(); }
  void EnterJudge(Judge& judge) const;

  IndexNames& names_;
  const NameTable& table_;
  SharedSearch& search_;
  const size_t thread_;
  Judge& judge_;
  const OwnRights rights_;
  EntryFilter filter_;
  FolderPaths paths_;
  std::vector<EntryId> hits_;  // of the piece, where the filter finds
  bool hits_told_ = false;     // need no further question
  size_t next_hit_ = 0;
  std::vector<EntryId> looks_;  // folders among the entries of the piece, not of the table
  size_t next_look_ = 0;
  std::vector<FolderId> tries_;   // folders of the piece that seem closed
  std::vector<EntryId> entries_;  // of the folder, to be judged
  std::vector<Level> levels_;
  std::string path_;        // of the last of levels_, below the share's root
  bool may_enter_ = true;   // the folder that is visited, by its mode
  std::uint64_t seen_ = 0;  // entries of the folder that were there
  FolderId skip_until_ = 0;
  std::map<FolderId, FolderId> closed_;  // folders that could not be had, each to its end
  DirectoryReader reader_;
};

}  // namespace nas
