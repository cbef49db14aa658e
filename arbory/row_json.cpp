#include "arbory/row_json.h"

#include <sys/stat.h>

#include <array>
#include <charconv>
#include <cstdio>

#include "nas/base/base64.h"
#include "nas/base/json_text.h"
#include "nas/base/utf8.h"

namespace arbory {
namespace {

constexpr mode_t kPermissions = 07777;

void AppendNumber(std::int64_t number, std::string* out) {
  std::array<char, sizeof("-9223372036854775808")> text;
  out->append(text.data(), std::to_chars(text.begin(), text.end(), number).ptr);
}

const char* TypeOf(mode_t mode) {
  switch (mode & S_IFMT) {
    case S_IFDIR:
      return "dir";
    case S_IFLNK:
      return "link";
    case S_IFIFO:
      return "pipe";
    case S_IFSOCK:
      return "socket";
    case S_IFCHR:
      return "char";
    case S_IFBLK:
      return "block";
    default:
      return "file";
  }
}

// Whether the JSON text holds a control character at that place, as only DEL and those of the
// second set still stand in one; how many bytes it has.
size_t ControlAt(std::string_view text, size_t at) {
  constexpr unsigned char kLead = 0xC2;
  constexpr unsigned char kBehindLast = 0xA0;
  const auto byte = static_cast<unsigned char>(text[at]);
  if (nas::IsControl(byte)) return 1;
  const bool second_set = byte == kLead && at + 1 < text.size() &&
                          static_cast<unsigned char>(text[at + 1]) < kBehindLast;
  return second_set ? 2 : 0;
}

void AppendTimes(const nas::FileAttributes& file, std::string* out) {
  *out += ",\"time\":{\"atime\":";
  AppendNumber(file.atime, out);
  *out += ",\"crtime\":";
  if (file.crtime == nas::FileAttributes::kNoTime) {
    *out += "null";
  } else {
    AppendNumber(file.crtime, out);
  }
  *out += ",\"ctime\":";
  AppendNumber(file.ctime, out);
  *out += ",\"mtime\":";
  AppendNumber(file.mtime, out);
  *out += '}';
}

}  // namespace

void JsonRows::Set(std::string_view bytes, Text* text) {
  text->bytes = bytes;
  text->whole = nas::IsUtf8(bytes);
  std::string& json = text->json;
  json.clear();
  nas::AppendJsonString(bytes, nas::JsonBytes::kClean, &json);
  json.pop_back();
  json.erase(0, 1);
}

void JsonRows::EnterFolder(std::string_view real_folder, std::string_view shown_folder) {
  Set(real_folder, &real_folder_);
  Set(shown_folder, &shown_folder_);
}

void JsonRows::AppendPath(const char* name, const Text& folder, const Text& file,
                          std::string* out) {
  out->append("\"").append(name).append("\":\"").append(folder.json).append(file.json) += '"';
  if (folder.whole && file.whole) return;
  out->append(",\"").append(name).append("_base64\":\"");
  nas::AppendBase64(folder.bytes + file.bytes, out);
  *out += '"';
}

void JsonRows::AppendOwner(const nas::FileAttributes& file, std::string* out) {
  *out += ",\"owner\":{\"gid\":";
  AppendNumber(file.gid, out);
  *out += ",\"group\":";
  nas::AppendJsonString(owners_.Group(file.gid), nas::JsonBytes::kClean, out);
  *out += ",\"uid\":";
  AppendNumber(file.uid, out);
  *out += ",\"user\":";
  nas::AppendJsonString(owners_.User(file.uid), nas::JsonBytes::kClean, out);
  *out += '}';
}

void JsonRows::Append(const nas::ResultRow& row, std::string* out) {
  static const Text kNoFolder;
  const nas::FileAttributes& file = *row.attributes;
  Set(row.name, &name_);
  *out += '{';
  AppendPath("path", shown_folder_, name_, out);
  *out += ',';
  AppendPath("real_path", real_folder_, name_, out);
  *out += ',';
  AppendPath("name", kNoFolder, name_, out);
  out->append(",\"type\":\"").append(TypeOf(file.mode)).append("\",\"is_dir\":");
  out->append(S_ISDIR(file.mode) ? "true" : "false").append(",\"size\":");
  AppendNumber(static_cast<std::int64_t>(file.size), out);
  AppendOwner(file, out);
  char mode[sizeof("07777")];
  std::snprintf(mode, sizeof mode, "%04o", file.mode & kPermissions);
  out->append(",\"perm\":{\"mode\":\"").append(mode).append("\"}");
  AppendTimes(file, out);
}

void JsonRows::AppendLine(const nas::MatchingLine& line, bool context, bool first,
                          std::string* out) {
  *out += first ? ",\"lines\":[{\"number\":" : ",{\"number\":";
  AppendNumber(static_cast<std::int64_t>(line.number), out);
  *out += ",\"text\":";
  nas::AppendJsonString(line.text, nas::JsonBytes::kClean, out);
  *out += context ? ",\"context\":true}" : "}";
}

void AppendShownJson(std::string_view text, std::string* out) {
  for (size_t at = 0; at < text.size();) {
    const size_t length = ControlAt(text, at);
    if (length == 0) {
      *out += text[at++];
      continue;
    }
    char escape[sizeof("\\u009b")];
    std::snprintf(escape, sizeof escape, "\\u%04x",
                  static_cast<unsigned char>(text[at + length - 1]));
    *out += escape;
    at += length;
  }
}

}  // namespace arbory
