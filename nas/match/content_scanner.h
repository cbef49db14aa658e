#pragma once
// The reading of one file to answer a content query: whether it matches, and where.

#include <atomic>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "nas/base/unique_fd.h"
#include "nas/match/content_query.h"
#include "nas/match/text_reader.h"

namespace nas {

// The first line that holds something a query asks for.
struct MatchingLine {
  std::uint64_t number = 0;  // from 1
  // Without its end, in UTF-8 as far as it can be told; cut to a bound, with an ellipsis where
  // something is left out. It always holds the first mark's beginning.
  std::string text;
  std::vector<std::pair<size_t, size_t>> marks;  // places and lengths in `text` of what was found
};

// Which lines of a file are told of.
struct LinesWanted {
  size_t most_bytes = 0;  // of each, as of MatchingLine
  // How many lines before and after one that matches.
  size_t before = 0;
  size_t after = 0;
};

// Reads files for one thread. Query and flag are borrowed. Its buffer (256 KiB, more for a very
// long text) is made once.
class ContentScanner {
 public:
  explicit ContentScanner(const ContentQuery& query, const int& stop_flag);

  // Adds the bytes that are read from now on, as they are read. Borrowed.
  void CountInto(std::atomic<std::uint64_t>* bytes) { bytes_ = bytes; }

  enum class Outcome { kMatch, kNoMatch, kBinary, kStopped, kFailed };
  // What is known of the file once these needles have been found, `all_read` to its end or not.
  using Decide = std::function<Answer(const std::vector<bool>& found, bool all_read)>;
  // Whether the regular file `name` in `folder` matches: reads until `decide` is sure. kFailed
  // leaves errno. Ends within one piece once the stop flag is set.
  Outcome Scan(int folder, const char* name, const Decide& decide);
  // The same by the query's texts alone.
  Outcome Scan(int folder, const char* name) { return Scan(folder, name, texts_); }

  // Where the regular file of that name matches; nothing where it does not, as when it has changed
  // since, is something else, or cannot be read. Reads once, as far as Scan does.
  std::optional<MatchingLine> FirstLine(int folder, const char* name, size_t most_bytes);
  // The same of a file that is open at its beginning.
  std::optional<MatchingLine> FirstLine(int fd, size_t most_bytes);

  // Is told a line that holds something the query asks for, or one near it, which `matches` tells
  // apart; false: tell no more.
  using TellLine = std::function<bool(const MatchingLine& line, bool matches)>;
  // Tells the lines of the regular file of that name, in order; none where FirstLine would tell
  // none. Of a line longer than the buffer only the first part that holds something is told. A file
  // that several texts are looked for in is read twice.
  void EachLine(int folder, const char* name, const LinesWanted& wanted, const TellLine& tell);

 private:
  class LineTeller;
  // kWholeLines: each line in one piece alone, as far as it is no longer than a buffer.
  enum class Units { kBytes, kLines, kWholeLines };
  // The line that is looked for while a file is read.
  struct LineSearch {
    size_t most_bytes = 0;
    std::uint64_t lines_before = 0;
    bool at_line_start = true;
    std::optional<MatchingLine> line = {};
  };
  int Open(int folder, const char* name);
  UniqueFd OpenRegular(int folder, const char* name);
  // `lines` may be null, here and below.
  Outcome ScanOpen(int fd, const Decide& decide, LineSearch* lines);
  Outcome Read(const Decide& decide, LineSearch* lines);
  // Hands the text over, in pieces that overlap so that nothing is cut in two: `look` is told a
  // piece and how much of it is not yet handed over again, and answers whether it has seen enough.
  using Look = std::function<bool(std::string_view text, size_t done)>;
  Outcome EachPiece(Units units, const Look& look);
  void Search(std::string_view text);
  // As Search, while no line is known; `done` of the text are not handed over again.
  void SearchLine(std::string_view text, size_t done, LineSearch& lines);
  MatchingLine LineAt(TextPlace first, std::string_view text, const LineSearch& lines) const;
  // The line with all that it has of the needles, and the marks that are already known.
  MatchingLine Marked(std::string_view line, std::vector<std::pair<size_t, size_t>> marks,
                      size_t most_bytes, bool whole_before) const;

  const ContentQuery& query_;
  const int& stop_flag_;
  const Decide texts_;
  TextReader reader_;
  std::vector<bool> found_;
  bool keep_access_time_ = true;
  std::atomic<std::uint64_t>* bytes_ = nullptr;
};

}  // namespace nas
