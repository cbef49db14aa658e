#include "nas/search/judge.h"

#include <dirent.h>

#include <algorithm>
#include <cerrno>

namespace nas {
namespace {

// Files handed out at a time for reading their contents: few enough to spread over the threads.
constexpr size_t kCandidatesInRecord = 64;

}  // namespace

Criteria::Criteria(const std::vector<FileSearch::FindComp*>& comps) {
  for (const FileSearch::FindComp* comp : comps) {
    if (const auto* named = dynamic_cast<const PatternComp*>(comp);
        named != nullptr && pattern == nullptr) {
      pattern = named;
    } else if (comp->needs() == FileSearch::FindComp::Needs::kAttributes) {
      attribute.push_back({comp, comp->refusal()});
    } else {
      cheap.push_back({comp, comp->refusal()});
    }
  }
}

void SharedSearch::AskContents() {
  if (criteria.pattern != nullptr) content = ContentQuery::From(criteria.pattern->pattern());
}

void SharedSearch::SearchContents(const std::string& temporary_folder) {
  AskContents();
  if (content) candidates = std::make_unique<CandidateList>(temporary_folder);
}

void Judge::Enter(int fd, std::uint16_t location, std::string_view path) {
  folder_ = {fd, location, path, false};
}

Refusal Judge::Entry(const DirectoryReader::Entry& entry) {
  folded_.Set(entry.name);
  entry_.name = &folded_;
  entry_.is_dir = entry.type == DT_DIR;
  const Criteria& criteria = search_.criteria;
  const bool named = criteria.pattern == nullptr || criteria.pattern->match(entry_);
  const bool candidate = !named && search_.content && entry.type == DT_REG;
  if (!named && !candidate) return Refusal::kName;
  for (const Criteria::Criterion& criterion : criteria.cheap) {
    if (!criterion.comp->match(entry_)) return criterion.refusal;
  }
  FileAttributes attributes;
  if (named || !criteria.attribute.empty()) {
    const Result<FileAttributes> read = Look(entry.name.data());
    if (!read) return Refusal::kVanished;
    attributes = *read;
    entry_.attributes = &attributes;
    for (const Criteria::Criterion& criterion : criteria.attribute) {
      if (!criterion.comp->match(entry_)) return criterion.refusal;
    }
  }
  if (candidate) {
    candidates_.emplace_back(entry.inode, entry.name);
    return Refusal::kContentsUnread;
  }
  AddRow(entry.name, attributes);
  return Refusal::kNone;
}

Result<FileAttributes> Judge::Look(const char* name) {
  Result<FileAttributes> attributes = ReadAttributes(folder_.fd, name);
  if (!attributes) Skip(attributes.error().error_number);
  return attributes;
}

void Judge::Skip(int error_number) {
  error_number_ = error_number;
  search_.progress.AddUnreadableFile(error_number);
}

Refusal Judge::Contents(const char* name) {
  if (!scanner_) scanner_.emplace(*search_.content, search_.stop_flag);
  switch (scanner_->Scan(folder_.fd, name)) {
    case ContentScanner::Outcome::kMatch:
      break;
    case ContentScanner::Outcome::kNoMatch:
      return Refusal::kContents;
    case ContentScanner::Outcome::kBinary:
      search_.progress.AddNotText();
      return Refusal::kBinary;
    case ContentScanner::Outcome::kStopped:
      return Refusal::kStopped;
    case ContentScanner::Outcome::kFailed:
      Skip(errno);
      return Refusal::kFileUnreadable;
  }
  const Result<FileAttributes> attributes = Look(name);
  if (!attributes) return Refusal::kVanished;
  AddRow(name, *attributes);
  return Refusal::kNone;
}

// Files are read in the order of their inodes, which on a rotating disk is nearly that of their
// places.
void Judge::Leave() {
  if (candidates_.empty()) return;
  std::ranges::sort(candidates_);
  std::string names;
  size_t count = 0;
  for (const auto& [inode, name] : candidates_) {
    names.append(name).push_back('\0');
    if (++count % kCandidatesInRecord == 0 || count == candidates_.size()) {
      search_.candidates->Add(folder_.location, folder_.path, names);
      names.clear();
    }
  }
  candidates_.clear();
}

void Judge::AddRow(std::string_view name, const FileAttributes& attributes) {
  search_.progress.AddMatch();
  const std::lock_guard lock(rows_mutex_);
  if (!folder_.named_in_rows) {
    rows_.SetFolder(folder_.location, folder_.path);
    folder_.named_in_rows = true;
  }
  rows_.Add(name, attributes);
  if (rows_.full()) search_.sink.Append(rows_);
}

void Judge::Flush() {
  const std::lock_guard lock(rows_mutex_);
  search_.sink.Append(rows_);
}

}  // namespace nas
