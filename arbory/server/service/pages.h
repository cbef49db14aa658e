#pragma once
// The page: files that were built from web/ and stand in one folder. Read at each request, as they
// are small and few, so that a newly built page is seen at once.

#include <string>
#include <vector>

#include "arbory/server/transport/http.h"

namespace arbory {

// The folder in use: the configured one, or the first there is of the installed and the built one;
// where the built one would be when there is none.
std::string FindWebFolder(const std::string& configured);

// The file at this path below the folder, "index.html" for none; 404 when there is none, and a text
// that says how to build the page when it is the page itself that is missing. With `takes_gzip` as
// the build compressed it, where it did.
HttpReply PageReply(const std::string& folder, const std::vector<std::string>& path,
                    bool takes_gzip);

}  // namespace arbory
