#pragma once
// The rows of a search as they are printed.

#include <functional>
#include <list>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "arbory/ls_colors.h"
#include "arbory/options.h"
#include "arbory/path_template.h"
#include "arbory/row_json.h"
#include "arbory/row_long.h"
#include "arbory/shown_paths.h"
#include "nas/match/content_query.h"
#include "nas/match/content_scanner.h"
#include "nas/results/block_reader.h"

namespace arbory {

struct RowFormat {
  // kNone counts rows only. kPath ends folders with a "/". kChoice is for a picker that shows text
  // and cannot be trusted with a path's bytes: the path in hexadecimal digits, a tab, and the path
  // as a terminal may show it.
  enum class Kind { kNone, kPath, kLong, kJson, kTemplate, kChoice };
  using Lines = std::vector<nas::ContentQuery>;
  Kind kind = Kind::kPath;
  ShownPaths paths = {};
  char end = '\n';
  bool escape = false;                             // for a terminal
  std::shared_ptr<const LsColors> colors = {};     // null: none
  std::shared_ptr<const PathTemplate> shape = {};  // of kTemplate
  std::shared_ptr<const Lines> lines = {};         // null: no lines are told
  nas::LinesWanted lines_wanted = {};
  // Takes what has come together within a row that tells of very many lines; false: no more is
  // wanted.
  std::function<bool(std::string* text)> spill = {};

  // Whether a row's name and type are all that is printed of it.
  bool names_alone() const {
    const bool names = kind == Kind::kPath || kind == Kind::kTemplate || kind == Kind::kNone;
    return names && colors == nullptr;
  }
};

// For standard output. Throws UsageError for options that exclude each other.
RowFormat FormatOf(const OutputOptions& options);

// The path of a line of kChoice, without its end; empty for any other line.
std::string PathOfChoice(std::string_view line);

// For one thread. Borrows the format.
class RowWriter {
 public:
  explicit RowWriter(const RowFormat& format);

  // Appends the row with its end.
  void Append(const nas::ResultRow& row, std::string* out);
  // Of another machine's account.
  void NameAccount(std::uint32_t id, const std::string& name) {
    columns_.owners().Know(id, name);
    json_.owners().Know(id, name);
  }

 private:
  void EnterFolder(const nas::ResultRow& row);
  void AppendText(std::string_view text, std::string* out) const;
  void AppendShown(const nas::ResultRow& row, bool slash, std::string* out);
  void AppendTarget(std::string* out) const;
  void AppendTemplate(const nas::ResultRow& row, std::string* out);
  void AppendJson(const nas::ResultRow& row, std::string* out);
  void AppendChoice(std::string* out) const;
  // False where nothing was told.
  bool AppendLines(const nas::ResultRow& row, std::string* out);
  void AppendLine(const nas::MatchingLine& line, bool matches, std::string* out) const;
  void EachLine(const nas::ResultRow& row, const nas::ContentScanner::TellLine& tell);
  bool Spill(std::string* out) const;

  const RowFormat& format_;
  LongColumns columns_;
  JsonRows json_;
  std::list<nas::ContentScanner> scanners_;  // for the lines, the first that tells any
  bool told_lines_ = false;                  // of any row
  // Of the row before, whose folder most rows share.
  std::string share_root_;
  std::string folder_;
  std::string real_folder_;   // on disk, with a final "/"
  std::string shown_folder_;  // as it is named
  std::string text_folder_;   // as it is printed
  std::string path_;          // of the row, on disk
  std::string text_;
};

}  // namespace arbory
