// How a table's columns come to disk. A crash at any moment leaves the table that was there before,
// or the new one, whole.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <xxhash.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <memory>
#include <span>

#include "nas/base/file_io.h"
#include "nas/base/unique_fd.h"
#include "nas/index/table_folders.h"
#include "nas/index/table_writer.h"
#include "nas/match/folded_name.h"

namespace nas {
namespace {

constexpr mode_t kMode = 0600;  // it tells all names to whoever reads it

class ColumnFile {
 public:
  explicit ColumnFile(UniqueFd fd) : fd_(std::move(fd)) {}

  template <typename T>
  void Set(TableColumn column, const T& values) {
    bytes_[column] = std::as_bytes(std::span(values.data(), values.size()));
  }
  // Writes the columns behind a place for the header, then the header into that place.
  Status Write(TableHeader header) {
    header.file_bytes = sizeof header;
    if (lseek(fd_.get(), sizeof header, SEEK_SET) < 0) return ErrnoError();
    for (unsigned column = 0; column < kTableColumns; ++column) {
      header.columns[column] = {header.file_bytes, bytes_[column].size(), 0};
      if (const Status written = WriteColumn(header.columns[column], bytes_[column]); !written) {
        return written;
      }
      header.file_bytes += AlignedColumn(bytes_[column].size());
    }
    header.sum = TableSum(&header, offsetof(TableHeader, sum));
    if (lseek(fd_.get(), 0, SEEK_SET) < 0) return ErrnoError();
    const Status written =
        WriteAll(fd_.get(), {reinterpret_cast<const char*>(&header), sizeof header});
    if (!written) return written;
    return fsync(fd_.get()) == 0 ? Status() : Status(ErrnoError());
  }

 private:
  // The whole of what fills multiples of the alignment, then the rest with its filling.
  Status WriteColumn(TableHeader::Column& column, std::span<const std::byte> bytes) const;

  UniqueFd fd_;
  std::array<std::span<const std::byte>, kTableColumns> bytes_;
};

Status ColumnFile::WriteColumn(TableHeader::Column& column,
                               std::span<const std::byte> bytes) const {
  const size_t whole = bytes.size() / kColumnAlignment * kColumnAlignment;
  const std::string_view body(reinterpret_cast<const char*>(bytes.data()), whole);
  const std::span<const std::byte> rest = bytes.subspan(whole);
  std::array<char, kColumnAlignment> last = {};
  if (!rest.empty()) std::memcpy(last.data(), rest.data(), rest.size());
  const std::string_view end(last.data(), rest.empty() ? 0 : last.size());

  const std::unique_ptr<XXH3_state_t, decltype(&XXH3_freeState)> sum(XXH3_createState(),
                                                                     XXH3_freeState);
  XXH3_64bits_reset(sum.get());
  XXH3_64bits_update(sum.get(), body.data(), body.size());
  XXH3_64bits_update(sum.get(), end.data(), end.size());
  column.sum = XXH3_64bits_digest(sum.get());
  const Status written = WriteAll(fd_.get(), body);
  return written ? WriteAll(fd_.get(), end) : written;
}

template <size_t kCount>
bool Fill(std::array<char, kCount>& field, std::string_view text) {
  if (text.size() > kCount) return false;
  std::copy(text.begin(), text.end(), field.begin());
  return true;
}

}  // namespace

Status TableWriter::Write(int dir_fd, const std::string& name, std::string_view file_system,
                          std::vector<TableClass> rows) {
  if (too_large_ || keys_.size() > UINT32_MAX) return ErrnoError(EFBIG, name);
  Finish(rows);
  TableHeader header;
  header.entries = static_cast<std::uint32_t>(entries());
  header.folders = static_cast<std::uint32_t>(folders());
  header.trees = static_cast<std::uint32_t>(tops_.size());
  header.inode_bytes = wide_inodes_.empty() ? sizeof(std::uint32_t) : sizeof(std::uint64_t);
  if (!Fill(header.fold, FoldVersion()) || !Fill(header.file_system, file_system)) {
    return ErrnoError(ENAMETOOLONG, name);
  }

  const std::string unfinished = name + kUnfinished;
  UniqueFd fd(openat(dir_fd, unfinished.c_str(),
                     O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, kMode));
  if (!fd) return ErrnoError(unfinished);
  ColumnFile file(std::move(fd));
  file.Set(kTexts, texts_);
  file.Set(kTextBegins, text_begins_);
  file.Set(kNames, names_);
  file.Set(kNameBegins, name_begins_);
  file.Set(kNamed, named_);
  file.Set(kNamedBefore, named_before_);
  if (wide_inodes_.empty()) {
    file.Set(kInodes, inodes_);
  } else {
    file.Set(kInodes, wide_inodes_);
  }
  file.Set(kSizes, sizes_);
  file.Set(kLargeEntries, large_entries_);
  file.Set(kLargeSizes, large_sizes_);
  file.Set(kMtimes, mtimes_);
  file.Set(kCrtimes, crtimes_);
  file.Set(kClasses, classes_);
  file.Set(kClassRows, rows);
  file.Set(kNearestFirst, nearest_first_);
  file.Set(kFolderEntries, folder_entries_);
  file.Set(kFolderParents, parents_);
  file.Set(kFolderEnds, ends_);
  file.Set(kEntriesBegins, entries_begins_);
  file.Set(kFolderInodes, folder_inodes_);
  file.Set(kStampSeconds, stamp_seconds_);
  file.Set(kStampNanos, stamp_nanos_);
  file.Set(kKeys, keys_);
  file.Set(kKeyBegins, key_begins_);
  file.Set(kKeySlots, key_slots_);
  file.Set(kByEntry, by_entry_);
  file.Set(kTops, tops_);
  file.Set(kTopNames, top_names_);
  file.Set(kTopNameBegins, top_name_begins_);
  Status status = file.Write(header);
  if (status && renameat(dir_fd, unfinished.c_str(), dir_fd, name.c_str()) != 0) {
    status = ErrnoError(name);
  }
  if (!status) {
    unlinkat(dir_fd, unfinished.c_str(), 0);
    return status.error().Of(name);
  }
  return SyncFolder(dir_fd, ".");
}

}  // namespace nas
