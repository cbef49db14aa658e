#pragma once
// One search's results on disk: an SQLite file `ID.db` in the user's result folder (nas/system/
// shares.h), with SQLite's own `-wal` and `-shm` beside it.
//
// Rows are numbered from 0 in the order found and stored in blocks, column by column, because the
// work is: append many at once, read a page of any, and sort by one column of all. A block is one
// row of `names` and one of `attributes`, both keyed by the number of its first row:
//
//   location(id, share_name, share_root)     where folders are relative to; written before any
//   block names(first, count, folders, names)      names: NUL-ended, in row order
//                                            folders: for each folder of the block a 16-bit
//                                            location id and the NUL-ended path below the share's
//                                            root
//   attributes(first, data)                  FileAttributes for each row, as in memory
//   purged(row)                              rows whose file has vanished
//   account(id, name)                        accounts of other machines, where rows came from those
//                                            (foreign_accounts.h)
//   complete(rows)                           one row once no more rows will follow
//   ordering(id, data)                       all rows in ascending order of a column, as 32-bit
//                                            numbers in pieces of kOrderingPiece, so that a page is
//                                            read without the rest; id is the column * 2^32 + the
//                                            piece's number. Kept only once the file is complete,
//                                            each column's pieces in one transaction
//
// One worker appends, any number of listings read and purge (WAL). Blocks are never changed. The
// file stays on the machine that made it, so numbers are in its own byte order, and it need not
// survive a power cut, so nothing waits for the disk. PRAGMA user_version holds kResultVersion; a
// file of another version is not opened.

#include <cstdint>
#include <string>
#include <string_view>

#include "nas/base/unique_fd.h"
#include "nas/files/attributes.h"

namespace nas {

constexpr int kResultVersion = 1;

// Rows in one piece of a kept ordering: 64 KB.
constexpr std::uint64_t kOrderingPiece = std::uint64_t{16} * 1024;

// How long a writer waits for another: longer than any listing holds its short write transaction.
constexpr int kResultBusyMilliseconds = 10'000;

// Tells a follower of a running search for some microseconds whether asking for rows is worth a
// listing's milliseconds.
class ResultWatch {
 public:
  // `path` as of ResultPath; the file need not be there yet.
  explicit ResultWatch(const std::string& path);
  // Whether rows seem to have been appended since the call before, or since construction. A log of
  // full length is written anew from its front: of two writes between which the file system's clock
  // has not moved, the second then goes unnoticed.
  bool Changed();

 private:
  struct Stamp {
    std::int64_t bytes = 0;
    std::int64_t seconds = 0;
    std::int64_t nanoseconds = 0;
    bool operator==(const Stamp&) const = default;
  };
  Stamp Look() const;

  std::string log_;  // writers append to it alone
  Stamp seen_;
};

// Makes a result file, still empty, and says for as long as it lives that a search works on it: it
// is never swept, however long ago the last row came and whatever became of the clock. A process
// that is killed says so no longer. The claim is a lock on a byte of the file that SQLite does not
// know. It must outlive every database open on the file in this process, as closing any descriptor
// of a file lets go of SQLite's own locks on it.
class ResultClaim {
 public:
  // The file must not exist. Throws std::system_error.
  explicit ResultClaim(const std::string& path);

 private:
  UniqueFd file_;
};

// Of the form of random_name.h.
std::string NewResultId();
bool IsResultId(std::string_view id);
std::string ResultPath(const std::string& folder, const std::string& id);
// How long the file and its log are; 0 where there is none.
std::uint64_t ResultFileBytes(const std::string& path);
// Whether there is any part of it: who is killed while it deletes one leaves the companions, and a
// writer that closes a deleted file leaves them too.
bool IsResultFileThere(const std::string& path);
// Deletes the file and its companions; true if there was a part of it and none is left. Throws
// std::bad_alloc, and has then deleted nothing.
bool RemoveResultFile(const std::string& path);
// Deletes result files in `folder` that nobody wrote for kKeepSeconds and no search works on. No
// database in it may be open in this process.
void SweepResultFolder(const std::string& folder);

}  // namespace nas
