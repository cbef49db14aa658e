#include "arbory/server/service/library.h"

#include "nas/system/own_library.h"

namespace arbory {

const ServerLibrary& LoadServerLibrary() {
  static const ServerLibrary& library = *reinterpret_cast<ServerLibraryEntry>(
      nas::LoadOwnLibrary("libarbory_server.so", kServerLibraryEntry))();
  return library;
}

}  // namespace arbory
