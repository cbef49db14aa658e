#include "nas/results/result_reader.h"

#include "nas/results/row_query.h"

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <stdexcept>

namespace nas {
namespace {

Database OpenResultFile(const std::string& path) {
  Database db(path, SQLITE_OPEN_READWRITE | SQLITE_OPEN_EXRESCODE, kResultBusyMilliseconds);
  db.BoundValues(ResultFileBytes(path));
  db.Execute("PRAGMA synchronous=OFF; PRAGMA cache_size=-16384");
  Statement version(db, "PRAGMA user_version");
  if (!version.Step() || version.Integer(0) != kResultVersion) {
    throw std::runtime_error(path + ": not a result file of this version");
  }
  return db;
}

}  // namespace

ResultReader::ResultReader(const std::string& path) : path_(path), db_(OpenResultFile(path)) {}

ResultReader::~ResultReader() = default;

void ResultReader::Begin() {
  blocks_.Close();
  transaction_.emplace(db_, Transaction::Kind::kRead);
  blocks_.Open();
  ReadPurged();
}

void ResultReader::End() {
  blocks_.Close();
  transaction_->Commit();
  transaction_.reset();
}

void ResultReader::ReadPurged() {
  purged_ = purged_here_;
  std::int64_t next = 0;
  Statement purged(db_, "SELECT row FROM purged ORDER BY row");
  while (purged.Step()) {
    const std::int64_t row = purged.Integer(0);
    CheckResultFile(row >= next && static_cast<std::uint64_t>(row) < rows());
    next = row + 1;
    purged_.insert(static_cast<std::uint32_t>(row));
  }
}

ResultReader::Page ResultReader::Select(const Selection& selection, std::uint64_t offset,
                                        std::uint64_t limit) {
  Page page;
  const std::uint64_t rows = blocks_.rows();
  const bool reversed = !selection.ascending && selection.column != SortColumn::kFound;
  if (purged_.empty() && !selection.filters()) {
    // All rows: only the page itself need be known of their order.
    page.total = rows;
    const std::uint64_t begin = std::min(offset, rows);
    const std::uint64_t count = std::min(limit, rows - begin);
    const std::uint64_t first = reversed ? rows - begin - count : begin;
    if (!sorter_.ReadKept(selection.column, first, count, page.numbers)) {
      const Ordering all = sorter_.OrderingOf(selection.column);
      const auto from = all.begin() + static_cast<std::ptrdiff_t>(first);
      page.numbers.assign(from, from + static_cast<std::ptrdiff_t>(count));
    }
    if (reversed) std::ranges::reverse(page.numbers);
    return page;
  }
  Ordering passing = sorter_.OrderingOf(selection.column);
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
  const std::uint64_t rows = blocks_.rows();
  std::vector<bool> passes(rows, true);
  for (const std::uint32_t row : purged_) {
    if (row < rows) passes[row] = false;
  }
  if (selection.directories) {
    blocks_.ForEachAttributes([&](std::uint32_t row, const FileAttributes& attributes) {
      if (S_ISDIR(attributes.mode) != *selection.directories) passes[row] = false;
    });
  }
  if (selection.pattern) FilterByQuery(*selection.pattern, passes);
  return passes;
}

void ResultReader::FilterByQuery(const Query& query, std::vector<bool>& passes) {
  FoldedName folded;
  QuerySubject subject;
  subject.name = &folded;
  const auto more_than_name = [](const QueryNode& leaf) {
    const bool of_name = leaf.kind == QueryNode::Kind::kText && !leaf.text->of_path();
    return !of_name && leaf.kind != QueryNode::Kind::kExtension;
  };
  if (!AnyLeaf(query.root(), more_than_name)) {
    blocks_.ForEachNames([&](std::uint64_t first, const BlockReader::Names& block) {
      for (size_t i = 0; i < block.names.size(); ++i) {
        folded.Set(block.names[i]);
        if (passes[first + i] && Ask(query.root(), subject) != Answer::kYes)
          passes[first + i] = false;
      }
    });
    return;
  }
  EntryPath path;
  QueryAttributes attributes;
  subject.path = &path;
  subject.attributes = &attributes;
  for (std::uint32_t i = 0; i < passes.size(); ++i) {
    if (!passes[i]) continue;
    const ResultRow row = blocks_.Row(i);
    folded.Set(row.name);
    subject.is_folder = S_ISDIR(row.attributes->mode);
    subject.is_file = S_ISREG(row.attributes->mode);
    subject.type = static_cast<unsigned char>(IFTODT(row.attributes->mode));
    path.SetBase({"/" + std::string(row.share_name), std::string(row.share_root), ""});
    path.SetFolder(row.folder);
    path.SetEntry(row.name, subject.is_folder);
    attributes = AttributesOf(*row.attributes);
    passes[i] = Ask(query.root(), subject) == Answer::kYes;
  }
}

void ResultReader::KeepAllOrderings() {
  for (const auto& known : kSortColumns) {
    Begin();
    if (!sorter_.WorthKeeping() || access(path_.c_str(), F_OK) != 0) return;
    sorter_.OrderingOf(known.column);
    End();
  }
  db_.EmptyLog();
}

void ResultReader::Purge(const std::vector<std::uint32_t>& numbers) {
  purged_here_.insert(numbers.begin(), numbers.end());
  Transaction transaction(db_, Transaction::Kind::kWrite);
  Statement insert(db_, "INSERT OR IGNORE INTO purged VALUES(?)");
  for (const std::uint32_t number : numbers) insert.Bind(1, number).Run();
  transaction.Commit();
}

}  // namespace nas
