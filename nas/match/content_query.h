#pragma once
// What a search asks of the contents of files, and the reading of one file to answer it.
//
// A file is read in bounded pieces, never mapped: a file that shrinks or a disk that fails ends in
// an error, not a signal. Files with a NUL in their first block are binary and match nothing.

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/match/literal_finder.h"
#include "nas/match/name_pattern.h"
#include "nas/match/regex.h"

namespace nas {

// Does not change once made: any thread may ask.
class ContentQuery {
 public:
  // The same expression over contents: every term must be found, either of its alternatives will
  // do. Nothing where the pattern has a wildcard, which speaks of whole names, or where it only
  // says what must not be there.
  static std::optional<ContentQuery> From(const NamePattern& pattern);

 private:
  friend class ContentScanner;
  // One alternative: found where any of its forms is.
  struct Needle {
    bool negated = false;
    std::optional<LiteralFinder> literal;
    std::vector<std::shared_ptr<const Regex>> expressions;
    bool Finds(std::string_view text) const;
  };
  static std::optional<Needle> MakeNeedle(const NamePattern::Alternative& alternative);

  std::vector<Needle> needles_;
  std::vector<std::vector<size_t>> terms_;  // indexes of needles: all terms, either needle
  bool has_negated_ = false;
  bool by_lines_ = false;  // an expression must see whole lines
  size_t overlap_ = 0;     // bytes of the longest literal, so none is cut in two
};

// Reads files for one thread. Query and flag are borrowed. Its buffer (256 KiB, more for a very
// long text) is made once.
class ContentScanner {
 public:
  explicit ContentScanner(const ContentQuery& query, const int& stop_flag);

  enum class Outcome { kMatch, kNoMatch, kBinary, kStopped, kFailed };
  // Whether the regular file `name` in `folder` matches. kFailed leaves errno. Ends within one
  // piece once the stop flag is set.
  Outcome Scan(int folder, const char* name);

 private:
  int Open(int folder, const char* name);
  Outcome ScanOpen(int fd);
  void Search(std::string_view text);
  bool Decided(bool at_end) const;

  const ContentQuery& query_;
  const int& stop_flag_;
  std::vector<char> buffer_;
  std::vector<bool> found_;
  bool keep_access_time_ = true;
};

}  // namespace nas
