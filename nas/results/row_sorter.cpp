#include "nas/results/row_sorter.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstring>
#include <string>
#include <unordered_map>
#include <vector>

#include "nas/match/file_kinds.h"
#include "nas/results/foreign_accounts.h"
#include "nas/results/sort_key.h"

namespace nas {
namespace {

// Orderings of fewer rows are quicker made than kept.
constexpr std::uint64_t kWorthKeeping = 10'000;

std::int64_t OrderingId(SortColumn column, std::uint64_t piece) {
  return (std::int64_t{static_cast<int>(column)} << 32) + static_cast<std::int64_t>(piece);
}

}  // namespace

std::optional<SortColumn> ParseSortColumn(std::string_view word) {
  for (const auto& known : kSortColumns) {
    if (known.word == word) return known.column;
  }
  return std::nullopt;
}

bool RowSorter::ReadKept(SortColumn column, std::uint64_t offset, std::uint64_t limit,
                         Ordering& out) {
  if (column == SortColumn::kFound) {
    for (std::uint64_t i = 0; i < limit; ++i) out.push_back(static_cast<std::uint32_t>(offset + i));
    return true;
  }
  out.reserve(limit);
  Statement pieces(db_, "SELECT id, data FROM ordering WHERE id BETWEEN ? AND ? ORDER BY id");
  std::int64_t next = OrderingId(column, offset / kOrderingPiece);
  pieces.Bind(1, next).Bind(2, OrderingId(column, (offset + limit) / kOrderingPiece));
  std::uint64_t skip = offset % kOrderingPiece;
  while (out.size() < limit && pieces.Step()) {
    const std::string_view data = pieces.Bytes(1);
    const std::uint64_t there = data.size() / sizeof(std::uint32_t);
    CheckResultFile(pieces.Integer(0) == next++ && there > 0);
    const std::uint64_t count = std::min(there - std::min(there, skip), limit - out.size());
    const size_t before = out.size();
    out.resize(before + count);
    std::memcpy(out.data() + before, data.data() + skip * sizeof(std::uint32_t),
                count * sizeof(std::uint32_t));
    skip = 0;
  }
  CheckResultFile(
      std::ranges::all_of(out, [this](std::uint32_t row) { return row < blocks_.rows(); }));
  if (out.size() == limit && (limit > 0 || blocks_.rows() == 0)) return true;
  out.clear();
  return false;
}

Ordering RowSorter::OrderingOf(SortColumn column) {
  Ordering ordering;
  if (ReadKept(column, 0, blocks_.rows(), ordering)) return ordering;
  ordering = MakeOrdering(column);
  KeepOrdering(column, ordering);
  return ordering;
}

Ordering RowSorter::MakeOrdering(SortColumn column) {
  switch (column) {
    case SortColumn::kName: {
      TextKeys keys;
      blocks_.ForEachNames([&keys](std::uint64_t, const BlockReader::Names& block) {
        for (const std::string_view name : block.names) keys.AddNatural(name);
      });
      return keys.Order();
    }
    case SortColumn::kPath:
      return OrderByPath();
    case SortColumn::kType:
      return OrderByType();
    case SortColumn::kUser:
      return OrderByOwner(&FileAttributes::uid,
                          [accounts = ForeignAccounts(db_)](auto id) { return accounts.User(id); });
    case SortColumn::kGroup:
      return OrderByOwner(&FileAttributes::gid, [accounts = ForeignAccounts(db_)](auto id) {
        return accounts.Group(id);
      });
    default: {
      std::vector<std::uint64_t> keys(blocks_.rows());
      blocks_.ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
        keys[row] = NumberSortKey(column, attributes);
      });
      return OrderByNumber(keys);
    }
  }
}

