#include "nas/fleet/library.h"

#include <dlfcn.h>
#include <unistd.h>

#include <stdexcept>

#include "nas/base/paths.h"

namespace nas {
namespace {

constexpr char kLibraryName[] = "libarbory_fleet.so";

// Beside the program in a build tree; where libraries are kept when it is installed.
std::string FindLibrary() {
  const std::string folder = ProgramFolder();
  for (const char* place : {"", "../lib/arbory/"}) {
    std::string path = folder + place + kLibraryName;
    if (access(path.c_str(), R_OK) == 0) return path;
  }
  return folder + kLibraryName;
}

const FleetLibrary& Load() {
  void* handle = dlopen(FindLibrary().c_str(), RTLD_NOW | RTLD_LOCAL);
  if (handle == nullptr) {
    throw std::runtime_error("cannot load what a fleet needs: " + std::string(dlerror()));
  }
  const auto entry = reinterpret_cast<FleetLibraryEntry>(dlsym(handle, kFleetLibraryEntry));
  const FleetLibrary* library = entry == nullptr ? nullptr : entry();
  if (library == nullptr) {
    throw std::runtime_error(std::string(kLibraryName) + " cannot be used");
  }
  return *library;
}

}  // namespace

const FleetLibrary& LoadFleetLibrary() {
  static const FleetLibrary& library = Load();
  return library;
}

}  // namespace nas
