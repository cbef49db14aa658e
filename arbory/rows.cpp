#include "arbory/rows.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cstdlib>

#include "arbory/interrupt.h"
#include "arbory/terminal.h"
#include "nas/base/hex.h"

namespace arbory {
namespace {

// As grep colours what it prints.
constexpr std::string_view kPathColour = "35";
constexpr std::string_view kNumberColour = "32";
constexpr std::string_view kMarkColour = "36";  // of what stands between
constexpr std::string_view kFoundColour = "01;31";

constexpr size_t kMostLineBytes = 4096;
// Held of a row with very many lines.
constexpr size_t kSpillBytes = 1 << 20;

void BeginColour(std::string_view code, std::string* out) {
  if (!code.empty()) out->append("\033[").append(code) += 'm';
}
void EndColour(std::string_view code, std::string* out) {
  if (!code.empty()) *out += "\033[0m";
}
void AppendColoured(std::string_view text, std::string_view code, std::string* out) {
  BeginColour(code, out);
  *out += text;
  EndColour(code, out);
}

std::string_view Environment(const char* name) {
  const char* const value = getenv(name);
  return value == nullptr ? std::string_view() : value;
}

bool WantsColours(const OutputOptions& options, bool terminal) {
  if (options.color != ColorUse::kAuto) return options.color == ColorUse::kAlways;
  return terminal && !options.null_separated && Environment("NO_COLOR").empty() && KnowsControls();
}

void CheckOnlyOne(const OutputOptions& options) {
  const std::pair<bool, const char*> forms[] = {{options.long_format, "--long"},
                                                {options.json, "--json"},
                                                {!options.format.empty(), "--format"},
                                                {options.count, "--count"},
                                                {options.quiet, "--quiet"},
                                                {!options.exec.empty(), "--exec"},
                                                {!options.exec_batch.empty(), "--exec-batch"},
                                                {options.lines && !options.json, "--line-number"}};
  const char* first = nullptr;
  for (const auto& [given, name] : forms) {
    if (!given) continue;
    if (first != nullptr) {
      throw UsageError(std::string(first) + " and " + name + " exclude each other");
    }
    first = name;
  }
  const bool whole_paths = options.format.empty() && first != nullptr;
  if (options.null_separated && whole_paths) {
    throw UsageError(std::string("--print0 and ") + first + " exclude each other");
  }
}

RowFormat::Kind KindOf(const OutputOptions& options) {
  if (options.count || options.quiet) return RowFormat::Kind::kNone;
  if (options.json) return RowFormat::Kind::kJson;
  if (options.long_format) return RowFormat::Kind::kLong;
  const bool shaped = !options.format.empty() || options.runs();
  return shaped ? RowFormat::Kind::kTemplate : RowFormat::Kind::kPath;
}

}  // namespace

RowFormat FormatOf(const OutputOptions& options) {
  CheckOnlyOne(options);
  RowFormat format;
  const bool terminal = isatty(STDOUT_FILENO) != 0;
  format.kind = KindOf(options);
  if (options.null_separated || options.runs()) format.end = '\0';
  format.escape = terminal && format.end != '\0';
  if (format.kind == RowFormat::Kind::kTemplate) {
    format.shape = std::make_shared<PathTemplate>(options.runs() ? "{}" : options.format);
  }
  const bool colourful =
      format.kind == RowFormat::Kind::kPath || format.kind == RowFormat::Kind::kLong;
  if (colourful && WantsColours(options, terminal)) {
    format.colors = std::make_shared<LsColors>(Environment("LS_COLORS"));
  }
  format.lines_wanted = {kMostLineBytes, options.before, options.after};
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
  if (!format.lines) return;
  for (const nas::ContentQuery& query : *format.lines)
    scanners_.emplace_back(query, InterruptFlag());
}

void RowWriter::AppendText(std::string_view text, std::string* out) const {
  if (format_.escape) {
    AppendEscaped(text, out);
  } else {
    *out += text;
  }
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
  text_folder_.clear();
  const bool ls = format_.colors != nullptr && format_.lines == nullptr && !shown_folder_.empty();
  const std::string_view code = ls ? format_.colors->folder() : std::string_view();
  BeginColour(code, &text_folder_);
  AppendText(shown_folder_, &text_folder_);
  EndColour(code, &text_folder_);
  if (format_.kind == RowFormat::Kind::kJson) json_.EnterFolder(real_folder_, shown_folder_);
}

void RowWriter::AppendShown(const nas::ResultRow& row, bool slash, std::string* out) {
  *out += text_folder_;
  const bool ls = format_.colors != nullptr && format_.lines == nullptr;
  const std::string_view code =
      ls ? format_.colors->Of(row.name, row.attributes->mode, path_.c_str()) : std::string_view();
  BeginColour(code, out);
  AppendText(row.name, out);
  if (slash && S_ISDIR(row.attributes->mode)) *out += '/';
  EndColour(code, out);
}

// Where a symbolic link leads to, as ls shows it.
void RowWriter::AppendTarget(std::string* out) const {
  std::array<char, 4096> target;  // no link is longer
  const ssize_t length = readlink(path_.c_str(), target.data(), target.size());
  if (length <= 0) return;
  *out += " -> ";
  AppendText({target.data(), static_cast<size_t>(length)}, out);
}

void RowWriter::AppendTemplate(const nas::ResultRow& row, std::string* out) {
  text_.assign(shown_folder_).append(row.name);
  AppendText(format_.shape->Of(text_), out);
}

void RowWriter::AppendChoice(std::string* out) const {
  for (const char byte : path_) {
    nas::AppendHex(static_cast<unsigned char>(byte), nas::kLowerHex, out);
  }
  *out += '\t';
  AppendEscaped(path_, out);
}

bool RowWriter::Spill(std::string* out) const {
  return out->size() < kSpillBytes || !format_.spill || format_.spill(out);
}

void RowWriter::EachLine(const nas::ResultRow& row, const nas::ContentScanner::TellLine& tell) {
  if (!S_ISREG(row.attributes->mode)) return;
  bool told = false;
  const auto hear = [&](const nas::MatchingLine& line, bool matches) {
    told = true;
    return tell(line, matches);
  };
  for (nas::ContentScanner& scanner : scanners_) {
    if (!told) scanner.EachLine(AT_FDCWD, path_.c_str(), format_.lines_wanted, hear);
  }
}

// "12:TEXT", or "11-TEXT" of a line that only stands near one that matches.
void RowWriter::AppendLine(const nas::MatchingLine& line, bool matches, std::string* out) const {
  const bool colours = format_.colors != nullptr;
  const auto code = [&](std::string_view colour) { return colours ? colour : std::string_view(); };
  const std::string_view mark = matches ? ":" : "-";
  AppendColoured(mark, code(kMarkColour), out);
  AppendColoured(std::to_string(line.number), code(kNumberColour), out);
  AppendColoured(mark, code(kMarkColour), out);
  const std::string_view text = line.text;
  size_t at = 0;
  for (const auto& [from, length] : line.marks) {
    AppendText(text.substr(at, from - at), out);
    BeginColour(code(kFoundColour), out);
    AppendText(text.substr(from, length), out);
    EndColour(code(kFoundColour), out);
    at = from + length;
  }
  AppendText(text.substr(at), out);
  *out += format_.end;
}

bool RowWriter::AppendLines(const nas::ResultRow& row, std::string* out) {
  const bool colours = format_.colors != nullptr;
  const auto code = [&](std::string_view colour) { return colours ? colour : std::string_view(); };
  std::string path;
  BeginColour(code(kPathColour), &path);
  AppendShown(row, false, &path);
  EndColour(code(kPathColour), &path);
  const bool groups = format_.lines_wanted.before > 0 || format_.lines_wanted.after > 0;
  std::uint64_t last = 0;
  EachLine(row, [&](const nas::MatchingLine& line, bool matches) {
    if (groups && told_lines_ && (last == 0 || line.number != last + 1)) {
      AppendColoured("--", code(kMarkColour), out);
      *out += format_.end;
    }
    *out += path;
    AppendLine(line, matches, out);
    last = line.number;
    told_lines_ = true;
    return Spill(out);
  });
  return last > 0;
}

void RowWriter::AppendJson(const nas::ResultRow& row, std::string* out) {
  text_.clear();
  std::string& json = format_.escape ? text_ : *out;
  json_.Append(row, &json);
  bool first = true;
  EachLine(row, [&](const nas::MatchingLine& line, bool matches) {
    JsonRows::AppendLine(line, !matches, std::exchange(first, false), &json);
    return format_.escape || Spill(out);
  });
  json += first ? "}" : "]}";
  if (format_.escape) AppendShownJson(text_, out);
  *out += format_.end;
}

void RowWriter::Append(const nas::ResultRow& row, std::string* out) {
  if (format_.kind == RowFormat::Kind::kNone) return;
  EnterFolder(row);
  const bool on_disk = format_.colors || format_.lines ||
                       format_.kind == RowFormat::Kind::kChoice ||
                       format_.kind == RowFormat::Kind::kLong;
  if (on_disk) path_.assign(real_folder_).append(row.name);
  switch (format_.kind) {
    case RowFormat::Kind::kNone:
      return;
    case RowFormat::Kind::kPath:
      if (format_.lines && AppendLines(row, out)) return;
      AppendShown(row, true, out);
      break;
    case RowFormat::Kind::kLong:
      columns_.Append(*row.attributes, out);
      AppendShown(row, false, out);
      if (S_ISLNK(row.attributes->mode)) AppendTarget(out);
      break;
    case RowFormat::Kind::kJson:
      return AppendJson(row, out);
    case RowFormat::Kind::kTemplate:
      AppendTemplate(row, out);
      break;
    case RowFormat::Kind::kChoice:
      AppendChoice(out);
      break;
  }
  *out += format_.end;
}

}  // namespace arbory
