#include "nas/search/index_names.h"

#include <algorithm>
#include <utility>

#include "nas/search/index_visit.h"

namespace nas {
namespace {

using FolderId = NameTable::FolderId;
using EntryId = NameTable::EntryId;

// What a thread takes at a time: texts that fit into its cache, and enough pieces for all threads.
constexpr EntryId kPieceEntries = 32 * 1024;

size_t PiecesOf(EntryId entries) { return std::max<size_t>(1, entries / kPieceEntries); }

FolderGate::Rules OnOneMount(FolderGate::Rules rules) {
  rules.crosses_mounts = false;
  return rules;
}

}  // namespace

bool IndexNames::Special::Holds(std::string_view name) const {
  return whole || (changed != nullptr && changed->names.contains(name)) ||
         std::ranges::find(mounts, name) != mounts.end();
}

FolderId IndexNames::FolderOf(const IndexSnapshot& snapshot, const Location& location) {
  const auto key = KeyOf(location.fd.get());
  return key ? snapshot.table.Find(*key) : NameTable::kNoFolder;
}

IndexNames::IndexNames(const IndexSnapshot& snapshot, const Place& place, SharedSearch& search)
    : snapshot_(snapshot),
      table_(snapshot.table),
      locations_(place.locations),
      top_(place.folder),
      end_(place.rules.recursive ? table_.subtree_end(top_) : top_ + 1),
      search_(search),
      gate_(OnOneMount(place.rules), search.criteria.pruning),
      filter_(snapshot, search),
      walk_(locations_, gate_, search),
      pieces_(PiecesOf(table_.entries_begin(end_) - table_.entries_begin(top_))) {
  FindSpecials();
  for (const std::string& mount : place.mounts) AddMount(mount);
  walk_.Hold();
}

void IndexNames::FindSpecials() {
  const auto& changed = snapshot_.changes.folders();
  auto next = changed.lower_bound(top_);
  for (FolderId id = top_; id < end_; ++id) {
    const bool is_changed = next != changed.end() && next->first == id;
    const bool unknown = table_.unreadable(id);
    if (!is_changed && !unknown) continue;
    specials_.push_back({id, unknown});
    Special& special = specials_.back();
    if (!is_changed) continue;
    special.changed = &next->second;
    special.whole |= next->second.whole;
    ++next;
  }
}

// One in a folder that the table does not have is met where that is walked.
void IndexNames::AddMount(std::string_view path) {
  FolderId folder = top_;
  for (size_t slash; (slash = path.find('/')) != std::string_view::npos;) {
    const EntryId entry = table_.FindEntry(folder, path.substr(0, slash));
    if (entry == table_.entries()) return;
    folder = table_.folder_at(entry);
    if (folder == NameTable::kNoFolder) return;
    path.remove_prefix(slash + 1);
  }
  if (path.empty() || folder >= end_) return;
  auto at = std::ranges::lower_bound(specials_, folder, {}, &Special::folder);
  if (at == specials_.end() || at->folder != folder) at = specials_.insert(at, Special{folder});
  at->mounts.emplace_back(path);
}

IndexNames::Piece IndexNames::PieceOf(size_t number) const {
  const auto begin = [&](size_t piece) {
    if (piece == 0) return top_;
    if (piece == pieces_) return end_;
    return table_.folder_of(table_.entries_begin(top_) +
                            static_cast<EntryId>(piece) * kPieceEntries);
  };
  return {begin(number), begin(number + 1)};
}

const IndexNames::Special* IndexNames::SpecialOf(FolderId folder) const {
  const auto at = std::ranges::lower_bound(specials_, folder, {}, &Special::folder);
  return at != specials_.end() && at->folder == folder ? &*at : nullptr;
}

bool IndexNames::Claim(FolderId folder) {
  const std::lock_guard lock(mutex_);
  return claimed_.insert(folder).second;
}

FolderPaths::FolderPaths(const NameTable& table, FolderId top, std::string_view path)
    : table_(table), levels_{{top, path.size()}}, path_(path) {}

std::string_view FolderPaths::Of(FolderId folder) {
  while (levels_.size() > 1) {
    const FolderId above = levels_.back().folder;
    if (above <= folder && folder < table_.subtree_end(above)) break;
    levels_.pop_back();
  }
  path_.resize(levels_.back().length);
  way_.clear();
  for (FolderId id = folder; id != levels_.back().folder; id = table_.parent(id)) {
    way_.push_back(id);
  }
  for (auto id = way_.rbegin(); id != way_.rend(); ++id) {
    path_.append(path_.empty() ? "" : "/").append(table_.folder_name(*id));
    levels_.push_back({*id, path_.size()});
  }
  return path_;
}

size_t IndexNames::NextCandidates(EntryFilter& filter, std::vector<EntryId>* found) {
  // A folder may fill several.
  Piece piece;
  do {
    const size_t number = next_++;
    if (number >= pieces_) return 0;
    piece = PieceOf(number);
  } while (table_.entries_begin(piece.begin) == table_.entries_begin(piece.end));
  FolderPaths paths(table_, top_, locations_.front().path);
  filter.Find(
      piece.begin, piece.end, [&paths](FolderId folder) { return paths.Of(folder); }, found);
  return table_.entries_begin(piece.end) - table_.entries_begin(piece.begin);
}

std::vector<IndexNames::NotedName> IndexNames::NotedNames() const {
  std::vector<NotedName> all;
  for (const Special& special : specials_) {
    if (special.whole || special.changed == nullptr) continue;
    for (const std::string& name : special.changed->names) all.push_back({special.folder, &name});
  }
  return all;
}

void IndexNames::Feed(size_t thread, Judge& judge) {
  {
    IndexVisit visit(*this, thread, judge);
    while (!search_.stopping()) {
      const size_t number = next_++;
      if (number >= pieces_) break;
      const Piece piece = PieceOf(number);
      visit.Visit(piece.begin, piece.end);
      if (++done_ == pieces_) walk_.Release();
    }
  }
  if (search_.stopping()) walk_.Abort();
  walk_.Feed(thread, judge);
}

}  // namespace nas
