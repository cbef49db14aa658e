#include "nas/search/refusal.h"

namespace nas {

const char* Words(Refusal refusal) {
  switch (refusal) {
    case Refusal::kNone:
      return "matches";
    case Refusal::kName:
      return "has a name that does not match the pattern";
    case Refusal::kPath:
      return "has a path that does not match the pattern";
    case Refusal::kExcluded:
      return "is what the pattern leaves out";
    case Refusal::kNeither:
      return "matches none of what the pattern gives to choose from";
    case Refusal::kExtension:
      return "has none of the extensions asked for";
    case Refusal::kKind:
      return "is not of the type asked for";
    case Refusal::kTooSmall:
      return "is smaller than asked for";
    case Refusal::kTooLarge:
      return "is larger than asked for";
    case Refusal::kModifiedEarlier:
      return "was modified earlier than asked for";
    case Refusal::kModifiedLater:
      return "was modified later than asked for";
    case Refusal::kCreatedEarlier:
      return "was created earlier than asked for";
    case Refusal::kCreatedLater:
      return "was created later than asked for";
    case Refusal::kReadEarlier:
      return "was last read earlier than asked for";
    case Refusal::kReadLater:
      return "was last read later than asked for";
    case Refusal::kOwner:
      return "is not owned by the user asked for";
    case Refusal::kGroup:
      return "is not of the group asked for";
    case Refusal::kDepth:
      return "does not lie as deep as asked for";
    case Refusal::kNotEmpty:
      return "is not empty";
    case Refusal::kIgnored:
    case Refusal::kFolderIgnored:
      return "is left out by an ignore file";
    case Refusal::kOtherDisk:
      return "is on another file system than the folder to search";
    case Refusal::kVanished:
      return "cannot be looked at";
    case Refusal::kContentsUnread:
      return "may match by its contents";
    case Refusal::kContents:
      return "matches neither by its name nor by its contents";
    case Refusal::kContentsAsked:
      return "does not have the contents asked for";
    case Refusal::kBinary:
      return "does not match by its name, and is binary, so its contents are not searched";
    case Refusal::kFileUnreadable:
      return "does not match by its name, and its contents cannot be read";
    case Refusal::kStopped:
      return "was not judged before the search was stopped";
    case Refusal::kFolderUnreadable:
      return "cannot be read";
    case Refusal::kPseudoFileSystem:
      return "is on a file system of the system's own, which is not searched";
    case Refusal::kTemporaryFolder:
      return "is the temporary folder of a volume, which is never searched";
    case Refusal::kOtherLocation:
      return "is one of the folders to search, and is not searched a second time by this way";
    case Refusal::kOtherMount:
      return "is on another file system, which is not searched by this way";
    case Refusal::kNotRecursive:
      return "is a folder in the one to search, and such are not entered";
    case Refusal::kFolderExcluded:
      return "is left out, with all that is in it";
    case Refusal::kTooDeep:
      return "lies as deep as the search goes";
    case Refusal::kSymbolicLink:
      return "is a symbolic link, which can be found but is not followed";
    case Refusal::kNoFolder:
      return "is not a folder";
  }
  return "is left out";
}

}  // namespace nas
