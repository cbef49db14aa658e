#pragma once
// The names of one file system at one moment, as a file that is mapped: read by many processes at
// once, changed by none. What has changed since is told by Changes (changes.h).
//
// Folders are numbered in preorder, so that a folder and all below it have numbers that follow each
// other; of the folders in one folder the one whose name sorts first comes first. The entries of
// one folder lie together, sorted by name (bytes), in the order of the folders. So a whole tree is
// one range of folders, one range of entries and one range of text. A table may hold several trees
// (what is indexed of a file system); a tree's topmost folder is no entry of any other.
//
// For each entry there is a text to look for names in: NUL-ended, one after the other in the order
// of entries. Of a name in ASCII it is the name in lower case; of any other its folded form and,
// where that differs, "\1" and the form without accents (match/folded_name.h). What is ASCII, in
// lower case, and not in the text, is in neither form of the name.

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "nas/base/error.h"
#include "nas/index/folder_key.h"

namespace nas {

class NameTable {
 public:
  using FolderId = std::uint32_t;
  using EntryId = std::uint32_t;
  static constexpr FolderId kNoFolder = UINT32_MAX;

  struct Attributes {
    static constexpr std::int64_t kNoTime = INT64_MIN;  // the file system does not record it
    std::uint64_t size = 0;
    std::int64_t mtime = 0;
    std::int64_t crtime = kNoTime;
    std::uint32_t mode = 0;
    std::uint32_t uid = 0;
    std::uint32_t gid = 0;
  };
  // When a folder's own inode last changed, to tell whether it has since; {} where that cannot be
  // told from it, because it was read too soon after a change.
  struct Stamp {
    std::int64_t seconds = 0;
    std::uint32_t nanoseconds = 0;
    bool operator==(const Stamp&) const = default;
    explicit operator bool() const { return seconds != 0 || nanoseconds != 0; }
  };

  FolderId folders() const;
  EntryId entries() const;

  // Folders. `id` < folders(); `entries_begin` also of folders() itself.
  FolderId parent(FolderId id) const;       // kNoFolder of a topmost one
  FolderId subtree_end(FolderId id) const;  // one after the last folder below
  EntryId entries_begin(FolderId id) const;
  EntryId entries_end(FolderId id) const { return entries_begin(id + 1); }
  std::string_view folder_name(FolderId id) const;  // empty of a topmost one
  std::uint64_t folder_inode(FolderId id) const;
  Stamp stamp(FolderId id) const;
  bool unreadable(FolderId id) const;  // its entries are not known
  FolderKey key(FolderId id) const;
  FolderId Find(std::string_view key) const;  // kNoFolder where it is none of these

  // Entries. `id` < entries(). Names are NUL-ended, into the mapping.
  FolderId folder_of(EntryId id) const;  // that it lies in; logarithmic
  std::string_view name(EntryId id) const;
  unsigned char type(EntryId id) const;  // DT_*
  std::uint64_t inode(EntryId id) const;
  // Nothing where they may change by another name of the file (hard links), or were not to be had.
  std::optional<Attributes> attributes(EntryId id) const;
  // The entry of that name in the folder; entries() where there is none.
  EntryId FindEntry(FolderId folder, std::string_view name) const;
  // The folder that an entry of type DT_DIR is; kNoFolder where it is not in the table, such as a
  // mount point.
  FolderId folder_at(EntryId id) const;

  // The texts of entries [begin, end), and where the text of one begins (also of entries() itself)
  // counted from that of entry 0. entry_of_text: the entry whose text holds the byte at `offset`;
  // logarithmic, so go on from there by text_begin.
  std::string_view texts(EntryId begin, EntryId end) const;
  std::uint64_t text_begin(EntryId id) const;
  EntryId entry_of_text(std::uint64_t offset) const;
};

}  // namespace nas
