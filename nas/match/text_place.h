#pragma once
// Where something was found in a text, in bytes.

#include <cstddef>

namespace nas {

struct TextPlace {
  size_t at = 0;
  size_t length = 0;
};

}  // namespace nas
