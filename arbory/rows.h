#pragma once
// The rows of a search as they are printed.

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "arbory/options.h"
#include "arbory/shown_paths.h"
#include "nas/base/accounts.h"
#include "nas/match/content_query.h"
#include "nas/match/content_scanner.h"
#include "nas/results/block_reader.h"

namespace arbory {

struct RowFormat {
  // kPath ends folders with a "/". kChoice is for a picker that shows text and cannot be trusted
  // with a path's bytes: the path in hexadecimal digits, a tab, and the path as a terminal may show
  // it.
  enum class Kind { kPath, kLong, kJson, kChoice };
  Kind kind = Kind::kPath;
  ShownPaths paths = {};  // not of kJson and kChoice, which hold paths as they are on disk
  char end = '\n';
  bool escape = false;  // for a terminal
  // Where given, the first line is told of each file whose contents hold what it asks for.
  std::shared_ptr<const nas::ContentQuery> lines = {};
};

// For standard output.
RowFormat FormatOf(const OutputOptions& options);

// The path of a line of kChoice, without its end; empty for any other line.
std::string PathOfChoice(std::string_view line);

// For one thread. Borrows the format.
class RowWriter {
 public:
  explicit RowWriter(const RowFormat& format);

  // Appends the row with its end.
  void Append(const nas::ResultRow& row, std::string* out);

 private:
  using Line = std::optional<nas::MatchingLine>;

  void EnterFolder(const nas::ResultRow& row);
  void AppendShown(const nas::ResultRow& row, std::string* out) const;
  void AppendLong(const nas::ResultRow& row, std::string* out);
  void AppendJson(const nas::ResultRow& row, const Line& line, std::string* out);
  void AppendLine(const nas::MatchingLine& line, std::string* out) const;

  const RowFormat& format_;
  nas::AccountTexts owners_;
  std::optional<nas::ContentScanner> scanner_;
  // Of the row before, whose folder most rows share.
  std::string share_root_;
  std::string folder_;
  std::string real_folder_;   // on disk, with a final "/"
  std::string shown_folder_;  // as it is printed
  std::string path_;          // of the row, on disk
  std::string json_;
};

}  // namespace arbory
