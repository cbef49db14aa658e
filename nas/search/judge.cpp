#include "nas/search/judge.h"

#include <dirent.h>
#include <fcntl.h>

#include <algorithm>
#include <cerrno>

#include "nas/results/row_query.h"

namespace nas {
namespace {

// Files handed out at a time for reading their contents: few enough to spread over the threads.
constexpr size_t kCandidatesInRecord = 64;

}  // namespace

void SharedSearch::AskContents(bool texts_too) {
  content = ContentQuery::From(criteria.root, texts_too);
}

void SharedSearch::SearchContents(const std::string& temporary_folder, bool texts_too) {
  AskContents(texts_too);
  if (content) candidates = std::make_unique<CandidateList>(temporary_folder);
  candidate_sink = candidates.get();
}

namespace {

std::string ToldKey(std::uint16_t location, std::string_view folder, std::string_view name) {
  std::string key(reinterpret_cast<const char*>(&location), sizeof(location));
  return key.append(folder).append("/").append(name);
}

}  // namespace

void ToldEntries::Add(std::uint16_t location, std::string_view folder, std::string_view names) {
  const std::lock_guard lock(mutex_);
  for (size_t end; !names.empty(); names.remove_prefix(end + 1)) {
    end = std::min(names.find('\0'), names.size() - 1);
    told_.insert(ToldKey(location, folder, names.substr(0, end)));
  }
  any_ = true;
}

bool ToldEntries::Has(std::uint16_t location, std::string_view folder,
                      std::string_view name) const {
  if (!any_.load(std::memory_order_relaxed)) return false;
  const std::lock_guard lock(mutex_);
  return told_.contains(ToldKey(location, folder, name));
}

Answer SharedSearch::Ask(const QuerySubject& subject) const {
  if (!content) return nas::Ask(criteria.root, subject);
  const Answer named = nas::Ask(content->root(), subject);
  if (named == Answer::kYes || !content->texts_too()) return named;
  QuerySubject inside = subject;
  inside.texts_in_contents = true;
  return std::max(named, nas::Ask(content->root(), inside));
}

EntryPath::Base PathBaseOf(const Location& location) {
  const std::string below = location.path.empty() ? "" : "/" + location.path;
  return {"/" + location.share.name + below, location.share.root + below, location.path};
}

void Judge::Enter(int fd, std::uint16_t number, const Location& location, std::string_view path,
                  const IgnoreFiles* ignores) {
  folder_ = {fd, number, path, ignores, false};
  if (!search_.criteria.ask_paths) return;
  if (path_base_ != number) {
    path_.SetBase(PathBaseOf(location));
    path_base_ = number;
  }
  path_.SetFolder(path);
}

bool Judge::IsIgnored(std::string_view name, unsigned char type) const {
  return folder_.ignores != nullptr &&
         folder_.ignores->LeaveOut(folder_.path, name, type == DT_DIR);
}

void Judge::Meet(std::string_view name, unsigned char type) {
  folded_.Set(name);
  subject_ = {};
  subject_.name = &folded_;
  subject_.is_folder = type == DT_DIR;
  subject_.is_file = type == DT_REG;
  subject_.type = type;
  subject_.whole_way = search_.misses != nullptr;
  if (!search_.criteria.ask_paths) return;
  path_.SetEntry(name, subject_.is_folder);
  subject_.path = &path_;
}

Refusal Judge::Refuse(const char* name) {
  if (search_.misses != nullptr) {
    const bool known = subject_.attributes != nullptr || !search_.criteria.ask_attributes;
    if (known || Look(name)) search_.misses->See(subject_);
  }
  return explain_ ? WhyNot(search_.criteria.root, subject_) : Refusal::kName;
}

Refusal Judge::Entry(const DirectoryReader::Entry& entry) {
  if (IsIgnored(entry.name, entry.type)) return Refusal::kIgnored;
  Meet(entry.name, entry.type);
  Answer answer = Ask();
  if (answer == Answer::kNo) return Refuse(entry.name.data());
  FileAttributes attributes;
  if (answer == Answer::kYes && search_.names_alone && entry.type != DT_UNKNOWN) {
    attributes.mode = DTTOIF(entry.type);
  } else if (answer == Answer::kYes || search_.criteria.ask_attributes) {
    const Result<FileAttributes> read = Look(entry.name.data());
    if (!read) return Refusal::kVanished;
    attributes = *read;
    if (answer != Answer::kYes) answer = Ask();
    if (answer == Answer::kNo) return Refuse(entry.name.data());
  }
  return Decide(answer, entry, attributes);
}

Refusal Judge::Decide(Answer answer, const DirectoryReader::Entry& entry,
                      const FileAttributes& attributes) {
  if (search_.told.Has(folder_.location, folder_.path, entry.name)) return Refusal::kNone;
  if (answer == Answer::kMaybe) {
    candidates_.emplace_back(entry.inode, entry.name);
    return Refusal::kContentsUnread;
  }
  AddRow(entry.name, attributes);
  return Refusal::kNone;
}

Refusal Judge::KnownEntry(const DirectoryReader::Entry& entry, bool tell_forbidden) {
  Meet(entry.name, entry.type);
  const bool known = entry.type != DT_UNKNOWN;
  if (known && Ask() == Answer::kNo) return Refusal::kName;
  const Result<FileAttributes> attributes = ReadAttributes(folder_.fd, entry.name.data());
  if (!attributes) {
    const int error_number = attributes.error().error_number;
    const bool gone = error_number == ENOENT || error_number == ENOTDIR;
    const bool forbidden = error_number == EACCES && !tell_forbidden;
    if (!gone && !forbidden && Ask() != Answer::kNo) Skip(error_number);
    return Refusal::kVanished;
  }
  const auto type = static_cast<unsigned char>(IFTODT(attributes->mode));
  if (type != entry.type) Meet(entry.name, type);
  if (IsIgnored(entry.name, type)) return Refusal::kIgnored;
  Learn(*attributes, entry.name.data());
  const Answer answer = Ask();
  if (answer == Answer::kNo) return Refuse(entry.name.data());
  return Decide(answer, entry, *attributes);
}

// One that cannot be read is not known to be empty.
bool Judge::IsEmptyFolder(const char* name) {
  constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK;
  const UniqueFd folder(openat(folder_.fd, name, kFlags));
  if (!folder) return false;
  if (!emptiness_) emptiness_.emplace();
  DirectoryReader::Entry entry;
  emptiness_->Start(folder.get());
  return !emptiness_->Next(entry) && emptiness_->failed() == 0;
}

Result<FileAttributes> Judge::Look(const char* name) {
  Result<FileAttributes> attributes = ReadAttributes(folder_.fd, name);
  if (!attributes) {
    Skip(attributes.error().error_number);
    return attributes;
  }
  Learn(*attributes, name);
  return attributes;
}

void Judge::Learn(const FileAttributes& attributes, const char* name) {
  attributes_ = AttributesOf(attributes);
  subject_.attributes = &attributes_;
  is_empty_folder_ = [this, name] { return IsEmptyFolder(name); };
  subject_.is_empty_folder = &is_empty_folder_;
}

void Judge::Skip(int error_number) {
  error_number_ = error_number;
  search_.progress.AddUnreadableFile(error_number);
}

Refusal Judge::Contents(const char* name) {
  if (!scanner_) {
    scanner_.emplace(*search_.content, search_.stop_flag);
    scanner_->CountInto(&search_.progress.content_bytes());
  }
  search_.progress.BeginContents(folder_.path, name);
  Meet(name, DT_REG);
  if (search_.criteria.ask_attributes && !Look(name)) return Refusal::kVanished;
  const auto decide = [this](const std::vector<bool>& found, bool all_read) {
    subject_.found = &found;
    subject_.all_read = all_read;
    return Ask();
  };
  const ContentScanner::Outcome outcome = scanner_->Scan(folder_.fd, name, decide);
  subject_.found = nullptr;
  switch (outcome) {
    case ContentScanner::Outcome::kMatch:
      break;
    case ContentScanner::Outcome::kNoMatch:
      return search_.content->texts_too() ? Refusal::kContents : Refusal::kContentsAsked;
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
  search_.progress.AddCandidates(candidates_.size());
  std::string names;
  size_t count = 0;
  for (const auto& [inode, name] : candidates_) {
    names.append(name).push_back('\0');
    if (++count % kCandidatesInRecord == 0 || count == candidates_.size()) {
      search_.candidate_sink->Add(folder_.location, folder_.path, names);
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
