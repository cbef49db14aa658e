#include "nas/search/index_filter.h"

#include <dirent.h>

#include <algorithm>

#include "nas/match/required_texts.h"

namespace nas {

using EntryId = NameTable::EntryId;

namespace {

// Whether names that have its text match, as far as can be told from the table.
bool IsPlainText(const QueryNode& leaf) {
  return leaf.kind == QueryNode::Kind::kText && leaf.text->is_literal() && !leaf.text->exact() &&
         !leaf.text->has_wildcards() && !leaf.text->of_path();
}

}  // namespace

IndexFilter::IndexFilter(const IndexSnapshot& snapshot, const SharedSearch& search)
    : snapshot_(snapshot),
      search_(search),
      asks_attributes_(snapshot.attributes_current && search.criteria.ask_attributes) {
  const QueryNode& root = search.criteria.root;
  by_texts_ = !AnyLeaf(root, [](const QueryNode& leaf) {
    return leaf.text != nullptr && (leaf.text->exact() || leaf.text->is_regex());
  });
  // Where contents stand in for names, names say nothing.
  if (search.content && search.content->texts_too()) return;
  for (const std::string& text : RequiredTexts(root)) needles_.emplace_back(text);
  decides_ = !needles_.empty() && root.children.size() == 1 && IsPlainText(root.children[0]);
}

namespace {

// The entry whose text holds the byte at `offset`, which is that of `from` or of a later one, and
// most often of one that is near.
EntryId EntryFrom(const NameTable& table, EntryId from, std::uint64_t offset) {
  EntryId step = 1;
  while (from + step < table.entries() && table.text_begin(from + step) <= offset) {
    from += step;
    step *= 2;
  }
  for (; step > 0; step /= 2) {
    if (from + step < table.entries() && table.text_begin(from + step) <= offset) from += step;
  }
  return from;
}

}  // namespace

void IndexFilter::Find(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  const NameTable& table = snapshot_.table;
  const std::string_view texts = table.texts(begin, end);
  const std::uint64_t base = table.text_begin(begin);
  for (const TextFinder& needle : needles_) {
    EntryId entry = begin;
    for (size_t at = 0; (at = needle.Find(texts, at)) != std::string_view::npos;) {
      entry = EntryFrom(table, entry, base + at);
      found->push_back(entry);
      at = table.text_begin(entry + 1) - base;
    }
  }
  if (needles_.size() == 1) return;
  std::ranges::sort(*found);
  found->erase(std::ranges::unique(*found).begin(), found->end());
}

EntryFilter::EntryFilter(const IndexFilter& filter, const Location& location)
    : filter_(filter), table_(filter.snapshot_.table) {
  path_.SetBase(PathBaseOf(location));
}

void EntryFilter::Enter(std::string_view path, bool by_attributes) {
  by_attributes_ = by_attributes && filter_.asks_attributes_;
  if (filter_.search_.criteria.ask_paths) path_.SetFolder(path);
}

void EntryFilter::Find(NameTable::FolderId begin, NameTable::FolderId end,
                       const std::function<std::string(NameTable::FolderId)>& path_of,
                       std::vector<EntryId>* found) {
  const EntryId first = table_.entries_begin(begin);
  const EntryId last = table_.entries_begin(end);
  const bool hits = filter_.finds();
  const bool paths = filter_.search_.criteria.ask_paths;
  hits_.clear();
  if (hits) filter_.Find(first, last, &hits_);
  Enter({});
  EntryId behind = first;  // the folder whose path is known
  std::string path;
  const size_t count = hits ? hits_.size() : last - first;
  for (size_t i = 0; i < count; ++i) {
    const EntryId entry = hits ? hits_[i] : first + static_cast<EntryId>(i);
    if (paths && entry >= behind) {
      const NameTable::FolderId folder = table_.folder_of(entry);
      behind = table_.entries_end(folder);
      path = path_of(folder);
      Enter(path);
    }
    if (MayMatch(entry)) found->push_back(entry);
  }
}

// A folder's own attributes change with what is in it.
bool EntryFilter::LearnAttributes(EntryId entry, unsigned char type) {
  const Changes& changes = filter_.snapshot_.changes;
  if (changes.inodes().contains(table_.inode(entry))) return false;
  if (type == DT_DIR) {
    const NameTable::FolderId folder = table_.folder_at(entry);
    if (folder == NameTable::kNoFolder || changes.folders().contains(folder)) return false;
  }
  const auto known = table_.attributes(entry);
  if (!known) return false;
  attributes_ = {.size = static_cast<std::int64_t>(known->size),
                 .modified = known->mtime,
                 .created = known->crtime,
                 .opened_known = false,
                 .uid = known->uid,
                 .gid = known->gid};
  return true;
}

// Names that are ASCII are most often asked as the table's texts have them: where letter case does
// not count that is the same, and they need not be folded.
void EntryFilter::SetName(EntryId entry) {
  if (filter_.by_texts_) {
    std::string_view text = table_.texts(entry, entry + 1);
    text.remove_suffix(1);
    if (IsAscii(text) && text.find('\1') == std::string_view::npos) return name_.SetFolded(text);
  }
  name_.Set(table_.name(entry));
}

bool EntryFilter::MayMatch(EntryId entry) {
  if (filter_.decides_) return true;
  const unsigned char type = table_.type(entry);
  SetName(entry);
  QuerySubject subject;
  subject.name = &name_;
  subject.is_folder = type == DT_DIR;
  subject.is_file = type == DT_REG;
  if (filter_.search_.criteria.ask_paths) {
    path_.SetEntry(table_.name(entry), subject.is_folder);
    subject.path = &path_;
  }
  if (filter_.search_.Ask(subject) == Answer::kNo) return false;
  if (!by_attributes_ || !LearnAttributes(entry, type)) return true;
  subject.attributes = &attributes_;
  return filter_.search_.Ask(subject) != Answer::kNo;
}

}  // namespace nas
