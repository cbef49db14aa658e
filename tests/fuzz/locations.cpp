// Locations as clients write them: what is opened lies in the share that the text begins with.

#include "search/locations.h"
#include "nas/base/paths.h"
#include "nas/search/location.h"
#include "platform/webfm.h"
#include "search/find_handler.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/module_calls.h"

namespace {

std::string PathOf(const nas::Location& location) {
  const auto path = nas::RealPath("/proc/self/fd/" + std::to_string(location.fd.get()));
  DEMAND(path.ok());
  return *path;
}

void CheckOpening(const std::string& text) {
  const auto location = nas::OpenLocation(text);
  if (!location) {
    DEMAND(location.error().kind != nas::kErrorNone && location.error().path == text);
    return;
  }
  const std::string path = PathOf(*location);
  DEMAND(nas::IsWithin(path, location->share.root));
  DEMAND(nas::IsWithin(location->share.root, fuzz::Scratch() + "/volume1"));
  DEMAND(!nas::IsWithin(path, fuzz::Scratch() + "/volume1/@tmp"));
  // The tidied form is the same folder.
  const std::string tidy =
      "/" + location->share.name + (location->path.empty() ? "" : "/" + location->path);
  const auto again = nas::OpenLocation(tidy);
  DEMAND(again && again->inode == location->inode && again->device == location->device);
  DEMAND(again->path == location->path);
}

// Tidying twice changes nothing more, and nobody's own home is left under its alias.
void CheckTidying(const std::string& text) {
  fuzz::Request request({});
  const ArboryFindHandler handler(&request, nullptr);
  const Json::Value locations = StringExplodeEx(text, ",", 1, false);
  const Json::Value tidy = handler.RemoveDuplicatedLocations(locations);
  DEMAND(tidy.size() <= locations.size());
  DEMAND(handler.RemoveDuplicatedLocations(tidy) == tidy);
  for (const Json::Value& location : tidy) {
    DEMAND(location != "/home" && !location.asString().starts_with("/home/"));
  }
}

}  // namespace

int fuzz::Target(std::string_view input) {
  PreparePlatform();
  const std::string text(input);
  CheckOpening(text);
  CheckTidying(text);
  return fuzz::kUsed;
}
