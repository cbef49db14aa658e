#include "arbory/server/service/row_addresses.h"

#include <algorithm>

#include "arbory/server/transport/http_text.h"
#include "nas/base/utf8.h"
#include "nas/webapi/runner.h"

namespace arbory {
namespace {

constexpr char kPath[] = "path";
constexpr char kFiles[] = "files";

bool NeedsAddress(const Json::Value& row) {
  const char* begin = nullptr;
  const char* end = nullptr;
  return row.isObject() && row[kPath].getString(&begin, &end) &&
         !nas::IsUtf8({begin, static_cast<size_t>(end - begin)});
}

std::string AddressOf(std::string_view path) {
  std::string address;
  while (!path.empty()) {
    const size_t end = std::min(path.find('/'), path.size());
    address += PercentEncoded(path.substr(0, end));
    if (end < path.size()) address += '/';
    path.remove_prefix(std::min(end + 1, path.size()));
  }
  return address;
}

}  // namespace

void AddAddresses(Json::Value* rows) {
  for (Json::Value& row : *rows) {
    if (NeedsAddress(row)) row["path_encoded"] = AddressOf(row[kPath].asString());
  }
}

nas::Reply EncodeWithAddresses(int code, const Json::Value& data) {
  const Json::Value* files =
      data.isObject() ? data.find(kFiles, kFiles + sizeof kFiles - 1) : nullptr;
  // A page of a million rows is copied only where one of them needs it.
  if (files == nullptr || !files->isArray() ||
      std::none_of(files->begin(), files->end(), NeedsAddress)) {
    return nas::EncodeJsonReply(code, data);
  }
  Json::Value with_addresses = data;
  AddAddresses(&with_addresses[kFiles]);
  return nas::EncodeJsonReply(code, with_addresses);
}

}  // namespace arbory
