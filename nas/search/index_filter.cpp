#include "nas/search/index_filter.h"

#include <dirent.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <iterator>

#include "nas/match/required_texts.h"
#include "nas/match/word_finder.h"
#include "nas/search/spans.h"

namespace nas {

using EntryId = NameTable::EntryId;

namespace {

// Whether names that have its text match, as far as can be told from the table.
bool IsPlainText(const QueryNode& leaf) {
  return leaf.kind == QueryNode::Kind::kText && leaf.text->is_literal() && !leaf.text->exact() &&
         !leaf.text->has_wildcards() && !leaf.text->of_path();
}

// The criterion that names must meet and that can be run over all of them; null without one. The
// texts say nothing of letter case.
const TextTerm* ScannableTerm(const QueryNode& root) {
  for (const QueryNode& child : root.children) {
    if (child.kind != QueryNode::Kind::kText || child.text->exact()) continue;
    if (child.text->is_regex() && ForManyTexts(child.text->text())) return child.text.get();
    if (!child.text->ScanExpression().empty()) return child.text.get();
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
  if (by_names) PrepareScan(root);
  decides_ = root.children.size() == 1 &&
             (scan_ != nullptr || (!needles_.empty() && IsPlainText(root.children[0])));
  asks_names_ = AnyLeaf(root, AsksName);
  if (!finds()) {
    for (const QueryNode& child : root.children) {
      if (IsOfRanges(child)) ranges_.Add(child);
    }
    only_ranges_ = ranges_.size() == root.children.size();
  }
  if (asks_attributes_) ranges_.Prepare();
}

void IndexFilter::PrepareScan(const QueryNode& root) {
  const TextTerm* term = ScannableTerm(root);
  if (term == nullptr) return;
  if (!term->is_regex()) {
    scan_ = RegexScan::OfWildcards(term->ScanExpression());
    roughly_ = true;
    return;
  }
  scan_ = RegexScan::Make(term->text(), RegexScan::Texts::kBytes);
  others_scan_ = RegexScan::Make(term->text(), RegexScan::Texts::kUtf8);
  if (!others_scan_) scan_ = nullptr;
}

namespace {

EntryId EntryFrom(const NameTable& table, EntryId from, std::uint64_t offset) {
  const auto begin_of = [&table](EntryId entry) { return table.text_begin(entry); };
  return SpanFrom(begin_of, from, table.entries(), offset);
}

// Takes those of the texts [begin, end), which lie end to end, in which the expression finds
// something. Where the search is given up, false, and all that follow are taken.
template <class BeginOf, class Take>
bool ScanTexts(const RegexScan& scan, std::string_view texts, EntryId begin, EntryId end,
               const BeginOf& begin_of, const Take& take) {
  const std::uint64_t base = begin_of(begin);
  EntryId text = begin;
  for (size_t at = 0; at < texts.size(); at = begin_of(text + 1) - base, ++text) {
    const auto place = scan.Find(texts, at);
    if (!place) {
      for (text = SpanFrom(begin_of, text, end, base + at); text < end; ++text) take(text);
      return false;
    }
    if (*place >= texts.size()) break;
    text = SpanFrom(begin_of, text, end, base + *place);
    take(text);
  }
  return true;
}

// So many are asked at a time, which stay in the processor's own memory until they are.
constexpr size_t kOtherBytes = size_t{16} << 10;

// Names that are not ASCII, one after the other, as those of a table are.
struct OtherNames {
  std::string texts = {};
  std::vector<size_t> begins = {};
  std::vector<EntryId> entries = {};
  // False where it is not UTF-8, and is left out.
  bool Add(EntryId entry, std::string_view name) {
    const size_t begin = texts.size();
    if (!AppendComposed(name, &texts)) return false;
    texts.push_back('\0');
    begins.push_back(begin);
    entries.push_back(entry);
    return true;
  }
  void Clear() {
    texts.clear();
    begins.clear();
    entries.clear();
  }
  // Of all texts, and where the last ends.
  size_t begin(size_t number) const {
    return number < begins.size() ? begins[number] : texts.size();
  }
};

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

bool IndexFilter::FindBeginnings(const std::vector<std::string>& words, EntryId begin, EntryId end,
                                 std::vector<EntryId>* found) const {
  found->clear();
  if (begin == end) return true;
  const NameTable& table = snapshot_.table;
  for (const std::string& word : words) {
    // Behind the end of the text before; the first one's is not among these.
    if (table.texts(begin, begin + 1).starts_with(word)) found->push_back(begin);
    const TextFinder needle('\0' + word);
    FindTexts(table, needle, 1, begin, end, SIZE_MAX, found);
  }
  std::ranges::sort(*found);
  found->erase(std::unique(found->begin(), found->end()), found->end());
  return decides_ && !scan_;
}

bool IndexFilter::FindWords(const std::vector<std::string>& words, EntryId begin, EntryId end,
                            std::vector<EntryId>* found) const {
  found->clear();
  if (begin == end) return true;
  const NameTable& table = snapshot_.table;
  const std::string_view texts = table.texts(begin, end);
  const std::uint64_t base = table.text_begin(begin);
  for (const std::string& word : words) {
    const WordFinder needle(word);
    EntryId entry = begin;
    for (size_t at = 0; (at = needle.Find(texts, at)) != std::string_view::npos;) {
      entry = EntryFrom(table, entry, base + at);
      found->push_back(entry);
      at = table.text_begin(entry + 1) - base;
    }
  }
  std::ranges::sort(*found);
  found->erase(std::unique(found->begin(), found->end()), found->end());
  return decides_ && !scan_;
}

bool IndexFilter::Scan(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  const NameTable& table = snapshot_.table;
  return ScanTexts(
      *scan_, table.texts(begin, end), begin, end,
      [&table](EntryId entry) { return table.text_begin(entry); },
      [found](EntryId entry) { found->push_back(entry); });
}

bool IndexFilter::HasNeedle(std::string_view text) const {
  const auto has = [text](const TextFinder& needle) {
    return needle.Find(text, 0) != std::string_view::npos;
  };
  return needles_.empty() || std::ranges::any_of(needles_, has);
}

bool IndexFilter::ScanOthers(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  const NameTable& table = snapshot_.table;
  std::erase_if(*found, [&table](EntryId entry) { return !table.is_ascii(entry); });
  const auto middle = static_cast<std::ptrdiff_t>(found->size());
  OtherNames others;
  std::vector<EntryId> broken;
  bool told = true;
  const auto scan = [&] {
    told &= ScanTexts(
        *others_scan_, others.texts, 0, static_cast<EntryId>(others.entries.size()),
        [&others](EntryId number) { return others.begin(number); },
        [&](EntryId number) { found->push_back(others.entries[number]); });
    others.Clear();
  };
  table.EachOther(begin, end, [&](EntryId entry) {
    if (!HasNeedle(table.texts(entry, entry + 1))) return;
    if (!others.Add(entry, table.name(entry))) broken.push_back(entry);
    if (others.texts.size() >= kOtherBytes) scan();
  });
  scan();
  const auto behind = static_cast<std::ptrdiff_t>(found->size());
  found->insert(found->end(), broken.begin(), broken.end());
  std::inplace_merge(found->begin() + middle, found->begin() + behind, found->end());
  std::inplace_merge(found->begin(), found->begin() + middle, found->end());
  return told;
}

bool IndexFilter::Find(EntryId begin, EntryId end, std::vector<EntryId>* found) const {
  found->clear();
  if (begin == end) return true;
  if (!needles_.empty() && !needles_fail_.load(std::memory_order_relaxed)) {
    if (FindNeedles(begin, end, found)) return decides_ && !scan_;
    // Other names are much like these.
    needles_fail_.store(true, std::memory_order_relaxed);
    found->clear();
  }
  const bool told = Scan(begin, end, found);
  const bool others_told = !others_scan_ || ScanOthers(begin, end, found);
  return decides_ && told && others_told;
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
  const bool hits = only_ != Only::kAny || filter_.finds();
  const bool paths = filter_.search_.criteria.ask_paths;
  bool decided = false;
  hits_.clear();
  const EntryId first = table_.entries_begin(begin);
  if (only_ == Only::kBeginnings) {
    decided = filter_.FindBeginnings(*words_, first, last, &hits_);
  } else if (only_ == Only::kWords) {
    decided = filter_.FindWords(*words_, first, last, &hits_);
  } else if (hits) {
    decided = filter_.Find(first, last, &hits_);
  }
  auto hit = hits_.begin();
  const auto next = [&](EntryId from) {
    if (!hits) return from;
    while (hit != hits_.end() && *hit < from) ++hit;
    return hit == hits_.end() ? last : *hit;
  };
  Enter({});
  for (EntryId entry = next(first); entry < last;) {
    EntryId behind = last;  // the folder, where it counts
    bool may_match = true;
    if (paths) {
      const NameTable::FolderId folder = table_.folder_of(entry);
      behind = table_.entries_end(folder);
      may_match = Enter(path_of(folder));
    }
    if (may_match && !hits) FindAmong(entry, behind, found);
    for (; may_match && hits && entry < behind; entry = next(entry + 1)) {
      if (Passes(entry, decided)) found->push_back(entry);
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
                 .modified_known = filter_.ranges_.KnowsTimeOfChange(entry),
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
  std::string_view text = table_.texts(entry, entry + 1);
  text.remove_suffix(1);
  if (filter_.by_texts_ && table_.is_ascii(entry)) return name_.SetFolded(text);
  const bool by_text = filter_.by_texts_ && !filter_.has_regex_;
  const bool ascii = IsAscii(text);
  const size_t mark = text.find('\1');
  if (by_text && ascii && mark == std::string_view::npos) return name_.SetFolded(text);
  const std::string_view name = table_.name(entry);
  const std::string_view folded = text.substr(0, mark);
  // What a broken name has is in no such form.
  if (!by_text || IsAscii(folded) || !IsComposed(folded) || name.find('\1') != name.npos) {
    return name_.Set(name);
  }
  name_.SetFolded(folded, mark == std::string_view::npos ? folded : text.substr(mark + 1));
}

bool EntryFilter::Passes(EntryId entry, bool told) {
  const bool sure = told && (!filter_.roughly_ || table_.is_ascii(entry));
  return sure || MayMatch(entry);
}

bool EntryFilter::MayMatch(EntryId entry) {
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
