#pragma once
// Text that is too long to be held: it goes to a file without a name, of which a child keeps only
// the descriptor until its reader has taken it.

#include <cstdint>
#include <string>
#include <string_view>

#include "nas/base/unique_fd.h"

namespace nas {

class Spool {
 public:
  // In `folder`, of which nothing shows that there is a file. What cannot be had shows when it is
  // written to.
  explicit Spool(const std::string& folder);

  // False, with nothing of them kept, where the bytes find no place.
  bool Append(std::string_view bytes);
  std::uint64_t bytes() const { return bytes_; }
  // Writes all of it; false when that fails.
  bool CopyTo(int fd) const;

 private:
  UniqueFd fd_;
  std::uint64_t bytes_ = 0;
};

}  // namespace nas
