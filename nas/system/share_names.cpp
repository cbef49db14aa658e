#include "nas/system/share_names.h"

#include <algorithm>

#include "nas/base/utf8.h"

namespace nas {
namespace {

constexpr size_t kMaxNameBytes = 255;
constexpr char kHomeAlias[] = "home";

}  // namespace

std::string TroubleWithShareName(const std::string& name) {
  if (name.empty()) return "the name is empty";
  if (name == "." || name == "..") return "this cannot be a name";
  if (name.size() > kMaxNameBytes) return "the name is longer than 255 bytes";
  if (name == kHomeAlias) return "the name stands for every user's own home";
  for (const unsigned char byte : name) {
    if (byte == '/' || byte == ',') return std::string("the name holds \"") + char(byte) + "\"";
    if (IsControl(byte)) return "the name holds a control character";
  }
  return {};
}

std::string TroubleWithShareRoot(const std::string& name, const std::string& root) {
  constexpr std::string_view kHomesFolder = "/homes/";
  const std::string path = root + "/";
  const size_t at = path.find(kHomesFolder);
  if (name == kHomesShare) {
    if (at != std::string::npos && at + kHomesFolder.size() == path.size()) return {};
    return "its directory must be called \"homes\", with no other \"homes\" on the way to it: " +
           (root.empty() ? path : root);
  }
  if (at == std::string::npos) return {};
  return "its directory lies in a folder \"homes\", which belongs to the share \"homes\" alone: " +
         root;
}

}  // namespace nas
