#include "nas/system/own_library.h"

#include <dlfcn.h>
#include <unistd.h>

#include <stdexcept>
#include <string>

#include "nas/base/paths.h"

namespace nas {
namespace {

// Beside the program in a build tree; where libraries are kept when it is installed.
std::string FindLibrary(const std::string& name) {
  const std::string folder = ProgramFolder();
  for (const char* place : {"", "../lib/arbory/"}) {
    std::string path = folder + place + name;
    if (access(path.c_str(), R_OK) == 0) return path;
  }
  return folder + name;
}

}  // namespace

void* LoadOwnLibrary(const char* name, const char* entry) {
  void* handle = dlopen(FindLibrary(name).c_str(), RTLD_NOW | RTLD_LOCAL);
  void* found = handle == nullptr ? nullptr : dlsym(handle, entry);
  if (found == nullptr) {
    throw std::runtime_error("cannot load a part of this program: " + std::string(dlerror()));
  }
  return found;
}

}  // namespace nas
