#include "nas/search/criteria.h"

#include <syslog.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "nas/base/accounts.h"
#include "nas/base/error.h"
#include "nas/search/walk_entry.h"

namespace nas {

bool PatternComp::match(const FileSearch::WalkEntry& entry) const {
  return pattern_.Matches(*entry.name);
}

ExtensionComp::ExtensionComp(std::string_view list) {
  constexpr std::string_view kSeparators = ",; ";
  size_t at = 0;
  while ((at = list.find_first_not_of(kSeparators, at)) != std::string_view::npos) {
    const size_t end = std::min(list.find_first_of(kSeparators, at), list.size());
    std::string_view extension = list.substr(at, end - at);
    at = end;
    if (extension.starts_with("*.")) extension.remove_prefix(1);
    if (extension.starts_with(".")) extension.remove_prefix(1);
    if (!extension.empty()) suffixes_.push_back("." + FoldText(extension));
  }
}

bool ExtensionComp::match(const FileSearch::WalkEntry& entry) const {
  if (suffixes_.empty()) return true;
  const std::string_view name = entry.name->folded();
  return std::ranges::any_of(suffixes_, [name](const std::string& suffix) {
    return name.size() > suffix.size() && name.ends_with(suffix);
  });
}

std::unique_ptr<KindComp> KindComp::Parse(std::string_view word) {
  static constexpr struct {
    std::string_view word;
    FileCategory category;
  } kCategories[] = {{"image", FileCategory::kImage},
                     {"video", FileCategory::kVideo},
                     {"audio", FileCategory::kAudio},
                     {"document", FileCategory::kDocument},
                     {"archive", FileCategory::kArchive}};
  const std::string folded = AsciiLower(word);
  std::unique_ptr<KindComp> comp(new KindComp);
  comp->any_ = folded.empty();
  if (folded.empty() || folded == "file") return comp;
  if (folded == "dir") {
    comp->dirs_ = true;
    return comp;
  }
  for (const auto& known : kCategories) {
    if (folded != known.word) continue;
    comp->category_ = known.category;
    return comp;
  }
  return nullptr;
}

bool KindComp::match(const FileSearch::WalkEntry& entry) const {
  if (any_) return true;
  if (entry.is_dir != dirs_) return false;
  return !category_ || IsInCategory(ExtensionOf(entry.name->folded()), *category_);
}

bool OwnerComp::match(const FileSearch::WalkEntry& entry) const {
  return entry.attributes->uid == uid_;
}

bool GroupComp::match(const FileSearch::WalkEntry& entry) const {
  return entry.attributes->gid == gid_;
}

namespace {

using Made = Result<std::unique_ptr<FileSearch::FindComp>>;

Made MakePattern(const char* text) {
  auto pattern = NamePattern::Parse(text);
  if (pattern) return Made(std::make_unique<PatternComp>(std::move(*pattern)));
  syslog(LOG_NOTICE, "search pattern refused: %s", pattern.error().path.c_str());
  return pattern.error();
}

Made MakeKind(const char* word) {
  auto comp = KindComp::Parse(word);
  if (!comp) return Error{kErrorIllegal, EINVAL, word};
  return Made(std::move(comp));
}

Made MakeOwner(const char* name) {
  const auto user = FindAccount(name);
  if (!user) return user.error();
  return Made(std::make_unique<OwnerComp>(user->uid));
}

Made MakeGroup(const char* name) {
  const auto group = FindGroup(name);
  if (!group) return group.error();
  return Made(std::make_unique<GroupComp>(group->gid));
}

Made MakeComp(FileSearch::FindFactory::_tag_FIND_FIELD_ field, const char* text) {
  using FileSearch::FindFactory;
  if (text == nullptr) return Error{kErrorIllegal, EINVAL};
  switch (field) {
    case FindFactory::FIND_PATTERN:
      return MakePattern(text);
    case FindFactory::FIND_FILETYPE:
      return MakeKind(text);
    case FindFactory::FIND_EXTENSION:
      return Made(std::make_unique<ExtensionComp>(text));
    case FindFactory::FIND_OWNER:
      return MakeOwner(text);
    case FindFactory::FIND_GROUP:
      return MakeGroup(text);
  }
  return Error{kErrorIllegal, EINVAL};
}

}  // namespace
}  // namespace nas

namespace FileSearch {

FindSizeComp::FindSizeComp(const char* op, long long bytes)
    : at_least_(std::strcmp(op, "greater") == 0), bytes_(bytes) {}

bool FindSizeComp::match(const WalkEntry& entry) const {
  if (entry.is_dir) return false;
  const auto size = static_cast<long long>(entry.attributes->size);
  return at_least_ ? size >= bytes_ : size <= bytes_;
}

Refusal FindSizeComp::refusal() const {
  return at_least_ ? Refusal::kTooSmall : Refusal::kTooLarge;
}

FindTimeComp::FindTimeComp(const char* op, long seconds)
    : after_(std::strcmp(op, "after") == 0), seconds_(seconds) {}

bool FindTimeComp::InRange(std::int64_t file_seconds) const {
  return after_ ? file_seconds >= seconds_ : file_seconds <= seconds_;
}

bool FindMTimeComp::match(const WalkEntry& entry) const { return InRange(entry.attributes->mtime); }

bool FindCRTimeComp::match(const WalkEntry& entry) const {
  return entry.attributes->crtime != nas::FileAttributes::kNoTime &&
         InRange(entry.attributes->crtime);
}

bool FindATimeComp::match(const WalkEntry& entry) const { return InRange(entry.attributes->atime); }

Refusal FindMTimeComp::refusal() const {
  return OutOfRange(Refusal::kModifiedEarlier, Refusal::kModifiedLater);
}

Refusal FindCRTimeComp::refusal() const {
  return OutOfRange(Refusal::kCreatedEarlier, Refusal::kCreatedLater);
}

Refusal FindATimeComp::refusal() const {
  return OutOfRange(Refusal::kReadEarlier, Refusal::kReadLater);
}

int FindFactory::createFindOp(_tag_FIND_FIELD_ field, const char* arg1, const char* arg2,
                              std::vector<FindComp*>& comps) {
  auto made = nas::MakeComp(field, field == FIND_FILETYPE ? arg1 : arg2);
  if (!made) {
    nas::Report(made.error());
    return 0;
  }
  comps.push_back(made->get());
  made->release();
  return 1;
}

}  // namespace FileSearch
