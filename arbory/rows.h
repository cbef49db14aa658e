#pragma once
// Pages of a search's listing, turned in the request child into the bytes to print: the parent then
// only writes them, and a large page is never encoded and parsed as JSON on the way.
//
// A page's body is "FINISHED ROWS TOTAL\n" and the rows as they are printed.

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "nas/match/content_query.h"
#include "nas/webapi/runner.h"

namespace arbory {

struct RowFormat {
  enum class Kind { kPath, kLong, kJson };
  Kind kind = Kind::kPath;
  char end = '\n';
  bool escape = false;  // for a terminal
  // Where given, the first line is told of each file whose contents hold what it asks for.
  std::shared_ptr<const nas::ContentQuery> lines;

  // What the listing must be asked for: names of additional attributes.
  Json::Value Additional() const;
};

class Page {
 public:
  explicit Page(nas::Reply reply);
  int code() const { return code_; }
  bool finished() const { return finished_; }
  std::uint64_t rows() const { return rows_; }
  // How many rows the search has in all.
  std::uint64_t total() const { return total_; }
  std::string_view text() const { return std::string_view(body_).substr(text_at_); }

 private:
  std::string body_;
  int code_ = nas::kCodeUnknownFailure;
  bool finished_ = false;
  std::uint64_t rows_ = 0;
  std::uint64_t total_ = 0;
  size_t text_at_ = 0;
};

nas::ReplyEncoder PageEncoder(const RowFormat& format);

}  // namespace arbory
