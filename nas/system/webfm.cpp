// Splitting of request parameters and rendering of file entries.

#include "platform/webfm.h"

#include <json/value.h>

#include <algorithm>
#include <array>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "nas/base/json_text.h"
#include "nas/system/request_bounds.h"

namespace nas {
namespace {

constexpr int kFirstVersionWithJsonText = 2;

void CheckPieces(size_t count) {
  if (count > kMostPieces) {
    throw TooManyPieces("more than " + std::to_string(kMostPieces) + " values in one parameter");
  }
}

// Elements that have no text (objects, arrays, null) are left out, so that nobody stumbles over
// them later.
Json::Value StringsOf(const Json::Value& array) {
  CheckPieces(array.size());
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
    CheckPieces(pieces.size());
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

enum Additional { kRealPath = 1, kSize = 2, kOwner = 4, kTime = 8, kPerm = 16, kType = 32 };
constexpr size_t kAdditionalMasks = 64;

struct Member {
  const char* name;
  int asked_by;  // bit of `additional`; 0: always there
  void (*fill)(const DIRENTRY_INFO& entry, Json::Value& value);
};

// An object for a file, its members not filled yet, and those members in the order in which the
// object holds them. Copying it and filling the copy from end to end takes less than finding or
// adding each member by its name.
struct Shape {
  Json::Value object;
  std::vector<const Member*> members;
};

Shape ShapeOf(std::span<const Member> members, int additional) {
  Shape shape{Json::Value(Json::objectValue), {}};
  for (const Member& member : members) {
    if (member.asked_by == 0 || (additional & member.asked_by)) shape.object[Key(member.name)];
  }
  for (auto it = shape.object.begin(); it != shape.object.end(); ++it) {
    shape.members.push_back(
        &*std::ranges::find_if(members, [&](const Member& m) { return it.name() == m.name; }));
  }
  return shape;
}

void Fill(const Shape& shape, const DIRENTRY_INFO& entry, Json::Value& out) {
  out = shape.object;
  auto member = shape.members.begin();
  for (Json::Value& value : out) (*member++)->fill(entry, value);
}

// A member that is an object of these.
template <const auto& kParts>
void FillParts(const DIRENTRY_INFO& entry, Json::Value& value) {
  thread_local const Shape shape = ShapeOf(kParts, 0);
  Fill(shape, entry, value);
}

template <auto kField>
void FillField(const DIRENTRY_INFO& entry, Json::Value& value) {
  value = entry.*kField;
}

using Entry = DIRENTRY_INFO;
constexpr Member kOwnerParts[] = {{"user", 0, FillField<&Entry::user>},
                                  {"group", 0, FillField<&Entry::group>},
                                  {"uid", 0, FillField<&Entry::uid>},
                                  {"gid", 0, FillField<&Entry::gid>}};
constexpr Member kTimeParts[] = {{"atime", 0, FillField<&Entry::atime>},
                                 {"mtime", 0, FillField<&Entry::mtime>},
                                 {"ctime", 0, FillField<&Entry::ctime>},
                                 {"crtime", 0, FillField<&Entry::crtime>}};
constexpr Member kPermissionParts[] = {
    {"mode", 0, [](const Entry& entry, Json::Value& value) { value = ModeAsDecimal(entry.mode); }},
    {"privilege", 0, FillField<&Entry::acl_privilege>},
    {"acl_mode", 0, FillField<&Entry::acl_mode>}};
constexpr Member kMembers[] = {
    {"name", 0, FillField<&Entry::name>},
    {"path", 0, FillField<&Entry::path>},
    {"is_dir", 0, FillField<&Entry::is_dir>},
    {"real_path", kRealPath, FillField<&Entry::real_path>},
    {"size", kSize, FillField<&Entry::size>},
    {"owner", kOwner, FillParts<kOwnerParts>},
    {"time", kTime, FillParts<kTimeParts>},
    {"perm", kPerm, FillParts<kPermissionParts>},
    {"type", kType, FillField<&Entry::type>},
};

const Shape& KnownShape(int additional) {
  thread_local std::array<Shape, kAdditionalMasks> shapes;
  Shape& shape = shapes[static_cast<size_t>(additional) % kAdditionalMasks];
  if (shape.members.empty()) shape = ShapeOf(kMembers, additional);
  return shape;
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
  nas::Fill(nas::KnownShape(additional), entry, out);
}
