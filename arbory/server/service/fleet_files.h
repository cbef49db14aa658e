#pragma once
// Files of a fleet's boxes, by the addresses that the front's own files have,
// /files/BOX/SHARE/PATH: the child that would send a file asks the box in the user's name, and
// passes on what it is told as it comes. What the browser is told beside the bytes (type, name,
// policies) the front says itself, as a box that says otherwise would speak for the front's own
// page.

#include <string>

#include "arbory/server/service/files.h"

namespace arbory {

// Whether the request's share is a box of the configuration.
bool IsOnBox(const FileRequest& request);

// For the children of StartFile and StartFirstLine; they answer as those do, and 503 with the box's
// name where it cannot be asked.
void PassFileOn(const FileRequest& request, int pipe);
void PassFirstLineOn(const FileRequest& request, const std::string& pattern, bool with_text,
                     int pipe);

}  // namespace arbory
