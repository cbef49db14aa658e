#include "nas/search/index_filter.h"

#include <dirent.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <iterator>

#include "nas/match/required_texts.h"

namespace nas {

using EntryId = NameTable::EntryId;

namespace {

// Whether names that have its text match, as far as can be told from the table.
bool IsPlainText(const QueryNode& leaf) {
  return leaf.kind == QueryNode::Kind::kText && leaf.text->is_literal() && !leaf.text->exact() &&
         !leaf.text->has_wildcards() && !leaf.text->of_path();
}

// An expression that names must match, and that can be run over all of them.
std::shared_ptr<const RegexScan> ScanOf(const QueryNode& root) {
  for (const QueryNode& child : root.children) {
    if (child.kind != QueryNode::Kind::kText || !child.text->is_regex()) continue;
    if (child.text->exact()) continue;  // the texts do not have it
    if (auto scan = RegexScan::Make(child.text->text())) return scan;
  }
  return nullptr;
}

bool AsksName(const QueryNode& leaf) {
  if (leaf.kind == QueryNode::Kind::kType) {
    return std::ranges::any_of(leaf.types,
                               [](const FileType& type) { return type.category.has_value(); });
  }
  return leaf.kind == QueryNode::Kind::kText || leaf.kind == QueryNode::Kind::kExtension ||
         leaf.kind == QueryNode::Kind::kExclude;
}

bool IsOfRanges(const QueryNode& leaf) {
  return IsOfAttributes(leaf.kind) && leaf.kind != QueryNode::Kind::kEmpty &&
         leaf.kind != QueryNode::Kind::kExecutable;
}

// Where more than one name of so many has a needle, an expression is as well run over all.
constexpr EntryId kNamesForNeedle = 8;

}  // namespace

IndexFilter::IndexFilter(const IndexSnapshot& snapshot, const SharedSearch& search)
    : snapshot_(snapshot),
      search_(search),
      ranges_(snapshot),
      asks_attributes_(snapshot.attributes_current && search.criteria.ask_attributes) {
  const QueryNode& root = search.criteria.root;
  const auto is_regex = [](const QueryNode& leaf) { return leaf.text && leaf.text->is_regex(); };
  has_regex_ = AnyLeaf(root, is_regex);
  by_texts_ = !AnyLeaf(root, [&](const QueryNode& leaf) {
    return leaf.text &&
           (leaf.text->exact() || (is_regex(leaf) && !ForManyTexts(leaf.text->text())));
  });
  // Where contents stand in for names, names say nothing.
  const bool by_names = !search.content || !search.content->texts_too();
  const std::vector<std::string> texts =
      by_names ? RequiredTexts(root) : std::vector<std::string>();
  for (const std::string& text : texts) needles_.emplace_back(text);
  if (by_names && has_regex_) scan_ = ScanOf(root);
  decides_ = !needles_.empty() && root.children.size() == 1 && IsPlainText(root.children[0]);
  asks_names_ = AnyLeaf(root, AsksName);
  if (!finds()) {
    for (const QueryNode& child : root.children) {
      if (IsOfRanges(child)) ranges_.Add(child);
    }
    only_ranges_ = ranges_.size() == root.children.size();
  }
  if (asks_attributes_) ranges_.Prepare();
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

// The entries of [begin, end) whose texts have the needle `lead` bytes before the place where it is
// found; false once there are more than `most` of them in all.
bool FindTexts(const NameTable& table, const TextFinder& needle, size_t lead, EntryId begin,
               EntryId end, size_t most, std::vector<EntryId>* found) {
  const std::string_view texts = table.texts(begin, end);
  const std::uint64_t base = table.text_begin(begin);
  EntryId entry = begin;
  for (size_t at = 0; (at = needle.Find(texts, at)) != std::string_view::npos;) {
    if (found->size() == most) return false;
    entry = EntryFrom(table, entry, base + at + lead);
    found->push_back(entry);
    at = table.text_begin(entry + 1) - lead - base;
  }
  return true;
}

}  // namespace

bool IndexFilter::FindNeedles(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  const size_t most = scan_ ? (end - begin) / kNamesForNeedle : SIZE_MAX;
  for (const TextFinder& needle : needles_) {
    const auto middle = static_cast<std::ptrdiff_t>(found->size());
    if (!FindTexts(snapshot_.table, needle, 0, begin, end, most, found)) return false;
    std::inplace_merge(found->begin(), found->begin() + middle, found->end());
  }
  if (needles_.size() > 1) found->erase(std::unique(found->begin(), found->end()), found->end());
  return true;
}

void IndexFilter::FindBeginnings(const std::vector<std::string>& words, EntryId begin, EntryId end,
                                 std::vector<EntryId>* found) const {
  if (begin == end) return;
  const NameTable& table = snapshot_.table;
  found->clear();
  for (const std::string& word : words) {
    // Behind the end of the text before; the first one's is not among these.
    if (table.texts(begin, begin + 1).starts_with(word)) found->push_back(begin);
    const TextFinder needle('\0' + word);
    FindTexts(table, needle, 1, begin, end, SIZE_MAX, found);
  }
  std::ranges::sort(*found);
  found->erase(std::unique(found->begin(), found->end()), found->end());
}

// Where the search is given up every further name is to be asked by itself.
void IndexFilter::Scan(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  const NameTable& table = snapshot_.table;
  const std::string_view texts = table.texts(begin, end);
  const std::uint64_t base = table.text_begin(begin);
  EntryId entry = begin;
  for (size_t at = 0; at < texts.size(); at = table.text_begin(entry++ + 1) - base) {
    const auto place = scan_->Find(texts, at);
    if (!place) {
      for (entry = EntryFrom(table, entry, base + at); entry < end; ++entry) {
        found->push_back(entry);
      }
      return;
    }
    if (*place >= texts.size()) return;
    entry = EntryFrom(table, entry, base + *place);
    found->push_back(entry);
  }
}

void IndexFilter::FindOthers(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  const auto middle = static_cast<std::ptrdiff_t>(found->size());
  for (EntryId entry = begin; entry < end; ++entry) {
    if (!IsAscii(snapshot_.table.name(entry))) found->push_back(entry);
  }
  std::ranges::inplace_merge(*found, found->begin() + middle);
  found->erase(std::unique(found->begin(), found->end()), found->end());
}

void IndexFilter::Find(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  if (begin == end) return;
  found->clear();
  if (!needles_.empty() && FindNeedles(begin, end, found)) return;
  found->clear();
  Scan(begin, end, found);
  FindOthers(begin, end, found);
}

EntryFilter::EntryFilter(const IndexFilter& filter, const Location& location)
    : filter_(filter), table_(filter.snapshot_.table) {
  path_.SetBase(PathBaseOf(location));
}

bool EntryFilter::Enter(std::string_view path, bool by_attributes) {
  by_attributes_ = by_attributes && filter_.asks_attributes_;
  if (!filter_.search_.criteria.ask_paths) return true;
  path_.SetFolder(path);
  path_.SetEntry({}, false);
  QuerySubject subject;
  subject.folder = &path_;
  subject.is_file = true;  // for all that is known
  return filter_.search_.Ask(subject) != Answer::kNo;
}

void EntryFilter::Find(NameTable::FolderId begin, NameTable::FolderId end,
                       const std::function<std::string_view(NameTable::FolderId)>& path_of,
                       std::vector<EntryId>* found) {
  const EntryId last = table_.entries_begin(end);
  const bool hits = beginnings_ != nullptr || filter_.finds();
  const bool paths = filter_.search_.criteria.ask_paths;
  hits_.clear();
  if (beginnings_ != nullptr) {
    filter_.FindBeginnings(*beginnings_, table_.entries_begin(begin), last, &hits_);
  } else if (hits) {
    filter_.Find(table_.entries_begin(begin), last, &hits_);
  }
  auto hit = hits_.begin();
  const auto next = [&](EntryId from) {
    if (!hits) return from;
    while (hit != hits_.end() && *hit < from) ++hit;
    return hit == hits_.end() ? last : *hit;
  };
  Enter({});
  for (EntryId entry = next(table_.entries_begin(begin)); entry < last;) {
    EntryId behind = last;  // the folder, where it counts
    bool may_match = true;
    if (paths) {
      const NameTable::FolderId folder = table_.folder_of(entry);
      behind = table_.entries_end(folder);
      may_match = Enter(path_of(folder));
    }
    if (may_match && !hits) FindAmong(entry, behind, found);
    for (; may_match && hits && entry < behind; entry = next(entry + 1)) {
      if (MayMatch(entry)) found->push_back(entry);
    }
    if (!may_match || !hits) entry = next(behind);
  }
}

void EntryFilter::FindAmong(EntryId begin, EntryId end, std::vector<EntryId>* found) {
  const bool in_ranges = by_attributes_ && filter_.ranges_.size() > 0;
  if (!in_ranges) {
    for (EntryId entry = begin; entry < end; ++entry) {
      if (MayMatch(entry)) found->push_back(entry);
    }
    return;
  }
  filter_.ranges_.Find(begin, end, &in_ranges_);
  std::ranges::copy_if(in_ranges_, std::back_inserter(*found),
                       [this](EntryId entry) { return filter_.only_ranges_ || MayMatch(entry); });
}

bool EntryFilter::LearnAttributes(EntryId entry) {
  const auto known = table_.attributes(entry);
  if (!known) return false;
  attributes_ = {.size = static_cast<std::int64_t>(known->size),
                 .modified = known->mtime,
                 .created = known->crtime,
                 .opened_known = false,
                 .mode = known->mode,
                 .uid = known->uid,
                 .gid = known->gid};
  return true;
}

// Where letter case does not count, names are most often asked as the table's texts have them:
// these are the names' folded forms, which fold to themselves. Expressions can tell another name of
// the same text from it.
void EntryFilter::SetName(EntryId entry) {
  const std::string_view name = table_.name(entry);
  std::string_view text = table_.texts(entry, entry + 1);
  text.remove_suffix(1);
  const size_t mark = text.find('\1');
  const std::string_view folded = text.substr(0, mark);
  const bool usable = filter_.by_texts_ && (!filter_.has_regex_ || IsAscii(name));
  if (usable && mark == std::string_view::npos && IsAscii(text)) return name_.SetFolded(text);
  // What a broken name has is in no such form.
  if (!usable || IsAscii(folded) || !IsComposed(folded) || name.find('\1') != name.npos) {
    return name_.Set(name);
  }
  name_.SetFolded(folded, mark == std::string_view::npos ? folded : text.substr(mark + 1));
}

bool EntryFilter::MayMatch(EntryId entry) {
  if (filter_.decides_) return true;
  QuerySubject subject;
  const unsigned char type = table_.type(entry);
  subject.is_folder = type == DT_DIR;
  subject.is_file = type == DT_REG;
  subject.type = type;
  if (filter_.asks_names_) SetName(entry);
  subject.name = &name_;
  if (filter_.search_.criteria.ask_paths) {
    path_.SetEntry(table_.name(entry), subject.is_folder);
    subject.path = &path_;
  }
  if (filter_.search_.Ask(subject) == Answer::kNo) return false;
  if (!by_attributes_ || filter_.ranges_.Doubts(entry, type) || !LearnAttributes(entry))
    return true;
  subject.attributes = &attributes_;
  return filter_.search_.Ask(subject) != Answer::kNo;
}

}  // namespace nas
