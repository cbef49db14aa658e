#include "nas/results/result_reader.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <limits>
#include <memory>
#include <unordered_map>

#include "nas/base/accounts.h"
#include "nas/match/file_kinds.h"

namespace nas {
namespace {

// Blocks held at a time, some 150 KB each: enough for a page of rows from all over the file.
constexpr size_t kMostBlocks = 256;
// A page of the usual length, in one or two steps; 3.5 KB.
constexpr size_t kPieceRows = 64;
// Orderings of fewer rows are quicker made than kept.
constexpr std::uint64_t kWorthKeeping = 10'000;
// Of a mode; the others are the file's type.
constexpr std::uint32_t kPermissionBits = 07777;
// Orderings number rows in 32 bits.
constexpr std::uint64_t kMostRows = std::uint64_t{1} << 32;

// The file is its user's own to write to, while the process that reads it may be able to become
// root: numbers in it are checked before anything is indexed by them.
void Check(bool sound) {
  if (!sound) throw std::runtime_error("a damaged result file");
}

constexpr struct {
  std::string_view word;
  SortColumn column;
} kSortColumns[] = {
    // In this order they are kept: first those that take long to make.
    {"name", SortColumn::kName},   {"path", SortColumn::kPath},     {"type", SortColumn::kType},
    {"size", SortColumn::kSize},   {"user", SortColumn::kUser},     {"group", SortColumn::kGroup},
    {"mode", SortColumn::kMode},   {"atime", SortColumn::kAtime},   {"mtime", SortColumn::kMtime},
    {"ctime", SortColumn::kCtime}, {"crtime", SortColumn::kCrtime},
};

Database OpenResultFile(const std::string& path) {
  Database db(path, SQLITE_OPEN_READWRITE | SQLITE_OPEN_EXRESCODE, kResultBusyMilliseconds);
  db.Execute("PRAGMA synchronous=OFF; PRAGMA cache_size=-16384");
  Statement version(db, "PRAGMA user_version");
  if (!version.Step() || version.Integer(0) != kResultVersion) {
    throw std::runtime_error(path + ": not a result file of this version");
  }
  return db;
}

std::int64_t OrderingId(SortColumn column, std::uint64_t piece) {
  return (std::int64_t{static_cast<int>(column)} << 32) + static_cast<std::int64_t>(piece);
}

std::uint64_t NumberKey(SortColumn column, const FileAttributes& file) {
  switch (column) {
    case SortColumn::kSize:
      return file.size;
    case SortColumn::kMode:
      return file.mode & kPermissionBits;
    case SortColumn::kAtime:
      return UnsignedKey(file.atime);
    case SortColumn::kMtime:
      return UnsignedKey(file.mtime);
    case SortColumn::kCtime:
      return UnsignedKey(file.ctime);
    case SortColumn::kCrtime:
      return UnsignedKey(file.crtime);
    default:
      return 0;
  }
}

}  // namespace

std::optional<SortColumn> ParseSortColumn(std::string_view word) {
  for (const auto& known : kSortColumns) {
    if (known.word == word) return known.column;
  }
  return std::nullopt;
}

ResultReader::ResultReader(const std::string& path) : path_(path), db_(OpenResultFile(path)) {}

void ResultReader::Begin() {
  attributes_.reset();
  transaction_.emplace(db_, Transaction::Kind::kRead);
  blocks_.clear();
  Statement last(db_, "SELECT first + count FROM names ORDER BY first DESC LIMIT 1");
  rows_ = last.Step() ? static_cast<std::uint64_t>(last.Integer(0)) : 0;
  Check(rows_ < kMostRows);
  locations_.clear();
  Statement locations(db_, "SELECT id, share_name, share_root FROM location");
  while (locations.Step()) {
    locations_[static_cast<std::uint16_t>(locations.Integer(0))] = {
        std::string(locations.Bytes(1)), std::string(locations.Bytes(2))};
  }
  ReadPurged();
}

void ResultReader::End() {
  attributes_.reset();
  transaction_->Commit();
  transaction_.reset();
}

void ResultReader::ReadPurged() {
  purged_.clear();
  Statement purged(db_, "SELECT row FROM purged");
  while (purged.Step()) purged_.insert(static_cast<std::uint32_t>(purged.Integer(0)));
}

void ResultReader::TakeApart(std::string_view folders, std::string_view names, Names& out) {
  out.bytes.assign(folders);
  out.bytes.append(names);
  const std::string_view bytes = out.bytes;
  size_t at = 0;
  while (at + sizeof(std::uint16_t) < folders.size()) {
    Folder folder{};
    std::memcpy(&folder.location, bytes.data() + at, sizeof(folder.location));
    at += sizeof(folder.location);
    folder.path = bytes.substr(at, bytes.find('\0', at) - at);
    at += folder.path.size() + 1;
    out.folders.push_back(folder);
  }
  out.rest = folders.size();
}

// Makes the first `count` names known, or all there are.
void ResultReader::ParseNames(Names& names, size_t count) {
  const std::string_view bytes = names.bytes;
  while (names.names.size() < count && names.rest < bytes.size()) {
    const std::string_view name =
        bytes.substr(names.rest, bytes.find('\0', names.rest) - names.rest);
    names.names.push_back(name);
    names.rest += name.size() + 1;
  }
}

ResultReader::Block& ResultReader::BlockOf(std::uint32_t number, std::uint64_t& first) {
  auto after = blocks_.upper_bound(number);
  if (after != blocks_.begin()) {
    auto& [known_first, block] = *std::prev(after);
    first = known_first;
    if (number - known_first < block.rows) return block;
  }
  if (blocks_.size() >= kMostBlocks) blocks_.clear();
  Statement names(db_,
                  "SELECT first, folders, names FROM names WHERE first <= ? "
                  "ORDER BY first DESC LIMIT 1");
  if (!names.Bind(1, number).Step()) throw std::runtime_error("a result row is missing");
  first = static_cast<std::uint64_t>(names.Integer(0));
  Block& block = blocks_[first];
  TakeApart(names.Bytes(1), names.Bytes(2), block.names);
  OpenAttributes(names.Integer(0));
  block.rows = attributes_->size() / sizeof(FileAttributes);
  return block;
}

void ResultReader::OpenAttributes(std::int64_t first) {
  if (attributes_ && attributes_of_ == first) return;
  if (attributes_) {
    attributes_->MoveTo(first);
  } else {
    attributes_.emplace(db_, "attributes", "data", first);
  }
  attributes_of_ = first;
}

const FileAttributes& ResultReader::AttributesIn(Block& block, std::uint64_t first, size_t index) {
  Check(index < block.rows);
  const size_t begin = index - index % kPieceRows;
  std::vector<FileAttributes>& piece = block.pieces[begin];
  if (piece.empty()) {
    OpenAttributes(static_cast<std::int64_t>(first));
    std::vector<FileAttributes> rows(std::min(kPieceRows, block.rows - begin));
    attributes_->Read(begin * sizeof(FileAttributes), rows.size() * sizeof(FileAttributes),
                      rows.data());
    piece = std::move(rows);
  }
  return piece[index - begin];
}

ResultRow ResultReader::Row(std::uint32_t number) {
  std::uint64_t first = 0;
  Block& block = BlockOf(number, first);
  const size_t index = number - first;
  const FileAttributes& attributes = AttributesIn(block, first, index);
  ParseNames(block.names, index + 1);
  const Folder& folder = block.names.folders.at(attributes.folder);
  const Location& location = locations_.at(folder.location);
  return {location.share_name, location.share_root, folder.path, block.names.names.at(index),
          &attributes};
}

// Calls visit(first row, names side of the block) for every block, in order. The blocks number the
// rows without a gap.
template <typename Visitor>
void ResultReader::ForEachNames(Visitor visit) {
  std::uint64_t next = 0;
  Statement blocks(db_, "SELECT first, folders, names FROM names ORDER BY first");
  Names names;
  while (blocks.Step()) {
    names.folders.clear();
    names.names.clear();
    TakeApart(blocks.Bytes(1), blocks.Bytes(2), names);
    ParseNames(names, std::numeric_limits<size_t>::max());
    Check(static_cast<std::uint64_t>(blocks.Integer(0)) == next &&
          names.names.size() <= rows_ - next);
    visit(next, names);
    next += names.names.size();
  }
  Check(next == rows_);
}

// Calls visit(row, attributes) for every row, in order and without a gap.
template <typename Visitor>
void ResultReader::ForEachAttributes(Visitor visit) {
  Statement blocks(db_, "SELECT first, data FROM attributes ORDER BY first");
  FileAttributes row;
  std::uint64_t next = 0;
  while (blocks.Step()) {
    const std::string_view data = blocks.Bytes(1);
    Check(static_cast<std::uint64_t>(blocks.Integer(0)) == next &&
          data.size() / sizeof(row) <= rows_ - next);
    for (size_t at = 0; at + sizeof(row) <= data.size(); at += sizeof(row)) {
      std::memcpy(&row, data.data() + at, sizeof(row));
      visit(static_cast<std::uint32_t>(next++), row);
    }
  }
  Check(next == rows_);
}

ResultReader::Page ResultReader::Select(const Selection& selection, std::uint64_t offset,
                                        std::uint64_t limit) {
  Page page;
  const bool reversed = !selection.ascending && selection.column != SortColumn::kFound;
  if (purged_.empty() && !selection.filters()) {
    // All rows: only the page itself need be known of their order.
    page.total = rows_;
    const std::uint64_t begin = std::min(offset, rows_);
    const std::uint64_t count = std::min(limit, rows_ - begin);
    const std::uint64_t first = reversed ? rows_ - begin - count : begin;
    if (!ReadKept(selection.column, first, count, page.numbers)) {
      const Ordering all = OrderingOf(selection.column);
      const auto from = all.begin() + static_cast<std::ptrdiff_t>(first);
      page.numbers.assign(from, from + static_cast<std::ptrdiff_t>(count));
    }
    if (reversed) std::ranges::reverse(page.numbers);
    return page;
  }
  Ordering passing = OrderingOf(selection.column);
  std::erase_if(passing, [passes = Passing(selection)](std::uint32_t row) { return !passes[row]; });
  if (reversed) std::ranges::reverse(passing);
  page.total = passing.size();
  const std::uint64_t begin = std::min(offset, page.total);
  const std::uint64_t end = begin + std::min(limit, page.total - begin);
  page.numbers.assign(passing.begin() + static_cast<std::ptrdiff_t>(begin),
                      passing.begin() + static_cast<std::ptrdiff_t>(end));
  return page;
}

// For each row whether it passes the filters and has not been purged.
std::vector<bool> ResultReader::Passing(const Selection& selection) {
  std::vector<bool> passes(rows_, true);
  for (const std::uint32_t row : purged_) {
    if (row < rows_) passes[row] = false;
  }
  if (selection.directories) {
    ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
      if (S_ISDIR(attributes.mode) != *selection.directories) passes[row] = false;
    });
  }
  if (selection.pattern) {
    FoldedName folded;
    ForEachNames([&](std::uint64_t first, const Names& block) {
      for (size_t i = 0; i < block.names.size(); ++i) {
        folded.Set(block.names[i]);
        if (passes[first + i] && !selection.pattern->Matches(folded)) passes[first + i] = false;
      }
    });
  }
  return passes;
}

