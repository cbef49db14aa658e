// Splitting of request parameters and rendering of file entries.

#include "platform/webfm.h"

#include <json/value.h>

#include <string_view>

#include "nas/base/json_text.h"

namespace nas {
namespace {

constexpr int kFirstVersionWithJsonText = 2;

// Elements that have no text (objects, arrays, null) are left out, so that nobody stumbles over
// them later.
Json::Value StringsOf(const Json::Value& array) {
  Json::Value strings(Json::arrayValue);
  for (const Json::Value& item : array) {
    if (item.isString()) {
      strings.append(item);
    } else if (item.isNumeric() || item.isBool()) {
      strings.append(JsonText(item, JsonBytes::kRaw));
    }
  }
  return strings;
}

Json::Value Split(std::string_view text, std::string_view separator, bool drop_empty) {
  Json::Value pieces(Json::arrayValue);
  std::string piece;
  const auto finish = [&] {
    if (!drop_empty || !piece.empty()) pieces.append(piece);
    piece.clear();
  };
  while (!text.empty()) {
    if (text[0] == '\\' && text.substr(1).starts_with(separator)) {
      piece += separator;
      text.remove_prefix(1 + separator.size());
    } else if (text.starts_with(separator)) {
      finish();
      text.remove_prefix(separator.size());
    } else {
      piece += text[0];
      text.remove_prefix(1);
    }
  }
  finish();
  return pieces;
}

// 0644 shows as 644: each octal digit becomes a decimal one.
int ModeAsDecimal(std::uint32_t mode) {
  constexpr std::uint32_t kOctalDigit = 7;
  constexpr int kOctalBits = 3;
  constexpr int kDigits = 4;  // set-id and sticky bits, owner, group, others
  int decimal = 0;
  for (int digit = kDigits - 1; digit >= 0; --digit) {
    constexpr int kTen = 10;
    decimal = decimal * kTen + static_cast<int>((mode >> (digit * kOctalBits)) & kOctalDigit);
  }
  return decimal;
}

// Keys that are neither copied into each object nor with it: a page may hold very many files.
using Key = Json::StaticString;

// A file's object with the members that most have, to be copied and filled in their order: a large
// page is made in a twentieth less time than by finding each by its name.
const Json::Value& FileObject(bool with_real_path) {
  static const Json::Value kObject = [] {
    Json::Value object(Json::objectValue);
    for (const char* name : {"is_dir", "name", "path"}) object[Key(name)];
    return object;
  }();
  static const Json::Value kWithRealPath = [] {
    Json::Value object = kObject;
    object[Key("real_path")];
    return object;
  }();
  return with_real_path ? kWithRealPath : kObject;
}

Json::Value OwnerOf(const DIRENTRY_INFO& entry) {
  Json::Value owner(Json::objectValue);
  owner[Key("user")] = entry.user;
  owner[Key("group")] = entry.group;
  owner[Key("uid")] = entry.uid;
  owner[Key("gid")] = entry.gid;
  return owner;
}

Json::Value TimesOf(const DIRENTRY_INFO& entry) {
  Json::Value times(Json::objectValue);
  times[Key("atime")] = entry.atime;
  times[Key("mtime")] = entry.mtime;
  times[Key("ctime")] = entry.ctime;
  times[Key("crtime")] = entry.crtime;
  return times;
}

Json::Value PermissionsOf(const DIRENTRY_INFO& entry) {
  Json::Value permissions(Json::objectValue);
  permissions[Key("mode")] = ModeAsDecimal(entry.mode);
  permissions[Key("privilege")] = entry.acl_privilege;
  permissions[Key("acl_mode")] = entry.acl_mode;
  return permissions;
}

}  // namespace
}  // namespace nas

Json::Value StringExplodeEx(const Json::Value& value, const char* separator, int api_version,
                            bool drop_empty) {
  using namespace nas;
  if (value.isArray()) return StringsOf(value);
  const std::string text = value.isString() ? value.asString() : std::string();
  if (text.empty()) return Json::Value(Json::arrayValue);
  if (api_version >= kFirstVersionWithJsonText) {
    const size_t first = text.find_first_not_of(" \t\r\n");
    Json::Value array;
    if (first != std::string::npos && text[first] == '[' && ParseJson(text, &array)) {
      return StringsOf(array);
    }
  }
  if (separator == nullptr || *separator == '\0') {
    Json::Value whole(Json::arrayValue);
    whole.append(text);
    return whole;
  }
  return Split(text, separator, drop_empty);
}

void DumpFileInfo(int additional, const DIRENTRY_INFO& entry, Json::Value& out, int /*reserved1*/,
                  int /*reserved2*/) {
  using namespace nas;
  enum Additional { kRealPath = 1, kSize = 2, kOwner = 4, kTime = 8, kPerm = 16, kType = 32 };
  out = FileObject((additional & kRealPath) != 0);
  auto member = out.begin();
  *member = entry.is_dir;
  *++member = entry.name;
  *++member = entry.path;
  if (additional & kRealPath) *++member = entry.real_path;
  if (additional & kSize) out[Key("size")] = static_cast<Json::UInt64>(entry.size);
  if (additional & kOwner) out[Key("owner")] = OwnerOf(entry);
  if (additional & kTime) out[Key("time")] = TimesOf(entry);
  if (additional & kPerm) out[Key("perm")] = PermissionsOf(entry);
  if (additional & kType) out[Key("type")] = entry.type;
}
