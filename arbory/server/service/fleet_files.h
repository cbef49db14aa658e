#pragma once
// Files of a fleet's boxes, by the addresses that the front's own files have,
// /files/BOX/SHARE/PATH: the child that would send a file asks the box in the user's name, and
// passes on what it is told as it comes. What the browser is told beside the bytes (type, name,
// policies) the front says itself, as a box that says otherwise would speak for the front's own
// page.

#include <cstdint>
#include <ctime>
#include <functional>
#include <string>
#include <string_view>

#include "arbory/server/service/files.h"
#include "nas/fleet/asker.h"

namespace arbory {

// Whether the request's share is a box of the configuration.
bool IsOnBox(const FileRequest& request);

// For the children of StartFile and StartFirstLine; they answer as those do, and 503 with the box's
// name where it cannot be asked.
void PassFileOn(const FileRequest& request, int pipe);
void PassFirstLineOn(const FileRequest& request, const std::string& pattern, bool with_text,
                     int pipe);

// Files of boxes for an archive, one after the other. For a child that has a signer and is its user
// for good.
class BoxFiles {
 public:
  BoxFiles();
  // Passes /BOX/SHARE/PATH, whose first "/" is left out, on: its length and time first, then its
  // bytes, until one of them says false. Gives 0, or why not: ENOENT, EACCES, EIO where it broke
  // off, and EHOSTDOWN where the box cannot be asked.
  int Fetch(const std::string& path,
            const std::function<bool(std::uint64_t bytes, std::time_t modified)>& begin,
            const std::function<bool(std::string_view piece)>& take);

 private:
  nas::FleetAsker asker_;
};

}  // namespace arbory
