#include "nas/base/real_path.h"

#include <cstdlib>
#include <memory>

namespace nas {

std::optional<std::string> RealPath(const std::string& path) {
  const std::unique_ptr<char, void (*)(void*)> real(realpath(path.c_str(), nullptr), std::free);
  if (!real) return std::nullopt;
  return std::string(real.get());
}

}  // namespace nas
