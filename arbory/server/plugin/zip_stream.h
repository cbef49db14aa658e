#pragma once
// Archives as the server's library makes them (server/service/library.h).

#include "arbory/server/service/library.h"

namespace arbory {

ZipStream* NewZip(int pipe);

}  // namespace arbory
