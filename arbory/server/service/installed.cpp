#include "arbory/server/service/installed.h"

#include <unistd.h>

#include "nas/base/paths.h"

namespace arbory {

std::optional<std::string> FindInstalled(const std::string& name, const std::string& in_tree,
                                         const std::string& file) {
  const std::string program = nas::ProgramFolder();
  for (const std::string& place : {program + "../share/arbory/" + name, program + "../" + name,
                                   std::string(ARBORY_SOURCE_DIR "/") + in_tree}) {
    if (access((place + "/" + file).c_str(), R_OK) == 0) return place;
  }
  return std::nullopt;
}

}  // namespace arbory
