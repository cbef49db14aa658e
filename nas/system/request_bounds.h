#pragma once
// What one request may ask for.

#include <cstddef>
#include <stdexcept>

namespace nas {

// Values in one list parameter, such as the folders to search: many more than anybody picks, and a
// bound on what one request costs, since each may have to be looked up or opened.
inline constexpr size_t kMostPieces = 4096;

// What StringExplodeEx throws for a longer list. The call that it ends is answered with
// kCodeBadRequest (nas/webapi/runner.h).
class TooManyPieces : public std::length_error {
  using std::length_error::length_error;
};

}  // namespace nas
