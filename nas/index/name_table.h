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

#include <bit>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "nas/base/error.h"
#include "nas/index/folder_key.h"
#include "nas/index/table_format.h"

namespace nas {

// Movable; what it gave out by reference lives as long as the one that holds the mapping. Any
// thread may ask.
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
    bool operator==(const Attributes&) const = default;
  };
  // When a folder's own inode last changed, to tell whether it has since; {} where that cannot be
  // told from it, because it was read too soon after a change.
  struct Stamp {
    std::int64_t seconds = 0;
    std::uint32_t nanoseconds = 0;
    bool operator==(const Stamp&) const = default;
    explicit operator bool() const { return seconds != 0 || nanoseconds != 0; }
  };

  // Maps the file `name` in the folder `dir_fd` (may be AT_FDCWD), made of the file system that
  // `file_system` says in the caller's words. EBADMSG where the file is torn or damaged, ESTALE
  // where it is whole but of another file system, layout or version of folding: in all of these it
  // is worth nothing and is to be made anew.
  static Result<NameTable> Open(int dir_fd, const std::string& name, std::string_view file_system);
  NameTable(NameTable&& other) noexcept;
  NameTable& operator=(NameTable&& other) noexcept;
  ~NameTable();

  FolderId folders() const { return folders_; }
  EntryId entries() const { return entries_; }
  size_t bytes() const { return bytes_; }  // of the file

  // The trees, in the order in which their roots were given: the topmost folder, and the name that
  // whoever had the table made gave the tree.
  size_t trees() const { return trees_; }
  FolderId top(size_t tree) const { return columns_.tops[tree]; }
  std::string_view top_name(size_t tree) const {
    return Piece(columns_.top_names, columns_.top_name_begins, tree);
  }

  // Folders. `id` < folders(); `entries_begin` also of folders() itself.
  FolderId parent(FolderId id) const { return columns_.parents[id]; }  // kNoFolder of a topmost one
  FolderId subtree_end(FolderId id) const { return columns_.ends[id]; }  // after the last below
  EntryId entries_begin(FolderId id) const { return columns_.entries_begins[id]; }
  EntryId entries_end(FolderId id) const { return entries_begin(id + 1); }
  // The entry that a folder is; entries() for a topmost one.
  EntryId folder_entry(FolderId id) const;
  std::string_view folder_name(FolderId id) const;  // empty of a topmost one
  std::uint64_t folder_inode(FolderId id) const { return columns_.folder_inodes[id]; }
  Stamp stamp(FolderId id) const {
    return {columns_.stamp_seconds[id], columns_.stamp_nanos[id] & ~kUnreadable};
  }
  // Its entries are not known.
  bool unreadable(FolderId id) const { return (columns_.stamp_nanos[id] & kUnreadable) != 0; }
  // Empty where the file system has no keys.
  FolderKey key(FolderId id) const { return FolderKey(KeyBytes(id)); }
  FolderId Find(std::string_view key) const;  // kNoFolder where it is none of these

  // Entries. `id` < entries(). Names are NUL-ended, into the mapping.
  FolderId folder_of(EntryId id) const;  // that it lies in; logarithmic
  std::string_view name(EntryId id) const {
    return Bit(columns_.named, id) ? Piece(columns_.names, columns_.name_begins, NamedBefore(id))
                                   : Piece(columns_.texts, columns_.text_begins, id);
  }
  // Whether the name is ASCII, and so its text.
  bool is_ascii(EntryId id) const { return !Bit(others_.data(), id); }
  // Calls `take` with each of [begin, end) whose name is not ASCII, in order.
  template <class Take>
  void EachOther(EntryId begin, EntryId end, const Take& take) const {
    for (EntryId id = begin; id < end; id = (id / kWordBits + 1) * kWordBits) {
      std::uint64_t word = others_[id / kWordBits] >> (id % kWordBits) << (id % kWordBits);
      for (; word != 0; word &= word - 1) {
        const auto bit = static_cast<EntryId>(std::countr_zero(word));
        const EntryId other = id / kWordBits * kWordBits + bit;
        if (other >= end) return;
        take(other);
      }
    }
  }
  unsigned char type(EntryId id) const;  // DT_*
  std::uint64_t inode(EntryId id) const {
    return columns_.inodes32 != nullptr ? columns_.inodes32[id] : columns_.inodes64[id];
  }
  // Nothing where they may change by another name of the file (hard links), or were not to be had,
  // or do not fit: times that do not fit into 32 bits, and where there are more than 65,000
  // different combinations of mode, user and group.
  std::optional<Attributes> attributes(EntryId id) const;
  // Each by itself; without a meaning where class_row is below kTypeClasses, as nothing is known.
  std::uint16_t class_row(EntryId id) const { return columns_.classes[id]; }
  std::int64_t mtime(EntryId id) const { return columns_.mtimes[id]; }
  std::int64_t crtime(EntryId id) const {
    const std::int32_t time = columns_.crtimes[id];
    return time == kNoCrtime ? Attributes::kNoTime : time;
  }
  std::uint64_t size(EntryId id) const {
    const std::uint32_t size = columns_.sizes[id];
    return size == kLargeSize ? LargeSize(id) : size;
  }
  // The same of the entries from `begin` on, as the file has them: sizes with kLargeSize, times of
  // making with kNoCrtime (table_format.h).
  const std::uint16_t* class_rows_from(EntryId begin) const { return columns_.classes + begin; }
  const std::int32_t* mtimes_from(EntryId begin) const { return columns_.mtimes + begin; }
  const std::int32_t* crtimes_from(EntryId begin) const { return columns_.crtimes + begin; }
  const std::uint32_t* sizes_from(EntryId begin) const { return columns_.sizes + begin; }
  // The rows of mode, user and group that entries share (table_format.h).
  std::span<const TableClass> class_rows() const { return {columns_.class_rows, class_count_}; }
  // All entries, the fewest folders below their tree's topmost first; of these the newest, by what
  // the table has of them (unknown: of 1970), then by their number.
  std::span<const EntryId> nearest_first() const { return {columns_.nearest_first, entries_}; }
  // The entry of that name in the folder; entries() where there is none.
  EntryId FindEntry(FolderId folder, std::string_view name) const;
  // The folder that an entry of type DT_DIR is; kNoFolder where it is not in the table, such as a
  // mount point. Logarithmic.
  FolderId folder_at(EntryId id) const;
  // The entries of type DT_DIR that are no folder of the table, ascending.
  const std::vector<EntryId>& strays() const { return strays_; }

  // The texts of entries [begin, end), and where the text of one begins (also of entries() itself)
  // counted from that of entry 0. entry_of_text: the entry whose text holds the byte at `offset`;
  // logarithmic, so go on from there by text_begin.
  std::string_view texts(EntryId begin, EntryId end) const {
    return {columns_.texts + text_begin(begin), text_begin(end) - text_begin(begin)};
  }
  std::uint64_t text_begin(EntryId id) const { return columns_.text_begins[id]; }
  EntryId entry_of_text(std::uint64_t offset) const;

 private:
  friend class TableCheck;
  friend class TableWriter;
  static constexpr std::uint32_t kWordBits = 64;

  // As table_format.h has them.
  struct Columns {
    const char* texts = nullptr;
    const std::uint32_t* text_begins = nullptr;
    const char* names = nullptr;
    const std::uint32_t* name_begins = nullptr;
    const std::uint64_t* named = nullptr;
    const std::uint32_t* named_before = nullptr;
    const std::uint32_t* inodes32 = nullptr;  // one of these two
    const std::uint64_t* inodes64 = nullptr;
    const std::uint32_t* sizes = nullptr;
    const std::uint32_t* large_entries = nullptr;
    const std::uint64_t* large_sizes = nullptr;
    const std::int32_t* mtimes = nullptr;
    const std::int32_t* crtimes = nullptr;
    const std::uint16_t* classes = nullptr;
    const TableClass* class_rows = nullptr;
    const std::uint32_t* nearest_first = nullptr;
    const std::uint32_t* folder_entries = nullptr;
    const std::uint32_t* parents = nullptr;
    const std::uint32_t* ends = nullptr;
    const std::uint32_t* entries_begins = nullptr;
    const std::uint64_t* folder_inodes = nullptr;
    const std::int64_t* stamp_seconds = nullptr;
    const std::uint32_t* stamp_nanos = nullptr;
    const char* keys = nullptr;
    const std::uint32_t* key_begins = nullptr;
    const std::uint32_t* key_slots = nullptr;
    const std::uint32_t* by_entry = nullptr;
    const std::uint32_t* tops = nullptr;
    const char* top_names = nullptr;
    const std::uint32_t* top_name_begins = nullptr;
  };

  static bool Bit(const std::uint64_t* bits, EntryId id) {
    return (bits[id / kWordBits] >> (id % kWordBits) & 1) != 0;
  }
  // How many entries before this one, which may be entries(), have a name that is not their text.
  size_t NamedBefore(EntryId id) const {
    if (id == entries_) return named_count_;
    const std::uint64_t bit = std::uint64_t{1} << (id % kWordBits);
    return columns_.named_before[id / kWordBits] +
           static_cast<size_t>(std::popcount(columns_.named[id / kWordBits] & (bit - 1)));
  }

  NameTable() = default;
  void Swap(NameTable& other);
  void FindStrays();
  void FindOthers();
  // Texts that lie end to end, each with its NUL.
  static std::string_view Piece(const char* texts, const std::uint32_t* begins, size_t number) {
    return {texts + begins[number], begins[number + 1] - begins[number] - 1};
  }
  std::string_view KeyBytes(FolderId id) const {
    return {columns_.keys + columns_.key_begins[id],
            columns_.key_begins[id + 1] - columns_.key_begins[id]};
  }
  std::uint64_t LargeSize(EntryId id) const;

  const char* mapping_ = nullptr;
  size_t bytes_ = 0;
  EntryId entries_ = 0;
  FolderId folders_ = 0;
  size_t trees_ = 0;
  size_t named_count_ = 0;
  size_t large_count_ = 0;
  size_t class_count_ = 0;
  size_t key_slot_count_ = 0;
  Columns columns_;
  std::vector<EntryId> strays_;
  std::vector<std::uint64_t> others_;  // a bit an entry: its name is not ASCII
};

}  // namespace nas