// Appends to `out` the rows [offset, offset + limit) of a kept ordering; false where none is kept.
bool ResultReader::ReadKept(SortColumn column, std::uint64_t offset, std::uint64_t limit,
                            Ordering& out) {
  if (column == SortColumn::kFound) {
    for (std::uint64_t i = 0; i < limit; ++i) out.push_back(static_cast<std::uint32_t>(offset + i));
    return true;
  }
  out.reserve(limit);
  Statement pieces(db_, "SELECT data FROM ordering WHERE id BETWEEN ? AND ? ORDER BY id");
  pieces.Bind(1, OrderingId(column, offset / kOrderingPiece))
      .Bind(2, OrderingId(column, (offset + limit) / kOrderingPiece));
  std::uint64_t skip = offset % kOrderingPiece;
  while (out.size() < limit && pieces.Step()) {
    const std::string_view data = pieces.Bytes(0);
    const std::uint64_t there = data.size() / sizeof(std::uint32_t);
    const std::uint64_t count = std::min(there - std::min(there, skip), limit - out.size());
    const size_t before = out.size();
    out.resize(before + count);
    std::memcpy(out.data() + before, data.data() + skip * sizeof(std::uint32_t),
                count * sizeof(std::uint32_t));
    skip = 0;
  }
  Check(std::ranges::all_of(out, [this](std::uint32_t row) { return row < rows_; }));
  if (out.size() == limit && (limit > 0 || rows_ == 0)) return true;
  out.clear();
  return false;
}

