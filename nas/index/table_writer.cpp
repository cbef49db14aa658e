#include "nas/index/table_writer.h"

#include <algorithm>
#include <bit>
#include <numeric>

#include "nas/match/folded_name.h"

namespace nas {
namespace {

constexpr size_t kMostClasses = 1 << 16;
constexpr size_t kWordBits = 64;

}  // namespace

bool MakeSearchText(std::string_view name, std::string& text) {
  thread_local FoldedName folded;
  folded.Set(name);
  text = folded.folded();
  if (!folded.ascii() && folded.plain() != text) text.append(1, '\1').append(folded.plain());
  return text == name;
}

ClassTable::ClassTable() : rows_(kTypeClasses) {}

size_t ClassTable::Hash::operator()(const TableClass& row) const {
  return TableSum(&row, sizeof row);
}

std::uint16_t ClassTable::Number(const TableClass& row) {
  const std::lock_guard lock(mutex_);
  const auto known = numbers_.find(row);
  if (known != numbers_.end()) return known->second;
  if (rows_.size() == kMostClasses) {
    constexpr unsigned kTypeShift = 12;  // from a mode to a type as DT_*
    return static_cast<std::uint16_t>(row.mode >> kTypeShift) % kTypeClasses;
  }
  rows_.push_back(row);
  return numbers_[row] = static_cast<std::uint16_t>(rows_.size() - 1);
}

std::vector<TableClass> ClassTable::Rows() const {
  const std::lock_guard lock(mutex_);
  return rows_;
}

void TableWriter::Reserve(size_t folders, size_t entries, size_t text_bytes) {
  texts_.reserve(text_bytes);
  for (auto* column : {&text_begins_, &sizes_, &inodes_}) column->reserve(entries + 1);
  for (auto* column : {&mtimes_, &crtimes_}) column->reserve(entries);
  classes_.reserve(entries);
  named_.reserve(entries / kWordBits + 1);
  for (auto* column :
       {&folder_entries_, &parents_, &entries_begins_, &stamp_nanos_, &key_begins_}) {
    column->reserve(folders + 1);
  }
  folder_inodes_.reserve(folders);
  stamp_seconds_.reserve(folders);
}

void TableWriter::PushFolder(FolderId parent, EntryId entry, const Folder& folder) {
  parents_.push_back(parent);
  folder_entries_.push_back(entry);
  entries_begins_.push_back(static_cast<std::uint32_t>(entries()));
  folder_inodes_.push_back(folder.inode);
  stamp_seconds_.push_back(folder.stamp.seconds);
  stamp_nanos_.push_back(folder.stamp.nanoseconds | (folder.unreadable ? kUnreadable : 0));
  key_begins_.push_back(static_cast<std::uint32_t>(keys_.size()));
  keys_ += folder.key;
}

TableWriter::FolderId TableWriter::AddTop(std::string_view name, const Folder& folder) {
  const auto id = static_cast<FolderId>(folders());
  tops_.push_back(id);
  top_name_begins_.push_back(static_cast<std::uint32_t>(top_names_.size()));
  top_names_.append(name).push_back('\0');
  PushFolder(NameTable::kNoFolder, UINT32_MAX, folder);
  return id;
}

TableWriter::FolderId TableWriter::AddFolder(FolderId parent, EntryId entry, const Folder& folder) {
  const auto id = static_cast<FolderId>(folders());
  PushFolder(parent, entry, folder);
  return id;
}

TableWriter::EntryId TableWriter::AddEntry(std::string_view name, std::string_view text,
                                           const EntryFacts& facts) {
  const auto id = static_cast<EntryId>(entries());
  text_begins_.push_back(static_cast<std::uint32_t>(texts_.size()));
  texts_.append(text).push_back('\0');
  // The last number means none; offsets are as wide.
  if (texts_.size() > UINT32_MAX || id >= UINT32_MAX - 1) too_large_ = true;
  if (id % kWordBits == 0) named_.push_back(0);
  if (name != text) {
    named_.back() |= std::uint64_t{1} << (id % kWordBits);
    name_begins_.push_back(static_cast<std::uint32_t>(names_.size()));
    names_.append(name).push_back('\0');
    if (names_.size() > UINT32_MAX) too_large_ = true;
  }
  if (facts.inode > UINT32_MAX && wide_inodes_.empty()) {
    wide_inodes_.assign(inodes_.begin(), inodes_.end());
    wide_inodes_.reserve(inodes_.capacity());
    inodes_ = {};
    wide_inodes_.push_back(facts.inode);
  } else if (!wide_inodes_.empty()) {
    wide_inodes_.push_back(facts.inode);
  } else {
    inodes_.push_back(static_cast<std::uint32_t>(facts.inode));
  }
  sizes_.push_back(0);
  SetSize(id, facts.size);
  mtimes_.push_back(facts.mtime);
  crtimes_.push_back(facts.crtime);
  classes_.push_back(facts.row);
  return id;
}

void TableWriter::SetSize(EntryId entry, std::uint64_t size) {
  sizes_[entry] = static_cast<std::uint32_t>(std::min<std::uint64_t>(size, kLargeSize));
  if (size >= kLargeSize) large_[entry] = size;
}

void TableWriter::ChangeFacts(EntryId entry, const EntryFacts& facts) {
  SetSize(entry, facts.size);
  mtimes_[entry] = facts.mtime;
  crtimes_[entry] = facts.crtime;
  classes_[entry] = facts.row;
}

TableWriter::EntryId TableWriter::CopyEntries(const NameTable& from, EntryId begin, EntryId end,
                                              const std::vector<std::uint16_t>& rows) {
  const auto first = static_cast<EntryId>(entries());
  for (EntryId id = begin; id < end; ++id) {
    AddEntry(from.name(id),
             from.texts(id, id + 1).substr(0, from.text_begin(id + 1) - from.text_begin(id) - 1),
             {.inode = from.inode(id),
              .size = from.size(id),
              .mtime = from.columns_.mtimes[id],
              .crtime = from.columns_.crtimes[id],
              .row = rows[from.columns_.classes[id]]});
  }
  return first;
}

TableWriter::FolderId TableWriter::CopyTree(const NameTable& from, FolderId top, FolderId parent,
                                            EntryId entry, const std::vector<std::uint16_t>& rows) {
  const auto first = static_cast<FolderId>(folders());
  const auto first_entry = static_cast<EntryId>(entries());
  const FolderId end = from.subtree_end(top);
  const EntryId begin = from.entries_begin(top);
  for (FolderId id = top; id < end; ++id) {
    const bool topmost = id == top;
    PushFolder(topmost ? parent : from.parent(id) - top + first,
               topmost ? entry : from.folder_entry(id) - begin + first_entry,
               {.inode = from.folder_inode(id),
                .stamp = from.stamp(id),
                .unreadable = from.unreadable(id),
                .key = from.key(id)});
    entries_begins_.back() = from.entries_begin(id) - begin + first_entry;
  }
  CopyEntries(from, begin, from.entries_begin(end), rows);
  return first;
}

void TableWriter::Finish(std::vector<TableClass>& rows) {
  FinishNames();
  FinishFolders();
  FinishClasses(rows);
  FinishOrder();
  FinishKeys();
}

void TableWriter::FinishNames() {
  text_begins_.push_back(static_cast<std::uint32_t>(texts_.size()));
  name_begins_.push_back(static_cast<std::uint32_t>(names_.size()));
  std::uint32_t before = 0;
  named_before_.reserve(named_.size());
  for (const std::uint64_t word : named_) {
    named_before_.push_back(before);
    before += static_cast<std::uint32_t>(std::popcount(word));
  }
  for (const auto& [entry, size] : large_) {
    large_entries_.push_back(entry);
    large_sizes_.push_back(size);
  }
}

void TableWriter::FinishFolders() {
  entries_begins_.push_back(static_cast<std::uint32_t>(entries()));
  top_name_begins_.push_back(static_cast<std::uint32_t>(top_names_.size()));
  ends_.resize(folders());
  std::iota(ends_.begin(), ends_.end(), 1);
  for (size_t id = folders(); id-- > 0;) {
    if (parents_[id] == NameTable::kNoFolder) continue;
    std::uint32_t& end = ends_[parents_[id]];
    end = std::max(end, ends_[id]);
    by_entry_.push_back(static_cast<std::uint32_t>(id));
  }
  std::sort(by_entry_.begin(), by_entry_.end(), [this](std::uint32_t a, std::uint32_t b) {
    return folder_entries_[a] < folder_entries_[b];
  });
}

// Leaves out the rows that no entry has.
void TableWriter::FinishClasses(std::vector<TableClass>& rows) {
  std::vector<bool> used(rows.size());
  for (const std::uint16_t row : classes_) used[row] = true;
  std::vector<std::uint16_t> numbers(rows.size());
  size_t count = 0;
  for (size_t row = 0; row < rows.size(); ++row) {
    if (row >= kTypeClasses && !used[row]) continue;
    rows[count] = rows[row];
    numbers[row] = static_cast<std::uint16_t>(count++);
  }
  rows.resize(count);
  for (std::uint16_t& row : classes_) row = numbers[row];
}

void TableWriter::FinishOrder() {
  constexpr unsigned kHalf = 32;
  std::vector<size_t> depths(folders());
  for (size_t id = 0; id < folders(); ++id) {
    if (parents_[id] != NameTable::kNoFolder) depths[id] = depths[parents_[id]] + 1;
  }
  // Of each depth: an age, the newest the least, and the entry's number in the lower half.
  std::vector<std::vector<std::uint64_t>> levels(
      depths.empty() ? 0 : *std::ranges::max_element(depths) + 1);
  for (size_t id = 0; id < folders(); ++id) {
    for (EntryId entry = entries_begins_[id]; entry < entries_begins_[id + 1]; ++entry) {
      const std::int64_t mtime = classes_[entry] < kTypeClasses ? 0 : mtimes_[entry];
      const auto age = static_cast<std::uint64_t>(INT32_MAX - mtime);
      levels[depths[id]].push_back(age << kHalf | entry);
    }
  }
  nearest_first_.reserve(entries());
  for (std::vector<std::uint64_t>& level : levels) {
    std::ranges::sort(level);
    for (const std::uint64_t one : level) nearest_first_.push_back(static_cast<EntryId>(one));
    level = {};
  }
}

void TableWriter::FinishKeys() {
  key_begins_.push_back(static_cast<std::uint32_t>(keys_.size()));
  key_slots_.assign(std::bit_ceil(folders() + folders() / 2 + 1), NameTable::kNoFolder);
  const size_t mask = key_slots_.size() - 1;
  for (size_t id = 0; id < folders(); ++id) {
    const std::string_view key(keys_.data() + key_begins_[id],
                               key_begins_[id + 1] - key_begins_[id]);
    if (key.empty()) continue;
    size_t slot = TableSum(key.data(), key.size()) & mask;
    while (key_slots_[slot] != NameTable::kNoFolder) slot = (slot + 1) & mask;
    key_slots_[slot] = static_cast<std::uint32_t>(id);
  }
}

}  // namespace nas
