#include "arbory/row_reader.h"

#include <algorithm>
#include <limits>

namespace arbory {
namespace {

// Few enough to be printed while the search goes on.
constexpr std::uint64_t kMostRows = 4096;
constexpr size_t kMostBytes = 1 << 20;

std::uint64_t EndOf(const SearchOptions& options) {
  constexpr std::uint64_t kMost = std::numeric_limits<std::uint64_t>::max();
  if (options.limit == 0 || options.limit > kMost - options.offset) return kMost;
  return options.offset + options.limit;
}

}  // namespace

RowReader::RowReader(const std::string& path, const SearchOptions& options, const RowFormat& format)
    : options_(options),
      reader_(path),
      counts_only_(format.kind == RowFormat::Kind::kNone),
      writer_(format),
      at_(options.offset),
      end_(EndOf(options)) {
  if (!options.sort_by.empty()) Sort();
}

void RowReader::Sort() {
  nas::Selection selection;
  selection.column = nas::ParseSortColumn(options_.sort_by).value_or(nas::SortColumn::kFound);
  selection.ascending = !options_.descending;
  reader_.Begin();
  sorted_ = reader_.Select(selection, 0, reader_.rows()).numbers;
  reader_.End();
}

RowReader::Rows RowReader::Next() {
  Rows rows;
  reader_.Begin();
  if (!options_.fleet.empty()) {
    const nas::ForeignAccounts accounts = reader_.Accounts();
    for (const auto& [id, name] : accounts.names()) writer_.NameAccount(id, name);
  }
  const bool sorted = !options_.sort_by.empty();
  const std::uint64_t there = std::min(end_, sorted ? sorted_.size() : reader_.rows());
  const std::uint64_t stop = at_ < there ? at_ + std::min(kMostRows, there - at_) : at_;
  if (counts_only_) {
    rows.count = stop - at_;
    at_ = stop;
  }
  for (; at_ < stop && rows.text.size() < kMostBytes; ++at_) {
    writer_.Append(reader_.Row(sorted ? sorted_[at_] : static_cast<std::uint32_t>(at_)),
                   &rows.text);
    ++rows.count;
  }
  rows.caught_up = at_ >= there;
  reader_.End();
  return rows;
}

}  // namespace arbory
