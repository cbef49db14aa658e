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

 private:
  enum class Units { kBytes, kLines };
  // The line that is looked for while a file is read.
  struct LineSearch {
    size_t most_bytes = 0;
    std::uint64_t lines_before = 0;
    bool at_line_start = true;
    std::optional<MatchingLine> line = {};
  };
  int Open(int folder, const char* name);
  // `lines` may be null, here and below.
  Outcome ScanOpen(int fd, const Decide& decide, LineSearch* lines);
  Outcome Read(const Decide& decide, LineSearch* lines);
  // Hands the text over, in pieces that overlap so that nothing is cut in two: `look` is told a
  // piece and how much of it is not yet handed over again, and answers whether it has seen enough.
  template <typename Look>
  Outcome EachPiece(Units units, const Look& look);
  void Search(std::string_view text);
  // As Search, while no line is known; `done` of the text are not handed over again.
  void SearchLine(std::string_view text, size_t done, LineSearch& lines);
  MatchingLine LineAt(TextPlace first, std::string_view text, const LineSearch& lines) const;

  const ContentQuery& query_;
  const int& stop_flag_;
  const Decide texts_;
  TextReader reader_;
  std::vector<bool> found_;
  bool keep_access_time_ = true;
  std::atomic<std::uint64_t>* bytes_ = nullptr;
};

}  // namespace nas
