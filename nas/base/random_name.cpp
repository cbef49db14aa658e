#include "nas/base/random_name.h"

#include <sys/random.h>

#include <stdexcept>

#include "nas/base/hex.h"

namespace nas {
namespace {

constexpr size_t kRandomBytes = 16;  // 128 bits: no two meet, and nobody guesses one

}  // namespace

std::string RandomName() {
  unsigned char random[kRandomBytes];
  if (getrandom(random, sizeof random, 0) != static_cast<ssize_t>(sizeof random)) {
    throw std::runtime_error("no random bytes from the system");
  }
  std::string name;
  for (const unsigned char byte : random) AppendHex(byte, kLowerHex, &name);
  return name;
}

bool IsRandomName(std::string_view name) {
  return name.size() == 2 * kRandomBytes &&
         name.find_first_not_of(kLowerHex) == std::string_view::npos;
}

}  // namespace nas
