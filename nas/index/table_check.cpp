#include "nas/index/table_check.h"

#include <algorithm>
#include <bit>
#include <cerrno>
#include <cstring>

#include "nas/match/folded_name.h"

namespace nas {
namespace {

constexpr std::uint32_t kNanosInSecond = 1'000'000'000;
constexpr size_t kMostClasses = 1 << 16;

template <size_t kCount>
bool Says(const std::array<char, kCount>& field, std::string_view text) {
  std::array<char, kCount> expected = {};
  if (text.size() > kCount) return false;
  std::copy(text.begin(), text.end(), expected.begin());
  return field == expected;
}

}  // namespace

const TableHeader& TableCheck::header() const {
  return *reinterpret_cast<const TableHeader*>(table_.mapping_);
}

int TableCheck::Check(std::string_view file_system) {
  if (header().magic != kTableMagic) return EBADMSG;
  if (header().sum != TableSum(table_.mapping_, offsetof(TableHeader, sum))) {
    // The header of another version may be of another size.
    return header().version != kTableVersion ? ESTALE : EBADMSG;
  }
  if (header().version != kTableVersion || !Says(header().fold, FoldVersion()) ||
      !Says(header().file_system, file_system)) {
    return ESTALE;
  }
  const bool sound = SumsAreRight() && TakeColumns() && EntriesAreSound() && NamesAreSound() &&
                     FoldersAreSound() && KeysAreSound() && TreesAreSound();
  return sound ? 0 : EBADMSG;
}

bool TableCheck::SumsAreRight() const {
  if (header().file_bytes != table_.bytes_) return false;
  size_t at = sizeof(TableHeader);
  for (const TableHeader::Column& column : header().columns) {
    if (column.begin != at || column.bytes > table_.bytes_ - at) return false;
    const size_t filled = AlignedColumn(column.bytes);
    if (filled > table_.bytes_ - at) return false;
    if (column.sum != TableSum(table_.mapping_ + at, filled)) return false;
    at += filled;
  }
  return at == table_.bytes_;
}

size_t TableCheck::Count(TableColumn column, size_t size) const {
  return header().columns[column].bytes / size;
}

template <typename T>
bool TableCheck::Take(TableColumn column, size_t count, const T*& pointer) const {
  const TableHeader::Column& place = header().columns[column];
  pointer = reinterpret_cast<const T*>(table_.mapping_ + place.begin);
  return place.bytes == count * sizeof(T);
}

template <typename T>
bool TableCheck::TakeAny(TableColumn column, const T*& pointer, size_t& count) const {
  count = Count(column, sizeof(T));
  return Take(column, count, pointer);
}

bool TableCheck::TakeInodes() {
  if (header().inode_bytes == sizeof(std::uint32_t)) {
    return Take(kInodes, table_.entries_, columns_.inodes32);
  }
  return header().inode_bytes == sizeof(std::uint64_t) &&
         Take(kInodes, table_.entries_, columns_.inodes64);
}

bool TableCheck::TakeColumns() {
  const size_t entries = table_.entries_ = header().entries;
  const size_t folders = table_.folders_ = header().folders;
  const size_t trees = table_.trees_ = header().trees;
  const size_t words = (entries + NameTable::kWordBits - 1) / NameTable::kWordBits;
  size_t bytes = 0;
  size_t large_sizes = 0;
  size_t name_begins = 0;
  if (!TakeAny(kTexts, columns_.texts, bytes) || !TakeAny(kNames, columns_.names, bytes) ||
      !TakeAny(kKeys, columns_.keys, bytes) || !TakeAny(kTopNames, columns_.top_names, bytes) ||
      !TakeAny(kNameBegins, columns_.name_begins, name_begins) || name_begins == 0 ||
      !TakeAny(kLargeEntries, columns_.large_entries, table_.large_count_) ||
      !TakeAny(kLargeSizes, columns_.large_sizes, large_sizes) ||
      !TakeAny(kClassRows, columns_.class_rows, table_.class_count_) ||
      !TakeAny(kKeySlots, columns_.key_slots, table_.key_slot_count_)) {
    return false;
  }
  table_.named_count_ = name_begins - 1;
  return large_sizes == table_.large_count_ && trees <= folders && TakeInodes() &&
         Take(kTextBegins, entries + 1, columns_.text_begins) &&
         Take(kNamed, words, columns_.named) && Take(kNamedBefore, words, columns_.named_before) &&
         Take(kSizes, entries, columns_.sizes) && Take(kMtimes, entries, columns_.mtimes) &&
         Take(kCrtimes, entries, columns_.crtimes) && Take(kClasses, entries, columns_.classes) &&
         Take(kNearestFirst, entries, columns_.nearest_first) &&
         Take(kFolderEntries, folders, columns_.folder_entries) &&
         Take(kFolderParents, folders, columns_.parents) &&
         Take(kFolderEnds, folders, columns_.ends) &&
         Take(kEntriesBegins, folders + 1, columns_.entries_begins) &&
         Take(kFolderInodes, folders, columns_.folder_inodes) &&
         Take(kStampSeconds, folders, columns_.stamp_seconds) &&
         Take(kStampNanos, folders, columns_.stamp_nanos) &&
         Take(kKeyBegins, folders + 1, columns_.key_begins) &&
         Take(kByEntry, folders - trees, columns_.by_entry) && Take(kTops, trees, columns_.tops) &&
         Take(kTopNameBegins, trees + 1, columns_.top_name_begins);
}

// `count` texts, each with its NUL, fill all of the bytes.
bool TableCheck::AreTexts(const char* texts, size_t bytes, const std::uint32_t* begins,
                          size_t count) const {
  if (begins[0] != 0 || begins[count] != bytes) return false;
  // Order first: only then is each of them within the bytes.
  for (size_t i = 0; i < count; ++i) {
    if (begins[i] >= begins[i + 1]) return false;
  }
  for (size_t i = 0; i < count; ++i) {
    if (texts[begins[i + 1] - 1] != '\0') return false;
  }
  return true;
}

bool TableCheck::EntriesAreSound() const {
  if (!AreTexts(columns_.texts, Count(kTexts, 1), columns_.text_begins, table_.entries_)) {
    return false;
  }
  if (table_.class_count_ < kTypeClasses || table_.class_count_ > kMostClasses) return false;
  std::uint16_t highest = 0;
  for (size_t i = 0; i < table_.entries_; ++i) highest = std::max(highest, columns_.classes[i]);
  const std::uint32_t* order = columns_.nearest_first;
  return highest < table_.class_count_ &&
         std::all_of(order, order + table_.entries_,
                     [this](NameTable::EntryId id) { return id < table_.entries_; });
}

bool TableCheck::NamesAreSound() const {
  if (!AreTexts(columns_.names, Count(kNames, 1), columns_.name_begins, table_.named_count_)) {
    return false;
  }
  const size_t words = Count(kNamed, sizeof(std::uint64_t));
  size_t before = 0;
  for (size_t i = 0; i < words; ++i) {
    if (columns_.named_before[i] != before) return false;
    before += static_cast<size_t>(std::popcount(columns_.named[i]));
  }
  return before == table_.named_count_;
}

bool TableCheck::FolderIsSound(NameTable::FolderId id) const {
  const NameTable::FolderId parent = columns_.parents[id];
  const std::uint32_t entry = columns_.folder_entries[id];
  if (columns_.ends[id] <= id || columns_.ends[id] > table_.folders_ ||
      columns_.entries_begins[id] > columns_.entries_begins[id + 1] ||
      (columns_.stamp_nanos[id] & ~kUnreadable) >= kNanosInSecond) {
    return false;
  }
  if (parent == NameTable::kNoFolder) return entry == UINT32_MAX;
  return parent < id && columns_.ends[id] <= columns_.ends[parent] &&
         entry >= columns_.entries_begins[parent] && entry < columns_.entries_begins[parent + 1];
}

bool TableCheck::FoldersAreSound() const {
  if (columns_.entries_begins[0] != 0 ||
      columns_.entries_begins[table_.folders_] != table_.entries_) {
    return false;
  }
  for (NameTable::FolderId id = 0; id < table_.folders_; ++id) {
    if (!FolderIsSound(id)) return false;
  }
  // Each folder that is an entry stands here once: as many as there are, in strict order.
  const size_t count = table_.folders_ - table_.trees_;
  for (size_t i = 0; i < count; ++i) {
    const NameTable::FolderId id = columns_.by_entry[i];
    if (id >= table_.folders_ || columns_.folder_entries[id] == UINT32_MAX) return false;
    if (i > 0 && columns_.folder_entries[columns_.by_entry[i - 1]] >= columns_.folder_entries[id]) {
      return false;
    }
  }
  return true;
}

bool TableCheck::KeysAreSound() const {
  const std::uint32_t* begins = columns_.key_begins;
  if (begins[0] != 0 || begins[table_.folders_] != Count(kKeys, 1)) return false;
  for (size_t i = 0; i < table_.folders_; ++i) {
    if (begins[i] > begins[i + 1]) return false;
  }
  if (!std::has_single_bit(table_.key_slot_count_)) return false;
  size_t free = 0;
  for (size_t i = 0; i < table_.key_slot_count_; ++i) {
    const NameTable::FolderId id = columns_.key_slots[i];
    if (id == NameTable::kNoFolder) {
      ++free;
    } else if (id >= table_.folders_) {
      return false;
    }
  }
  return free > 0;  // where a search for a key ends
}

bool TableCheck::TreesAreSound() const {
  if (!AreTexts(columns_.top_names, Count(kTopNames, 1), columns_.top_name_begins, table_.trees_)) {
    return false;
  }
  NameTable::FolderId next = 0;
  for (size_t i = 0; i < table_.trees_; ++i) {
    if (columns_.tops[i] != next || next >= table_.folders_ ||
        columns_.parents[next] != NameTable::kNoFolder) {
      return false;
    }
    next = columns_.ends[next];
  }
  return next == table_.folders_;
}

}  // namespace nas
