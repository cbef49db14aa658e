#pragma once
// Whole-file reading and atomic replacement; EINTR and short transfers are handled here.

#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>

namespace nas {

// Writes all of it; false with errno set.
bool WriteAll(int fd, std::string_view bytes);

// Reads the regular file `name`, relative to `dir_fd` or AT_FDCWD. False with errno set: EISDIR for
// a directory, EINVAL for another kind of file, EFBIG beyond `max_bytes`.
bool ReadWholeFile(int dir_fd, const char* name, size_t max_bytes, std::string* bytes);

// Puts a file with this content and mode in the place of `name`, at once: a reader finds the old
// one or the new one, whole. The new content is first written to a file of another name beside it,
// which a process killed meanwhile leaves behind (kTemporaryPrefix tells it). False with errno set
// and the old file untouched. Not synced to the disk unless `durable`.
bool ReplaceFile(int dir_fd, const char* name, std::string_view bytes, mode_t mode, bool durable);

// The same for a file that must not exist yet: EEXIST where it does.
bool CreateFile(int dir_fd, const char* name, std::string_view bytes, mode_t mode);

inline constexpr std::string_view kTemporaryPrefix = ".arbory-new-";

}  // namespace nas
