#include "nas/fleet/library.h"

#include <stdexcept>

#include "nas/system/own_library.h"

namespace nas {
namespace {

const FleetLibrary& Load() {
  const auto entry =
      reinterpret_cast<FleetLibraryEntry>(LoadOwnLibrary("libarbory_fleet.so", kFleetLibraryEntry));
  const FleetLibrary* library = entry();
  if (library == nullptr) throw std::runtime_error("signatures cannot be used on this machine");
  return *library;
}

}  // namespace

const FleetLibrary& LoadFleetLibrary() {
  static const FleetLibrary& library = Load();
  return library;
}

}  // namespace nas
