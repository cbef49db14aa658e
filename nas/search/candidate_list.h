#pragma once
// The files whose contents are still to be searched: found by one pass over the names, taken by the
// next. They wait in an unlinked temporary file, so that the worker's memory does not grow with the
// tree.
//
// Layout: records, each a 32-bit length and that many bytes: 16-bit location id, NUL-ended path of
// the folder below the location's share, NUL-ended names of files in it.

#include <cstdint>
#include <mutex>
#include <string>
#include <string_view>

#include "nas/base/unique_fd.h"

namespace nas {

// Where they go.
class CandidateSink {
 public:
  virtual ~CandidateSink() = default;
  // Adds files of one folder; `names` are NUL-ended. Callable from any thread. Throws where they
  // cannot be taken, which ends the search.
  virtual void Add(std::uint16_t location, std::string_view folder_path,
                   std::string_view names) = 0;
};

class CandidateList : public CandidateSink {
 public:
  // The temporary file is made in `folder`. Throws std::system_error, here and below.
  explicit CandidateList(const std::string& folder);

  void Add(std::uint16_t location, std::string_view folder_path, std::string_view names) override;

  struct Record {
    std::uint16_t location = 0;
    std::string bytes;
    std::string_view folder_path;
    std::string_view names;
  };
  // Takes the next record; false when there is none. To be called once adding has ended; callable
  // from any thread.
  bool Take(Record& record);

 private:
  void Write(std::string_view bytes);
  void Read(char* to, size_t count);

  UniqueFd file_;
  std::mutex mutex_;  // guards everything below
  std::string unwritten_;
  std::string unread_;
  size_t unread_at_ = 0;
  std::uint64_t written_ = 0;
  std::uint64_t read_ = 0;
};

}  // namespace nas
