#include "arbory/rows.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <charconv>
#include <cstdio>
#include <ctime>

#include "arbory/terminal.h"
#include "nas/base/hex.h"
#include "nas/base/json_text.h"
#include "nas/base/utf8.h"
#include "nas/match/file_kinds.h"

namespace arbory {
namespace {

constexpr mode_t kPermissions = 07777;

void AppendNumber(std::int64_t number, std::string* out) {
  std::array<char, sizeof("-9223372036854775808")> text;
  out->append(text.data(), std::to_chars(text.begin(), text.end(), number).ptr);
}

char LetterOf(mode_t mode) {
  switch (mode & S_IFMT) {
    case S_IFDIR:
      return 'd';
    case S_IFLNK:
      return 'l';
    case S_IFIFO:
      return 'p';
    case S_IFSOCK:
      return 's';
    case S_IFCHR:
      return 'c';
    case S_IFBLK:
      return 'b';
    default:
      return '-';
  }
}

// "drwxr-xr-x", as ls shows it.
void AppendMode(mode_t mode, std::string* out) {
  *out += LetterOf(mode);
  constexpr char kLetters[] = "rwx";
  constexpr int kBits = 9;
  for (int bit = 0; bit < kBits; ++bit) {
    const bool set = (mode >> (kBits - 1 - bit) & 1) != 0;
    *out += set ? kLetters[bit % 3] : '-';
  }
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

void AppendEscapedJson(std::string_view text, std::string* out) {
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

// The members of an object, one after the other.
class JsonMembers {
 public:
  explicit JsonMembers(std::string* out) : out_(*out) {}
  std::string* Name(const char* name) {
    out_ += first_ ? "{\"" : ",\"";
    out_ += name;
    out_ += "\":";
    first_ = false;
    return &out_;
  }
  void Text(const char* name, std::string_view text) {
    nas::AppendJsonString(text, nas::JsonBytes::kClean, Name(name));
  }
  void Number(const char* name, std::int64_t number) { AppendNumber(number, Name(name)); }
  void End() { out_ += '}'; }

 private:
  std::string& out_;
  bool first_ = true;
};

void AppendTimes(const nas::FileAttributes& file, std::string* out) {
  JsonMembers time(out);
  time.Number("atime", file.atime);
  if (file.crtime == nas::FileAttributes::kNoTime) {
    *time.Name("crtime") += "null";
  } else {
    time.Number("crtime", file.crtime);
  }
  time.Number("ctime", file.ctime);
  time.Number("mtime", file.mtime);
  time.End();
}

std::string UpperCase(std::string_view text) {
  std::string upper(text);
  for (char& c : upper) c = static_cast<char>(toupper(static_cast<unsigned char>(c)));
  return upper;
}

}  // namespace

RowFormat FormatOf(const OutputOptions& options) {
  RowFormat format;
  if (options.json) format.kind = RowFormat::Kind::kJson;
  if (options.long_format) format.kind = RowFormat::Kind::kLong;
  if (options.null_separated) format.end = '\0';
  format.escape = isatty(STDOUT_FILENO) != 0 && !options.null_separated;
  return format;
}

std::string PathOfChoice(std::string_view line) {
  constexpr int kDigitBits = 4;
  const std::string_view digits = line.substr(0, line.find('\t'));
  if (digits.size() == line.size() || digits.size() % 2 != 0) return "";
  std::string path;
  for (size_t at = 0; at < digits.size(); at += 2) {
    const int high = nas::HexValue(digits[at]);
    const int low = nas::HexValue(digits[at + 1]);
    if (high < 0 || low < 0) return "";
    path += static_cast<char>(high << kDigitBits | low);
  }
  return path;
}

RowWriter::RowWriter(const RowFormat& format) : format_(format) {
  static const int never = 0;
  if (format.lines) scanner_.emplace(*format.lines, never);
}

void RowWriter::EnterFolder(const nas::ResultRow& row) {
  const bool same = !real_folder_.empty() && row.folder == folder_ && row.share_root == share_root_;
  if (same) return;
  share_root_ = row.share_root;
  folder_ = row.folder;
  const std::string real = share_root_ + (folder_.empty() ? "" : "/" + folder_);
  real_folder_ = real + "/";
  shown_folder_.clear();
  format_.paths.AppendFolder(real, &shown_folder_);
  if (format_.escape) shown_folder_ = Escaped(shown_folder_);
}

void RowWriter::AppendShown(const nas::ResultRow& row, std::string* out) const {
  *out += shown_folder_;
  if (format_.escape) {
    AppendEscaped(row.name, out);
  } else {
    *out += row.name;
  }
}

// Columns have fixed least widths, as rows are printed before the next ones are known.
void RowWriter::AppendLong(const nas::ResultRow& row, std::string* out) {
  const nas::FileAttributes& file = *row.attributes;
  constexpr size_t kNameWidth = 8;
  constexpr size_t kSizeWidth = 12;
  AppendMode(file.mode, out);
  *out += ' ';
  AppendPadded(Escaped(owners_.User(file.uid)), kNameWidth, out);
  AppendPadded(Escaped(owners_.Group(file.gid)), kNameWidth, out);
  const std::string size = std::to_string(file.size);
  if (size.size() < kSizeWidth) out->append(kSizeWidth - size.size(), ' ');
  *out += size + " " + LocalTime(file.mtime) + " ";
  AppendShown(row, out);
}

// ":NUMBER:TEXT", on a terminal with what was found in bold red.
void RowWriter::AppendLine(const nas::MatchingLine& line, std::string* out) const {
  constexpr char kMarked[] = "\033[1;31m";
  constexpr char kUnmarked[] = "\033[m";
  const std::string_view text = line.text;
  *out += ":" + std::to_string(line.number) + ":";
  if (!format_.escape) {
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

void RowWriter::AppendJson(const nas::ResultRow& row, const Line& line, std::string* out) {
  const nas::FileAttributes& file = *row.attributes;
  const bool is_folder = S_ISDIR(file.mode);
  json_.clear();
  JsonMembers members(&json_);
  *members.Name("is_dir") += is_folder ? "true" : "false";
  if (line) {
    JsonMembers found(members.Name("line"));
    found.Number("number", static_cast<std::int64_t>(line->number));
    found.Text("text", line->text);
    found.End();
  }
  members.Text("name", row.name);
  JsonMembers owner(members.Name("owner"));
  owner.Number("gid", file.gid);
  owner.Text("group", owners_.Group(file.gid));
  owner.Number("uid", file.uid);
  owner.Text("user", owners_.User(file.uid));
  owner.End();
  members.Text("path", "/" + std::string(row.share_name) + path_.substr(row.share_root.size()));
  char mode[sizeof("\"07777\"")];
  std::snprintf(mode, sizeof mode, "\"%04o\"", file.mode & kPermissions);
  JsonMembers permissions(members.Name("perm"));
  *permissions.Name("mode") += mode;
  permissions.End();
  members.Text("real_path", path_);
  members.Number("size", static_cast<std::int64_t>(file.size));
  AppendTimes(file, members.Name("time"));
  members.Text("type", is_folder ? "" : UpperCase(nas::ExtensionOf(row.name)));
  members.End();
  if (format_.escape) {
    AppendEscapedJson(json_, out);
  } else {
    *out += json_;
  }
}

void RowWriter::Append(const nas::ResultRow& row, std::string* out) {
  constexpr size_t kMostLineBytes = 4096;
  EnterFolder(row);
  path_.assign(real_folder_).append(row.name);
  Line line;
  if (scanner_ && S_ISREG(row.attributes->mode)) {
    line = scanner_->FirstLine(AT_FDCWD, path_.c_str(), kMostLineBytes);
  }
  switch (format_.kind) {
    case RowFormat::Kind::kPath:
      AppendShown(row, out);
      if (S_ISDIR(row.attributes->mode)) *out += '/';
      break;
    case RowFormat::Kind::kLong:
      AppendLong(row, out);
      break;
    case RowFormat::Kind::kJson:
      AppendJson(row, line, out);
      break;
    case RowFormat::Kind::kChoice:
      for (const char byte : path_) {
        nas::AppendHex(static_cast<unsigned char>(byte), nas::kLowerHex, out);
      }
      *out += '\t';
      AppendEscaped(path_, out);
      break;
  }
  if (line && format_.kind != RowFormat::Kind::kJson) AppendLine(*line, out);
  *out += format_.end;
}

}  // namespace arbory