// By folder, then by name: files of one folder stand together, before those of its sub-folders.
Ordering RowSorter::OrderByPath() {
  std::unordered_map<std::string, std::uint32_t> folder_numbers;
  TextKeys folder_keys;
  std::vector<std::vector<std::uint32_t>> block_folders;
  std::vector<std::uint64_t> block_firsts;
  blocks_.ForEachNames([&](std::uint64_t first, const BlockReader::Names& block) {
    block_firsts.push_back(first);
    auto& numbers = block_folders.emplace_back();
    for (const BlockReader::Folder& folder : block.folders) {
      std::string path = blocks_.location(folder.location).share_name;
      path.append("/").append(folder.path);
      const auto [known, added] =
          folder_numbers.try_emplace(path, static_cast<std::uint32_t>(folder_keys.size()));
      if (added) {
        // "/" has to come before every other character, or "a-b" would stand between "a" and "a/c".
        std::ranges::replace(path, '/', '\x01');
        folder_keys.AddNatural(path);
      }
      numbers.push_back(known->second);
    }
  });
  const std::vector<std::uint32_t> folder_ranks = Ranks(folder_keys.Order(), &folder_keys);
  const std::vector<std::uint32_t> name_ranks = Ranks(OrderingOf(SortColumn::kName));
  std::vector<std::uint64_t> keys(blocks_.rows());
  size_t block = 0;
  blocks_.ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
    while (block + 1 < block_firsts.size() && row >= block_firsts[block + 1]) ++block;
    const std::uint64_t folder = folder_ranks[block_folders[block].at(attributes.folder)];
    keys[row] = (folder << 32) | name_ranks[row];
  });
  return OrderByNumber(keys);
}

Ordering RowSorter::OrderByType() {
  std::unordered_map<std::string, std::uint32_t> types;
  TextKeys type_keys;
  std::vector<std::uint64_t> keys(blocks_.rows());
  blocks_.ForEachNames([&](std::uint64_t first, const BlockReader::Names& block) {
    for (size_t i = 0; i < block.names.size(); ++i) {
      const std::string type = FoldText(ExtensionOf(block.names[i]));
      const auto [known, added] =
          types.try_emplace(type, static_cast<std::uint32_t>(type_keys.size()));
      if (added) type_keys.AddNatural(type);
      keys[first + i] = known->second;
    }
  });
  const std::vector<std::uint32_t> ranks = Ranks(type_keys.Order());
  // Folders have no type: they come first.
  blocks_.ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
    keys[row] = S_ISDIR(attributes.mode) ? 0 : 1 + std::uint64_t{ranks[keys[row]]};
  });
  return OrderByNumber(keys);
}

template <typename NameOf>
Ordering RowSorter::OrderByOwner(std::uint32_t FileAttributes::*id, NameOf name_of) {
  std::unordered_map<std::uint32_t, std::uint32_t> numbers;
  TextKeys name_keys;
  std::vector<std::uint64_t> keys(blocks_.rows());
  blocks_.ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
    const std::uint32_t owner = attributes.*id;
    const auto [known, added] =
        numbers.try_emplace(owner, static_cast<std::uint32_t>(name_keys.size()));
    if (added) name_keys.AddNatural(name_of(owner));
    keys[row] = known->second;
  });
  const std::vector<std::uint32_t> ranks = Ranks(name_keys.Order());
  for (std::uint64_t& key : keys) key = ranks[key];
  return OrderByNumber(keys);
}

// Keeping is a convenience: where it fails (a full disk, a busy file) the page is served all the
// same and the next listing sorts again.
void RowSorter::KeepOrdering(SortColumn column, const Ordering& ordering) {
  if (!WorthKeeping()) return;
  try {
    db_.SetReadOnly(false);
    Statement insert(db_, "INSERT OR REPLACE INTO ordering VALUES(?,?)");
    const std::string_view bytes(reinterpret_cast<const char*>(ordering.data()),
                                 ordering.size() * sizeof(Ordering::value_type));
    constexpr size_t kPieceBytes = kOrderingPiece * sizeof(Ordering::value_type);
    for (size_t piece = 0; piece * kPieceBytes < bytes.size(); ++piece) {
      insert.Bind(1, OrderingId(column, piece))
          .BindBlob(2, bytes.substr(piece * kPieceBytes, kPieceBytes))
          .Run();
    }
  } catch (const SqliteError&) {
  }
  db_.SetReadOnly(true);
}

bool RowSorter::WorthKeeping() {
  return blocks_.rows() >= kWorthKeeping && Statement(db_, "SELECT 1 FROM complete").Step();
}

}  // namespace nas
