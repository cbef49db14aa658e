#include "nas/search/index_visit.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <utility>

#include "nas/files/attributes.h"

namespace nas {
namespace {

constexpr unsigned kRead = 4;
constexpr unsigned kEnter = 1;

bool IsGone(int error_number) { return error_number == ENOENT || error_number == ENOTDIR; }
bool IsForbidden(int error_number) { return error_number == EACCES || error_number == EPERM; }

// To look up one name takes as long as to read so many.
constexpr size_t kNamesForLook = 8;
// And reading a folder at all as long as so many looks.
constexpr size_t kLooksForReading = 4;

}  // namespace

OwnRights::OwnRights() : all_(geteuid() == 0), user_(geteuid()) {
  if (all_) return;
  const int count = getgroups(0, nullptr);
  groups_.resize(static_cast<size_t>(std::max(count, 0)));
  if (getgroups(count, groups_.data()) != count) groups_.clear();
  groups_.push_back(getegid());
}

bool OwnRights::Have(const NameTable::Attributes& file, unsigned bits) const {
  constexpr int kBits = 3;  // of each class
  if (all_) return true;
  unsigned mode = file.mode;
  if (file.uid == user_) {
    mode >>= 2 * kBits;
  } else if (std::ranges::find(groups_, file.gid) != groups_.end()) {
    mode >>= kBits;
  }
  return (mode & bits) == bits;
}

IndexVisit::IndexVisit(IndexNames& names, size_t thread, Judge& judge)
    : names_(names),
      table_(names.table_),
      search_(names.search_),
      thread_(thread),
      judge_(judge),
      filter_(names.filter_, names.locations_.front()),
      paths_(names.table_, names.top_, names.locations_.front().path) {}

void IndexVisit::Visit(FolderId begin, FolderId end) {
  hits_.clear();
  next_hit_ = 0;
  hits_told_ = false;
  if (names_.filter_.finds()) {
    hits_told_ =
        names_.filter_.Find(table_.entries_begin(begin), table_.entries_begin(end), &hits_);
  }
  CollectLooks(begin, end);
  for (FolderId at = begin; !search_.stopping(); ++at) {
    at = NextFolder(std::max(at, skip_until_), end);
    if (at >= end) return;
    VisitFolder(at);
  }
}

// What has to be tried for its own sake: folders that the table does not have, and those that seem
// closed to the user, which are counted.
void IndexVisit::CollectLooks(FolderId begin, FolderId end) {
  looks_.clear();
  next_look_ = 0;
  tries_.clear();
  if (!names_.gate_.rules().recursive) return;
  const std::vector<EntryId>& strays = table_.strays();
  const auto first = std::ranges::lower_bound(strays, table_.entries_begin(begin));
  looks_.assign(first, std::ranges::lower_bound(strays, table_.entries_begin(end)));
  if (rights_.all()) return;
  for (FolderId folder = begin; folder < end; ++folder) {
    if (folder != names_.top_ && SeemsClosed(folder)) tries_.push_back(folder);
  }
}

bool IndexVisit::SeemsClosed(FolderId folder) const {
  const auto attributes = table_.attributes(table_.folder_entry(folder));
  if (!attributes || !rights_.Have(*attributes, kRead)) return true;
  return !MayEnterBelow(table_.parent(folder));
}

bool IndexVisit::MayEnterBelow(FolderId folder) const {
  if (rights_.all()) return true;
  if (folder == names_.top_) {
    return faccessat(names_.locations_.front().fd.get(), ".", X_OK, AT_EACCESS) == 0;
  }
  const EntryId entry = table_.folder_entry(folder);
  const auto attributes = table_.attributes(entry);
  return attributes && rights_.Have(*attributes, kEnter);
}

// The next folder from `at` on in which something is to be done; all have names to be judged where
// the filter finds none by itself.
NameTable::FolderId IndexVisit::NextFolder(FolderId at, FolderId end) const {
  if (at >= end || !names_.filter_.finds()) return at;
  FolderId next = end;
  const EntryId first = table_.entries_begin(at);
  for (const std::vector<EntryId>* entries : {&hits_, &looks_}) {
    const auto found = std::ranges::lower_bound(*entries, first);
    if (found != entries->end()) next = std::min(next, table_.folder_of(*found));
  }
  const auto tried = std::ranges::lower_bound(tries_, at);
  if (tried != tries_.end()) next = std::min(next, *tried);
  const auto special =
      std::ranges::lower_bound(names_.specials_, at, {}, &IndexNames::Special::folder);
  if (special != names_.specials_.end()) next = std::min(next, special->folder);
  return next;
}

void IndexVisit::VisitFolder(FolderId folder) {
  const Special* special = names_.SpecialOf(folder);
  if (special != nullptr && special->whole) {
    if (Open(folder)) ReadWhole(folder);
    return;
  }
  may_enter_ = MayEnterBelow(folder);
  CollectEntries(folder, special);
  while (next_look_ < looks_.size() && looks_[next_look_] < table_.entries_begin(folder)) {
    ++next_look_;
  }
  const bool looks = next_look_ < looks_.size() && looks_[next_look_] < table_.entries_end(folder);
  const bool tries = std::ranges::binary_search(tries_, folder);
  if (entries_.empty() && !looks && !tries && special == nullptr) return;
  if (Open(folder)) JudgeEntries(folder, special);
}

void IndexVisit::CollectEntries(FolderId folder, const Special* special) {
  entries_.clear();
  const EntryId end = table_.entries_end(folder);
  const std::string_view path = search_.criteria.ask_paths ? paths_.Of(folder) : std::string_view();
  if (!filter_.Enter(path, may_enter_)) return;
  if (!names_.filter_.finds()) filter_.FindAmong(table_.entries_begin(folder), end, &entries_);
  while (next_hit_ < hits_.size() && hits_[next_hit_] < table_.entries_begin(folder)) ++next_hit_;
  for (; next_hit_ < hits_.size() && hits_[next_hit_] < end; ++next_hit_) {
    if (filter_.Passes(hits_[next_hit_], hits_told_)) entries_.push_back(hits_[next_hit_]);
  }
  if (special == nullptr) return;
  std::erase_if(entries_, [&](EntryId entry) { return special->Holds(table_.name(entry)); });
}

void IndexVisit::JudgeEntries(FolderId folder, const Special* special) {
  seen_ = 0;
  const bool may_tell = rights_.all() || !may_enter_;
  EnterJudge(judge_);
  if (ReadingIsBetter(folder)) {
    JudgeByReading(folder);
    entries_.clear();
  }
  for (const EntryId entry : entries_) {
    if (search_.stopping()) break;
    const DirectoryReader::Entry known{table_.name(entry), table_.inode(entry), table_.type(entry)};
    if (judge_.KnownEntry(known, may_tell) != Refusal::kVanished) ++seen_;
  }
  if (special != nullptr) {
    if (special->changed != nullptr) {
      for (const std::string& name : special->changed->names) LookAt(folder, name);
    }
    for (const std::string& name : special->mounts) {
      const bool looked_at = special->changed != nullptr && special->changed->names.contains(name);
      if (!looked_at) LookAt(folder, name);
    }
  }
  for (; next_look_ < looks_.size() && looks_[next_look_] < table_.entries_end(folder);
       ++next_look_) {
    const EntryId entry = looks_[next_look_];
    const std::string name(table_.name(entry));
    if (special != nullptr && special->Holds(name)) continue;
    EnterFolder(name.c_str(), table_.folder_at(entry));
  }
  judge_.Leave();
  if (seen_ > 0) search_.progress.AddFolder(seen_);
}

// Where rows tell names alone, the folder tells them, also to whom its files are closed.
bool IndexVisit::ReadingIsBetter(FolderId folder) const {
  if (!search_.names_alone || entries_.empty()) return false;
  const size_t names = table_.entries_end(folder) - table_.entries_begin(folder);
  const bool many = entries_.size() > kLooksForReading + names / kNamesForLook;
  if (many && !search_.criteria.ask_attributes) return true;
  return !rights_.all() && faccessat(fd(), ".", X_OK, AT_EACCESS) != 0;
}

void IndexVisit::JudgeByReading(FolderId folder) {
  DirectoryReader::Entry entry;
  reader_.Start(fd());
  while (reader_.Next(entry) && !search_.stopping()) {
    if (!std::ranges::binary_search(entries_, table_.FindEntry(folder, entry.name))) continue;
    judge_.Entry(entry);
    ++seen_;
  }
  if (reader_.failed() != 0) search_.CannotRead(reader_.failed(), 0, path_);
}

void IndexVisit::EnterJudge(Judge& judge) const {
  judge.Enter(fd(), 0, names_.locations_.front(), path_, levels_.back().ignores.get());
}

NameTable::FolderId IndexVisit::FolderAt(FolderId parent, std::string_view name) const {
  const EntryId entry = table_.FindEntry(parent, name);
  return entry == table_.entries() ? NameTable::kNoFolder : table_.folder_at(entry);
}

void IndexVisit::LookAt(FolderId folder, const std::string& name) {
  if (search_.stopping()) return;
  const unsigned char type = ReadType(fd(), name.c_str());
  if (judge_.KnownEntry({name, 0, type}, true) != Refusal::kVanished) ++seen_;
  if (type == DT_DIR) EnterFolder(name.c_str(), FolderAt(folder, name));
}

void IndexVisit::ReadWhole(FolderId folder) {
  std::uint64_t entries = 0;
  DirectoryReader::Entry entry;
  reader_.Start(fd());
  EnterJudge(judge_);
  while (reader_.Next(entry) && !search_.stopping()) {
    ++entries;
    judge_.Entry(entry);
    if (entry.type == DT_DIR) EnterFolder(entry.name.data(), FolderAt(folder, entry.name));
  }
  if (reader_.failed() != 0) search_.CannotRead(reader_.failed(), 0, path_);
  search_.progress.AddFolder(entries);
  judge_.Leave();
}

// By its name, of a folder in the open one.
bool IndexVisit::MayEnter(std::string_view name) const {
  const Location& location = names_.locations_.front();
  return names_.gate_.Below(DT_DIR, location, path_, name, levels_.back().ignores.get()) ==
         Refusal::kNone;
}

// Of an entry of the open folder.
std::string IndexVisit::PathOf(std::string_view name) const {
  return path_ + (path_.empty() ? "" : "/") + std::string(name);
}

void IndexVisit::EnterFolder(const char* name, FolderId folder) {
  if (!MayEnter(name)) return;
  const FolderGate::Opened opened = names_.gate_.Open(fd(), name);
  if (!opened.fd) {
    const bool tell = opened.refusal == Refusal::kFolderUnreadable && !IsGone(opened.error_number);
    if (tell && (folder == NameTable::kNoFolder || names_.Claim(folder))) {
      search_.CannotRead(opened.error_number, 0, PathOf(name));
    }
    return;
  }
  if (folder == NameTable::kNoFolder) {
    Walk(name);
  } else if (!IsSame(folder, opened.fd.get(), true) && names_.Claim(folder)) {
    Walk(name);
  }
}

void IndexVisit::Walk(std::string_view name) {
  names_.walk_.Add(thread_, 0, UniqueFd(fcntl(fd(), F_DUPFD_CLOEXEC, 0)), path_, name,
                   levels_.back().ignores);
}

bool IndexVisit::Open(FolderId folder) {
  while (!levels_.empty()) {
    const FolderId open = levels_.back().folder;
    if (open <= folder && folder < table_.subtree_end(open)) break;
    levels_.pop_back();
  }
  if (levels_.empty() && !OpenTop()) return false;
  path_.resize(levels_.back().path_length);
  std::vector<FolderId> way;
  for (FolderId id = folder; id != levels_.back().folder; id = table_.parent(id)) way.push_back(id);
  return std::all_of(way.rbegin(), way.rend(), [this](FolderId id) { return OpenLevel(id); });
}

void IndexVisit::Skip(FolderId folder) {
  skip_until_ = table_.subtree_end(folder);
  closed_.emplace(folder, skip_until_);
}

bool IndexVisit::OpenInAnyOrder(FolderId folder) {
  const auto behind = closed_.upper_bound(folder);
  if (behind != closed_.begin() && folder < std::prev(behind)->second) return false;
  return Open(folder);
}

bool IndexVisit::VisitEntry(EntryId entry, Judge& judge) {
  const FolderId folder = table_.folder_of(entry);
  const std::string_view name = table_.name(entry);
  const Special* special = names_.SpecialOf(folder);
  if (special != nullptr && special->Holds(name)) return false;
  if (!OpenInAnyOrder(folder)) return false;
  EnterJudge(judge);
  const bool match =
      judge.KnownEntry({name, table_.inode(entry), table_.type(entry)}, false) == Refusal::kNone;
  judge.Leave();
  return match;
}

bool IndexVisit::VisitName(FolderId folder, const std::string& name, Judge& judge) {
  if (!OpenInAnyOrder(folder)) return false;
  EnterJudge(judge);
  const unsigned char type = ReadType(fd(), name.c_str());
  const bool match = judge.KnownEntry({name, 0, type}, false) == Refusal::kNone;
  judge.Leave();
  return match;
}

bool IndexVisit::OpenTop() {
  const Location& location = names_.locations_.front();
  FolderGate::Opened opened = names_.gate_.Open(location.fd.get(), ".");
  if (!opened.fd) {
    skip_until_ = names_.end_;
    if (names_.Claim(names_.top_)) search_.CannotRead(opened.error_number, 0, location.path);
    return false;
  }
  path_ = location.path;
  auto ignores =
      names_.gate_.IgnoresOf(opened.fd.get(), path_, names_.gate_.IgnoresAbove(location));
  levels_.push_back({names_.top_, std::move(opened.fd), path_.size(), std::move(ignores)});
  return true;
}

bool IndexVisit::OpenLevel(FolderId folder) {
  const std::string name(table_.folder_name(folder));
  if (!MayEnter(name)) {
    Skip(folder);
    return false;
  }
  FolderGate::Opened opened = names_.gate_.Open(fd(), name.c_str());
  if (!opened.fd) {
    Refused(folder, opened);
    return false;
  }
  const Special* special = names_.SpecialOf(levels_.back().folder);
  const bool by_key = special != nullptr && special->Holds(name);
  if (!IsSame(folder, opened.fd.get(), by_key)) {
    Skip(folder);
    if (names_.Claim(folder)) Walk(name);
    return false;
  }
  path_.append(path_.empty() ? "" : "/").append(name);
  auto ignores = names_.gate_.IgnoresOf(opened.fd.get(), path_, levels_.back().ignores);
  levels_.push_back({folder, std::move(opened.fd), path_.size(), std::move(ignores)});
  return true;
}

// One that is closed against what its mode says was not met for its own sake but for what the table
// says lies in it. To count it would tell of that.
void IndexVisit::Refused(FolderId folder, const FolderGate::Opened& opened) {
  Skip(folder);
  if (opened.refusal != Refusal::kFolderUnreadable || IsGone(opened.error_number)) return;
  const bool may_tell = rights_.all() || !IsForbidden(opened.error_number) || SeemsClosed(folder);
  if (!may_tell || !names_.Claim(folder)) return;
  search_.CannotRead(opened.error_number, 0, PathOf(table_.folder_name(folder)));
}

bool IndexVisit::IsSame(FolderId folder, int fd, bool by_key) const {
  struct stat status;
  if (fstat(fd, &status) != 0 || status.st_ino != table_.folder_inode(folder)) return false;
  if (!by_key) return true;
  const auto key = KeyOf(fd);
  return key && *key == table_.key(folder);
}

}  // namespace nas
