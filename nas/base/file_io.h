#pragma once
// Whole files: reading and atomic replacement. Short transfers and signals are dealt with here.
//
// `name` is relative to `dir_fd`, which may be AT_FDCWD, and stands in the error of a failure.
// Callable from any thread; a descriptor given stays the caller's.

#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>

#include "nas/base/error.h"

namespace nas {

// Writes all of it, waiting where `fd` makes it wait. After a failure a part may have been written.
Status WriteAll(int fd, std::string_view bytes);

// The content of a regular file. EISDIR for a directory, EINVAL for another kind of file (a named
// pipe is not waited for), EFBIG for more than `max_bytes`.
Result<std::string> ReadWholeFile(int dir_fd, const std::string& name, size_t max_bytes);

// What a power cut leaves of a replacement.
enum class Durability {
  kNone,    // what the file system leaves: most have the old one or the new one, whole
  kAtomic,  // the old one or the new one, whole
  kFull,    // the new one, once the call has returned
};

// Puts a file with this content and mode in the place of `name`, at once: a reader finds the old
// one or the new one, whole; after a failure it is the old one, but where the last step of kFull
// fails, the syncing of the folder. The new content is first written to a file of another name
// beside it, which a process killed meanwhile leaves behind (kTemporaryPrefix tells it). A symbolic
// link is replaced, not followed.
Status ReplaceFile(int dir_fd, const std::string& name, std::string_view bytes, mode_t mode,
                   Durability durability);

// The same for a file that must not exist yet, with Durability::kFull: EEXIST where it does.
Status CreateFile(int dir_fd, const std::string& name, std::string_view bytes, mode_t mode);

// Takes away what a write to a file in the folder has left half done, once it is as old as what is
// kept of searches (keeping.h). Not while a write may take so long.
void SweepTemporaryFiles(const std::string& folder);

// Syncs the folder `name` itself to the disk: what was made, renamed or removed in it.
Status SyncFolder(int dir_fd, const std::string& name);

inline constexpr std::string_view kTemporaryPrefix = ".arbory-new-";

}  // namespace nas
