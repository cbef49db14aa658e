#include "nas/results/block_reader.h"

#include <algorithm>
#include <limits>
#include <utility>

namespace nas {
namespace {

// Blocks held at a time, some 150 KB each: enough for a page of rows from all over the file. Those
// with very long paths are fewer.
constexpr size_t kMostBlocks = 256;
constexpr size_t kMostHeldBytes = size_t{64} << 20;
// A page of the usual length, in one or two steps; 3.5 KB.
constexpr size_t kPieceRows = 64;
// Orderings number rows in 32 bits.
constexpr std::int64_t kMostRows = std::int64_t{1} << 32;
// What a row takes in the file at least: its attributes and the end of its name.
constexpr std::uint64_t kFewestRowBytes = sizeof(FileAttributes) + 1;

}  // namespace

void BlockReader::Open() {
  blocks_.clear();
  held_bytes_ = 0;
  rows_ = ReadRowCount();
  // What the transaction sees was settled by that, and since then the file can only have grown.
  file_bytes_ = ResultFileBytes(path_);
  CheckResultFile(rows_ <= file_bytes_ / kFewestRowBytes);
  db_.BoundValues(file_bytes_);
  ReadLocations();
}

std::uint64_t BlockReader::ReadRowCount() {
  Statement last(db_, "SELECT first, count FROM names ORDER BY first DESC LIMIT 1");
  if (!last.Step()) return 0;
  const std::int64_t first = last.Integer(0);
  const std::int64_t count = last.Integer(1);
  CheckResultFile(first >= 0 && first < kMostRows && count > 0 &&
                  count <= static_cast<std::int64_t>(RowBlock::kMostRows));
  return static_cast<std::uint64_t>(first + count);
}

void BlockReader::ReadLocations() {
  locations_.clear();
  Budget budget(file_bytes_);
  std::int64_t next = 0;
  Statement locations(db_, "SELECT id, share_name, share_root FROM location ORDER BY id");
  while (locations.Step()) {
    const std::int64_t id = locations.Integer(0);
    CheckResultFile(id >= next && id <= std::numeric_limits<std::uint16_t>::max());
    next = id + 1;
    budget.Spend(locations.Bytes(1));
    budget.Spend(locations.Bytes(2));
    locations_[static_cast<std::uint16_t>(id)] = {std::string(locations.Bytes(1)),
                                                  std::string(locations.Bytes(2))};
  }
}

void BlockReader::TakeApart(std::string_view folders, std::string_view names, Names& out) {
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
    CheckResultFile(out.folders.size() < RowBlock::kMostRows);
    out.folders.push_back(folder);
  }
  out.rest = folders.size();
}

// Makes the first `count` names known, or all there are.
void BlockReader::ParseNames(Names& names, size_t count) {
  const std::string_view bytes = names.bytes;
  while (names.names.size() < count && names.rest < bytes.size()) {
    const std::string_view name =
        bytes.substr(names.rest, bytes.find('\0', names.rest) - names.rest);
    names.names.push_back(name);
    names.rest += name.size() + 1;
  }
}

BlockReader::Block& BlockReader::BlockOf(std::uint32_t number, std::uint64_t& first) {
  auto after = blocks_.upper_bound(number);
  if (after != blocks_.begin()) {
    auto& [known_first, block] = *std::prev(after);
    first = known_first;
    if (number - known_first < block.rows) return block;
  }
  if (blocks_.size() >= kMostBlocks || held_bytes_ >= kMostHeldBytes) {
    blocks_.clear();
    held_bytes_ = 0;
  }
  Statement names(db_,
                  "SELECT first, folders, names FROM names WHERE first <= ? "
                  "ORDER BY first DESC LIMIT 1");
  if (!names.Bind(1, number).Step()) throw std::runtime_error("a result row is missing");
  CheckResultFile(names.Integer(0) >= 0);
  Budget budget(file_bytes_);
  budget.Spend(names.Bytes(1));
  budget.Spend(names.Bytes(2));
  first = static_cast<std::uint64_t>(names.Integer(0));
  Block& block = blocks_[first];
  TakeApart(names.Bytes(1), names.Bytes(2), block.names);
  held_bytes_ += block.names.bytes.size();
  OpenAttributes(names.Integer(0));
  block.rows = attributes_->size() / sizeof(FileAttributes);
  CheckResultFile(block.rows <= RowBlock::kMostRows && block.names.folders.size() <= block.rows);
  return block;
}

void BlockReader::OpenAttributes(std::int64_t first) {
  if (attributes_ && attributes_of_ == first) return;
  if (attributes_) {
    attributes_->MoveTo(first);
  } else {
    attributes_.emplace(db_, "attributes", "data", first);
  }
  attributes_of_ = first;
}

const FileAttributes& BlockReader::AttributesIn(Block& block, std::uint64_t first, size_t index) {
  CheckResultFile(index < block.rows);
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

ResultRow BlockReader::Row(std::uint32_t number) {
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

}  // namespace nas
