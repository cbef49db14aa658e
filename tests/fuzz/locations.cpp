// Locations as clients write them: what is opened lies in the share that the text begins with.

#include <unistd.h>

#include <filesystem>

#include "nas/base/paths.h"
#include "nas/search/location.h"
#include "platform/webfm.h"
#include "search/find_handler.h"
#include "search/locations.h"
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

class NoResponse : public NUVA::APIResponse {
 public:
  void SetError(int /*code*/, const Json::Value& /*data*/) override {}
};

class UsersRequest : public NUVA::APIRequest {
 public:
  std::string GetLoginUserName() const override { return fuzz::User(); }
  std::string GetSessionID() const override { return {}; }
  std::string GetPreferenceDir() const override { return {}; }
  std::string GetAPIMethod() const override { return {}; }
  int GetAPIVersion() const override { return 1; }
  bool HasParam(const std::string& /*name*/) const override { return false; }
  Json::Value GetParam(const std::string& /*name*/, const Json::Value& other) const override {
    return other;
  }
};

// Tidying twice changes nothing more, and nobody's own home is left under its alias.
void CheckTidying(const std::string& text) {
  UsersRequest request;
  NoResponse response;
  const ArboryFindHandler handler(&request, &response);
  const Json::Value locations = StringExplodeEx(text, ",", 1, false);
  const Json::Value tidy = handler.RemoveDuplicatedLocations(locations);
  DEMAND(tidy.size() <= locations.size());
  DEMAND(handler.RemoveDuplicatedLocations(tidy) == tidy);
  for (const Json::Value& location : tidy) {
    DEMAND(location != "/home" && !location.asString().starts_with("/home/"));
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::PreparePlatform();
  const std::string text(fuzz::Text(data, size));
  const int free = fuzz::LowestFreeDescriptor();
  CheckOpening(text);
  CheckTidying(text);
  DEMAND(fuzz::LowestFreeDescriptor() == free);
  return fuzz::kUsed;
}
