#include "arbory/rows.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cstdio>
#include <ctime>
#include <optional>

#include "arbory/terminal.h"
#include "nas/base/json_text.h"
#include "nas/base/utf8.h"
#include "nas/match/content_scanner.h"

namespace arbory {
namespace {

constexpr int kCodeNoListing = 600;  // the API's for results that cannot be listed

std::string_view TextOf(const Json::Value& value) {
  const char* begin = nullptr;
  const char* end = nullptr;
  if (!value.isString() || !value.getString(&begin, &end)) return {};
  return {begin, static_cast<size_t>(end - begin)};
}

void AppendName(std::string_view name, const RowFormat& format, std::string* out) {
  if (format.escape) {
    AppendEscaped(name, out);
  } else {
    *out += name;
  }
}

// "drwxr-xr-x" from the listing's decimal number whose digits are the octal ones.
std::string ModeText(const Json::Value& file, const std::string& real_path) {
  constexpr int kTen = 10;
  std::string text = "-";
  struct stat info;
  if (file["is_dir"].asBool()) {
    text = "d";
  } else if (lstat(real_path.c_str(), &info) == 0 && S_ISLNK(info.st_mode)) {
    text = "l";
  }
  const int mode = file["perm"]["mode"].asInt();
  for (int divisor = kTen * kTen; divisor > 0; divisor /= kTen) {
    const int digit = mode / divisor % kTen;
    text += (digit & S_IROTH) != 0 ? 'r' : '-';
    text += (digit & S_IWOTH) != 0 ? 'w' : '-';
    text += (digit & S_IXOTH) != 0 ? 'x' : '-';
  }
  return text;
}

std::string LocalTime(std::time_t seconds) {
  std::tm local = {};
  localtime_r(&seconds, &local);
  char text[sizeof("-2147483648-12-31 23:59")];
  return {text, std::strftime(text, sizeof text, "%Y-%m-%d %H:%M", &local)};
}

void AppendPadded(const std::string& text, size_t width, std::string* out) {
  *out += text;
  if (text.size() < width) out->append(width - text.size(), ' ');
  *out += ' ';
}

// Columns have fixed least widths, as rows are printed before the next ones are known.
void AppendLong(const Json::Value& file, const RowFormat& format, std::string* out) {
  constexpr size_t kNameWidth = 8;
  constexpr size_t kSizeWidth = 12;
  const std::string path(TextOf(file["real_path"]));
  *out += ModeText(file, path) + " ";
  AppendPadded(Escaped(TextOf(file["owner"]["user"])), kNameWidth, out);
  AppendPadded(Escaped(TextOf(file["owner"]["group"])), kNameWidth, out);
  const std::string size = std::to_string(file["size"].asUInt64());
  if (size.size() < kSizeWidth) out->append(kSizeWidth - size.size(), ' ');
  *out += size + " " + LocalTime(file["time"]["mtime"].asInt64()) + " ";
  AppendName(path, format, out);
}

using Line = std::optional<nas::MatchingLine>;

// ":NUMBER:TEXT", on a terminal with what was found in bold red.
void AppendLine(const nas::MatchingLine& line, const RowFormat& format, std::string* out) {
  constexpr char kMarked[] = "\033[1;31m";
  constexpr char kUnmarked[] = "\033[m";
  const std::string_view text = line.text;
  *out += ":" + std::to_string(line.number) + ":";
  if (!format.escape) {
    *out += text;
    return;
  }
  size_t at = 0;
  for (const auto& [from, length] : line.marks) {
    AppendEscaped(text.substr(at, from - at), out);
    *out += kMarked;
    AppendEscaped(text.substr(from, length), out);
    *out += kUnmarked;
    at = from + length;
  }
  AppendEscaped(text.substr(at), out);
}

// Control characters are escaped by JSON itself, all but DEL and those of the second set.
void AppendJsonRow(Json::Value file, const Line& line, const RowFormat& format, std::string* out) {
  if (line) {
    file["line"]["number"] = Json::UInt64{line->number};
    file["line"]["text"] = line->text;
  }
  std::string text = nas::JsonText(file, nas::JsonBytes::kClean);
  if (format.escape) {
    for (size_t at = 0; at < text.size(); ++at) {
      const auto byte = static_cast<unsigned char>(text[at]);
      const bool second_set =
          byte == 0xC2 && at + 1 < text.size() && static_cast<unsigned char>(text[at + 1]) < 0xA0;
      if (!nas::IsControl(byte) && !second_set) continue;
      const unsigned code = second_set ? static_cast<unsigned char>(text[at + 1]) : byte;
      char escape[sizeof("\\u009b")];
      std::snprintf(escape, sizeof escape, "\\u%04x", code);
      text.replace(at, second_set ? 2 : 1, escape);
    }
  }
  *out += text;
}

void AppendRow(const Json::Value& file, const Line& line, const RowFormat& format,
               std::string* out) {
  switch (format.kind) {
    case RowFormat::Kind::kPath:
      AppendName(TextOf(file["real_path"]), format, out);
      break;
    case RowFormat::Kind::kLong:
      AppendLong(file, format, out);
      break;
    case RowFormat::Kind::kJson:
      AppendJsonRow(file, line, format, out);
      break;
  }
  if (line && format.kind != RowFormat::Kind::kJson) AppendLine(*line, format, out);
  *out += format.end;
}

}  // namespace

Json::Value RowFormat::Additional() const {
  Json::Value names(Json::arrayValue);
  names.append("real_path");
  if (kind == Kind::kPath) return names;
  for (const char* name : {"size", "owner", "time", "perm", "type"}) names.append(name);
  return names;
}

nas::ReplyEncoder PageEncoder(const RowFormat& format) {
  return [format](int code, const Json::Value& data) {
    const bool listed = data.isObject();
    const Json::Value& files = listed ? data["files"] : Json::Value::nullSingleton();
    const bool finished = listed && data["finished"].asBool();
    const Json::Value& total = listed ? data["total"] : Json::Value::nullSingleton();
    // Without a total it is that of a search whose record is gone, or could not be read this time.
    const bool gone = code == 0 && !total.isNumeric();
    nas::Reply reply{{.code = gone ? kCodeNoListing : code},
                     (finished ? "1 " : "0 ") + std::to_string(files.size()) + " " +
                         std::to_string(gone ? 0 : total.asUInt()) + "\n"};
    constexpr size_t kUsualRowBytes = 128;
    reply.body.reserve(reply.body.size() + files.size() * kUsualRowBytes);
    constexpr size_t kMostLineBytes = 4096;
    const int never = 0;
    std::optional<nas::ContentScanner> scanner;
    if (format.lines) scanner.emplace(*format.lines, never);
    for (const Json::Value& file : files) {
      Line line;
      if (scanner && !file["is_dir"].asBool()) {
        const std::string path(TextOf(file["real_path"]));
        line = scanner->FirstLine(AT_FDCWD, path.c_str(), kMostLineBytes);
      }
      AppendRow(file, line, format, &reply.body);
    }
    return reply;
  };
}

Page::Page(nas::Reply reply) : body_(std::move(reply.body)) {
  int finished = 0;
  unsigned long long rows = 0;
  unsigned long long total = 0;
  int used = 0;
  constexpr int kNumbers = 3;
  if (std::sscanf(body_.c_str(), "%d %llu %llu%n", &finished, &rows, &total, &used) != kNumbers) {
    return;
  }
  code_ = reply.head.code;
  finished_ = finished != 0;
  rows_ = rows;
  total_ = total;
  text_at_ = static_cast<size_t>(used) + 1;
}

}  // namespace arbory
