#pragma once
// Loads a module of the web API, which is known by one exported function.

#include <string>

#include "platform/webapi.h"

namespace nas {

// A module, loaded for the rest of the process.
class Module {
 public:
  // Loads the module at `path`; empty: the configured one, or the one beside the program. Throws
  // std::runtime_error naming the file and the trouble.
  explicit Module(const std::string& path);

  // The row that serves the method: api and version exactly, the method ignoring letter case (a
  // client reaches clean-all by the method "Clean" with "action" = "cleanall"). Null when none
  // matches.
  const NUVA::APIMethod* Find(const std::string& api, int version, const std::string& method) const;
  // The table; ends with a row whose api is null.
  const NUVA::APIMethod* table() const { return table_; }

 private:
  const NUVA::APIMethod* table_ = nullptr;
};

}  // namespace nas
