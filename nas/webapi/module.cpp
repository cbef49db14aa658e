#include "nas/webapi/module.h"

#include <dlfcn.h>
#include <strings.h>
#include <unistd.h>

#include <stdexcept>

#include "nas/base/paths.h"
#include "nas/system/config.h"

namespace nas {
namespace {

constexpr char kModuleName[] = "NUVA.Arbory.Search.so";
constexpr char kEntryPoint[] = "GetAPITable";

// Beside the program in a build tree; where libraries are kept when it is installed.
std::string FindModule() {
  if (!CurrentConfig().module.empty()) return CurrentConfig().module;
  const std::string folder = ProgramFolder();
  for (const char* place : {"", "../lib/arbory/"}) {
    std::string path = folder + place + kModuleName;
    if (access(path.c_str(), R_OK) == 0) return path;
  }
  return folder + kModuleName;
}

}  // namespace

Module::Module(const std::string& path) {
  const std::string file = path.empty() ? FindModule() : path;
  // A name without "/" would be looked for in the system's library folders.
  const std::string loaded = file.find('/') == std::string::npos ? "./" + file : file;
  void* handle = dlopen(loaded.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (handle == nullptr)
    throw std::runtime_error("cannot load the module: " + std::string(dlerror()));
  const auto get_table = reinterpret_cast<NUVA::GetAPITableFunction>(dlsym(handle, kEntryPoint));
  table_ = get_table == nullptr ? nullptr : get_table();
  if (table_ == nullptr) {
    dlclose(handle);
    throw std::runtime_error(file + ": not a module, as it gives no method table");
  }
}

const NUVA::APIMethod* Module::Find(const std::string& api, int version,
                                    const std::string& method) const {
  for (const NUVA::APIMethod* row = table_; row->api != nullptr; ++row) {
    if (row->api == api && row->version == version &&
        strcasecmp(row->method, method.c_str()) == 0) {
      return row;
    }
  }
  return nullptr;
}

}  // namespace nas