Ordering ResultReader::OrderingOf(SortColumn column) {
  Ordering ordering;
  if (ReadKept(column, 0, rows_, ordering)) return ordering;
  ordering = MakeOrdering(column);
  KeepOrdering(column, ordering);
  return ordering;
}

Ordering ResultReader::MakeOrdering(SortColumn column) {
  switch (column) {
    case SortColumn::kName: {
      TextKeys keys;
      ForEachNames([&keys](std::uint64_t, const Names& block) {
        for (const std::string_view name : block.names) keys.AddNatural(name);
      });
      return keys.Order();
    }
    case SortColumn::kPath:
      return OrderByPath();
    case SortColumn::kType:
      return OrderByType();
    case SortColumn::kUser:
      return OrderByOwner(&FileAttributes::uid, [this](std::uint32_t id) { return UserName(id); });
    case SortColumn::kGroup:
      return OrderByOwner(&FileAttributes::gid, [this](std::uint32_t id) { return GroupName(id); });
    default: {
      std::vector<std::uint64_t> keys(rows_);
      ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
        keys[row] = NumberKey(column, attributes);
      });
      return OrderByNumber(keys);
    }
  }
}

// By folder, then by name: files of one folder stand together, before those of its sub-folders.
Ordering ResultReader::OrderByPath() {
  std::unordered_map<std::string, std::uint32_t> folder_numbers;
  TextKeys folder_keys;
  std::vector<std::vector<std::uint32_t>> block_folders;
  std::vector<std::uint64_t> block_firsts;
  ForEachNames([&](std::uint64_t first, const Names& block) {
    block_firsts.push_back(first);
    auto& numbers = block_folders.emplace_back();
    for (const Folder& folder : block.folders) {
      std::string path = locations_.at(folder.location).share_name;
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
  std::vector<std::uint64_t> keys(rows_);
  size_t block = 0;
  ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
    while (block + 1 < block_firsts.size() && row >= block_firsts[block + 1]) ++block;
    const std::uint64_t folder = folder_ranks[block_folders[block].at(attributes.folder)];
    keys[row] = (folder << 32) | name_ranks[row];
  });
  return OrderByNumber(keys);
}

Ordering ResultReader::OrderByType() {
  std::unordered_map<std::string, std::uint32_t> types;
  TextKeys type_keys;
  std::vector<std::uint64_t> keys(rows_);
  ForEachNames([&](std::uint64_t first, const Names& block) {
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
  ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
    keys[row] = S_ISDIR(attributes.mode) ? 0 : 1 + std::uint64_t{ranks[keys[row]]};
  });
  return OrderByNumber(keys);
}

template <typename NameOf>
Ordering ResultReader::OrderByOwner(std::uint32_t FileAttributes::*id, NameOf name_of) {
  std::unordered_map<std::uint32_t, std::uint32_t> numbers;
  TextKeys name_keys;
  std::vector<std::uint64_t> keys(rows_);
  ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
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
void ResultReader::KeepOrdering(SortColumn column, const Ordering& ordering) {
  if (ordering.size() < kWorthKeeping || !complete()) return;
  try {
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
}

bool ResultReader::complete() { return Statement(db_, "SELECT 1 FROM complete").Step(); }

void ResultReader::KeepAllOrderings() {
  for (const auto& known : kSortColumns) {
    Begin();
    if (rows_ < kWorthKeeping || !complete() || access(path_.c_str(), F_OK) != 0) return;
    OrderingOf(known.column);
    End();
  }
  db_.EmptyLog();
}

void ResultReader::Purge(const std::vector<std::uint32_t>& numbers) {
  Transaction transaction(db_, Transaction::Kind::kWrite);
  Statement insert(db_, "INSERT OR IGNORE INTO purged VALUES(?)");
  for (const std::uint32_t number : numbers) insert.Bind(1, number).Run();
  transaction.Commit();
}

const std::string& ResultReader::UserName(std::uint32_t uid) {
  const auto [name, added] = user_names_.try_emplace(uid);
  if (added) name->second = UserText(uid);
  return name->second;
}

const std::string& ResultReader::GroupName(std::uint32_t gid) {
  const auto [name, added] = group_names_.try_emplace(gid);
  if (added) name->second = GroupText(gid);
  return name->second;
}

}  // namespace nas
