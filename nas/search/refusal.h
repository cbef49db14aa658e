#pragma once
// Why an entry is not a result of a search: one value for each rule, returned where the rule is
// applied. The walk only counts some of them; explain.h tells them.

namespace FileSearch {

enum class Refusal {
  kNone,  // it is a result
  // By criteria on the entry.
  kName,
  kPath,
  kExcluded,
  kNeither,
  kExtension,
  kKind,
  kTooSmall,  // or a folder, which has no size of its own, as with the next
  kTooLarge,
  kModifiedEarlier,
  kModifiedLater,
  kCreatedEarlier,  // or at a time that the file system does not record, as with the next
  kCreatedLater,
  kReadEarlier,
  kReadLater,
  kOwner,
  kGroup,
  kDepth,
  kNotEmpty,
  kIgnored,
  kVanished,        // it went away, or cannot be looked at, after its folder had named it
  kContentsUnread,  // not decided yet: its contents can stand in for its name
  // By its contents.
  kContents,
  kContentsAsked,
  kBinary,
  kFileUnreadable,
  kStopped,  // the search was stopped before it was decided
  // By a folder on the way to it.
  kFolderUnreadable,
  kPseudoFileSystem,
  kTemporaryFolder,
  kOtherLocation,
  kOtherMount,
  kNotRecursive,
  kFolderExcluded,
  kFolderIgnored,
  kOtherDisk,
  kTooDeep,
  kSymbolicLink,
  kNoFolder,
};

}  // namespace FileSearch

namespace nas {

using FileSearch::Refusal;

// Whether it is about a folder on the way to the entry instead of the entry itself.
inline bool IsOfFolder(Refusal refusal) { return refusal >= Refusal::kFolderUnreadable; }
// For people: what comes after the path of the entry or the folder, as "is smaller than asked for".
const char* Words(Refusal refusal);

}  // namespace nas
