#include "nas/index/name_table.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <xxhash.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

#include "nas/base/unique_fd.h"
#include "nas/index/table_check.h"
#include "nas/match/folded_name.h"

namespace nas {

std::uint64_t TableSum(const void* bytes, size_t count) { return XXH3_64bits(bytes, count); }

Result<NameTable> NameTable::Open(int dir_fd, const std::string& name,
                                  std::string_view file_system) {
  const UniqueFd file(openat(dir_fd, name.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  if (!file) return ErrnoError(name);
  struct stat status;
  if (fstat(file.get(), &status) != 0) return ErrnoError(name);
  const auto bytes = static_cast<size_t>(status.st_size);
  if (!S_ISREG(status.st_mode) || bytes < sizeof(TableHeader)) return ErrnoError(EBADMSG, name);
  // All of it is about to be read, so its pages may as well come at once.
  void* mapped = mmap(nullptr, bytes, PROT_READ, MAP_SHARED | MAP_POPULATE, file.get(), 0);
  if (mapped == MAP_FAILED) return ErrnoError(name);
  NameTable table;
  table.mapping_ = static_cast<const char*>(mapped);
  table.bytes_ = bytes;
  if (const int refused = TableCheck(table).Check(file_system)) return ErrnoError(refused, name);
  table.FindStrays();
  table.FindOthers();
  return table;
}

void NameTable::FindStrays() {
  const std::uint32_t* next = columns_.by_entry;
  const std::uint32_t* const end = next + (folders_ - trees_);
  for (EntryId id = 0; id < entries_; ++id) {
    if (type(id) != DT_DIR) continue;
    if (next != end && columns_.folder_entries[*next] == id) {
      ++next;
    } else {
      strays_.push_back(id);
    }
  }
}

// Not in the file: it takes some ten milliseconds a million.
void NameTable::FindOthers() {
  others_.resize((entries_ + kWordBits - 1) / kWordBits);
  size_t named = 0;
  for (EntryId id = 0; id < entries_; ++id) {
    const std::string_view name = Bit(columns_.named, id)
                                      ? Piece(columns_.names, columns_.name_begins, named++)
                                      : Piece(columns_.texts, columns_.text_begins, id);
    others_[id / kWordBits] |= std::uint64_t{IsAscii(name) ? 0U : 1U} << (id % kWordBits);
  }
}

NameTable::NameTable(NameTable&& other) noexcept { Swap(other); }

NameTable& NameTable::operator=(NameTable&& other) noexcept {
  Swap(other);
  return *this;
}

NameTable::~NameTable() {
  if (mapping_ != nullptr) munmap(const_cast<char*>(mapping_), bytes_);
}

void NameTable::Swap(NameTable& other) {
  std::swap(mapping_, other.mapping_);
  std::swap(bytes_, other.bytes_);
  std::swap(entries_, other.entries_);
  std::swap(folders_, other.folders_);
  std::swap(trees_, other.trees_);
  std::swap(named_count_, other.named_count_);
  std::swap(large_count_, other.large_count_);
  std::swap(class_count_, other.class_count_);
  std::swap(key_slot_count_, other.key_slot_count_);
  std::swap(columns_, other.columns_);
  std::swap(strays_, other.strays_);
  std::swap(others_, other.others_);
}

NameTable::EntryId NameTable::folder_entry(FolderId id) const {
  const std::uint32_t entry = columns_.folder_entries[id];
  return entry == UINT32_MAX ? entries_ : entry;
}

std::string_view NameTable::folder_name(FolderId id) const {
  const EntryId entry = folder_entry(id);
  return entry == entries_ ? std::string_view() : name(entry);
}

NameTable::FolderId NameTable::Find(std::string_view key) const {
  const size_t mask = key_slot_count_ - 1;
  for (size_t slot = TableSum(key.data(), key.size()) & mask;; slot = (slot + 1) & mask) {
    const FolderId id = columns_.key_slots[slot];
    if (id == kNoFolder || KeyBytes(id) == key) return id;
  }
}

NameTable::FolderId NameTable::folder_of(EntryId id) const {
  const std::uint32_t* begins = columns_.entries_begins;
  // Of folders that begin at one entry all but the last are empty.
  const std::uint32_t* after = std::upper_bound(begins, begins + folders_, id);
  return static_cast<FolderId>(after - begins) - 1;
}

unsigned char NameTable::type(EntryId id) const {
  const std::uint16_t row = columns_.classes[id];
  if (row < kTypeClasses) return static_cast<unsigned char>(row);
  return static_cast<unsigned char>(IFTODT(columns_.class_rows[row].mode));
}

std::uint64_t NameTable::LargeSize(EntryId id) const {
  const std::uint32_t* begin = columns_.large_entries;
  const std::uint32_t* at = std::lower_bound(begin, begin + large_count_, id);
  return at != begin + large_count_ && *at == id ? columns_.large_sizes[at - begin] : kLargeSize;
}

std::optional<NameTable::Attributes> NameTable::attributes(EntryId id) const {
  const std::uint16_t row = columns_.classes[id];
  if (row < kTypeClasses) return std::nullopt;
  const TableClass& access = columns_.class_rows[row];
  return Attributes{.size = size(id),
                    .mtime = mtime(id),
                    .crtime = crtime(id),
                    .mode = access.mode,
                    .uid = access.uid,
                    .gid = access.gid};
}

NameTable::EntryId NameTable::FindEntry(FolderId folder, std::string_view wanted) const {
  EntryId begin = entries_begin(folder);
  EntryId end = entries_end(folder);
  const EntryId last = end;
  while (begin < end) {
    const EntryId middle = begin + (end - begin) / 2;
    if (name(middle) < wanted) {
      begin = middle + 1;
    } else {
      end = middle;
    }
  }
  return begin < last && name(begin) == wanted ? begin : entries_;
}

NameTable::FolderId NameTable::folder_at(EntryId id) const {
  const std::uint32_t* begin = columns_.by_entry;
  const std::uint32_t* end = begin + (folders_ - trees_);
  const std::uint32_t* at = std::lower_bound(
      begin, end, id,
      [this](FolderId folder, EntryId entry) { return columns_.folder_entries[folder] < entry; });
  return at != end && columns_.folder_entries[*at] == id ? *at : kNoFolder;
}

NameTable::EntryId NameTable::entry_of_text(std::uint64_t offset) const {
  const std::uint32_t* begins = columns_.text_begins;
  const std::uint32_t* after = std::upper_bound(begins, begins + entries_, offset);
  return static_cast<EntryId>(after - begins) - 1;
}

}  // namespace nas
