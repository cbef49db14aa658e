#pragma once
// The reading of one file to answer a content query: whether it matches, and where.

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

  enum class Outcome { kMatch, kNoMatch, kBinary, kStopped, kFailed };
  // What is known of the file once these needles have been found, `all_read` to its end or not.
  using Decide = std::function<Answer(const std::vector<bool>& found, bool all_read)>;
  // Whether the regular file `name` in `folder` matches: reads until `decide` is sure. kFailed
  // leaves errno. Ends within one piece once the stop flag is set.
  Outcome Scan(int folder, const char* name, const Decide& decide);
  // The same by the query's texts alone.
  Outcome Scan(int folder, const char* name) { return Scan(folder, name, texts_); }

  // Where the regular file of that name matches; nothing where it does not, as when it has changed
  // since, is something else, or cannot be read.
  std::optional<MatchingLine> FirstLine(int folder, const char* name, size_t most_bytes);
  // The same of a file that is open at its beginning.
  std::optional<MatchingLine> FirstLine(int fd, size_t most_bytes);

 private:
  enum class Units { kBytes, kLines };
  int Open(int folder, const char* name);
  Outcome ScanOpen(int fd, const Decide& decide);
  Outcome Read(const Decide& decide);
  // Hands the text over, in pieces that overlap so that nothing is cut in two: `look` is told a
  // piece and how much of it is not yet handed over again, and answers whether it has seen enough.
  template <typename Look>
  Outcome EachPiece(Units units, const Look& look);
  void Search(std::string_view text);
  std::optional<MatchingLine> LineIn(std::string_view text, bool at_line_start, size_t most_bytes);

  const ContentQuery& query_;
  const int& stop_flag_;
  const Decide texts_;
  TextReader reader_;
  std::vector<bool> found_;
  bool keep_access_time_ = true;
};

}  // namespace nas
