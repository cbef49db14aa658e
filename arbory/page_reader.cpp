#include "arbory/page_reader.h"

#include <algorithm>
#include <limits>
#include <thread>

namespace arbory {
namespace {

// Few enough rows to be printed while the search goes on, enough to make the cost of a call (about
// a millisecond) disappear.
constexpr std::uint64_t kPageRows = 10'000;
// Each page in the making takes some 20 MB.
constexpr unsigned kMostAhead = 4;

std::uint64_t EndOf(const SearchOptions& options) {
  constexpr std::uint64_t kMost = std::numeric_limits<std::uint64_t>::max();
  if (options.limit == 0 || options.limit > kMost - options.offset) return kMost;
  return options.offset + options.limit;
}

size_t PagesAhead() { return std::clamp(std::thread::hardware_concurrency(), 1U, kMostAhead); }

}  // namespace

PageReader::PageReader(Caller* caller, const SearchOptions& options, const RowFormat& format,
                       const std::string& task_id)
    : caller_(*caller),
      encode_(PageEncoder(format)),
      params_(Json::objectValue),
      at_(options.offset),
      end_(EndOf(options)),
      next_(at_) {
  params_["taskid"] = task_id;
  params_["additional"] = format.Additional();
  if (!options.sort_by.empty()) params_["sort_by"] = options.sort_by;
  if (options.descending) params_["sort_direction"] = "DESC";
}

PageReader::~PageReader() { Forget(); }

void PageReader::Ask() {
  const std::uint64_t rows = std::min(kPageRows, end_ - next_);
  params_["offset"] = Json::UInt64{next_};
  params_["limit"] = Json::UInt64{rows};
  constexpr char kMethod[] = "list";
  asked_.push_back({caller_.Begin(caller_.Method(kMethod), kMethod, params_, encode_), rows});
  next_ += rows;
}

void PageReader::Forget() {
  for (Asked& asked : asked_) nas::AbandonCall(std::move(asked.call));
  asked_.clear();
  next_ = at_;
}

Page PageReader::Take(const std::function<bool()>& go_on) {
  if (asked_.empty()) Ask();
  nas::Child call = std::move(asked_.front().call);
  wanted_ = asked_.front().rows;
  asked_.pop_front();
  return Page(nas::FinishCall(std::move(call), encode_, go_on));
}

Page PageReader::Next(bool all_found, const std::function<bool()>& go_on) {
  const bool ahead = !asked_.empty();
  Page page = Take(go_on);
  if (ahead && page.total() != total_) {
    // Files have vanished, and the rows behind theirs have moved up.
    Forget();
    page = Take(go_on);
  }
  at_ += page.rows();
  total_ = page.total();
  caught_up_ = page.rows() < wanted_;
  if (caught_up_ || !(all_found || page.finished())) {
    Forget();
  } else {
    while (asked_.size() < PagesAhead() && next_ < std::min(end_, total_)) Ask();
  }
  return page;
}

}  // namespace arbory
