#include "nas/search/first_rows.h"

#include <algorithm>

#include "nas/results/sort_key.h"

namespace nas {
namespace {

// Of pages that may need a second round.
constexpr double kMostSecondRounds = 0.01;
// More than anybody looks at first; what a box is asked for again.
constexpr unsigned kMostPageRows = 1000;

}  // namespace

// The rows of one box among the page's are binomial, of as many draws as the page has rows.
unsigned FirstRowsOfEach(unsigned page_rows, unsigned boxes) {
  if (boxes <= 1) return page_rows;
  const double share = 1.0 / boxes;
  double one = 1;  // that there are exactly `rows`
  for (unsigned i = 0; i < page_rows; ++i) one *= 1 - share;
  double fewer = 0;  // that there are fewer than `rows`
  for (unsigned rows = 0; rows < page_rows; ++rows) {
    // All of a box's rows are used up where the page has so many of it.
    if (rows > 0 && boxes * (1 - fewer) < kMostSecondRounds) return rows;
    fewer += one;
    one *= (page_rows - rows) * share / ((rows + 1) * (1 - share));
  }
  return page_rows;
}

FirstRowsMerge::FirstRowsMerge(const FirstPage& page, unsigned boxes)
    : column_(ParseSortColumn(page.sort_by).value_or(SortColumn::kFound)),
      ascending_(!page.descending),
      rows_(std::min(page.rows, kMostPageRows)),
      of_each_(FirstRowsOfEach(rows_, boxes)) {}

FleetPageRequest FirstRowsMerge::FirstRequest(int wait_ms) const {
  FleetPageRequest request;
  request.limit = of_each_;
  request.wait_ms = wait_ms;
  request.column = column_;
  request.ascending = ascending_;
  return request;
}

FleetPageRequest FirstRowsMerge::FurtherRequest(size_t box, int wait_ms) const {
  FleetPageRequest request = FirstRequest(wait_ms);
  request.limit = rows_;
  request.behind = lasts_.at(box).number;
  return request;
}

void FirstRowsMerge::Add(size_t box, const std::string& share, const FleetRow& row) {
  keys_.push_back(SortKey(column_, {.share = share,
                                    .folder = row.folder,
                                    .name = row.name,
                                    .user = row.user,
                                    .group = row.group,
                                    .attributes = &row.attributes}));
  Last& last = lasts_[box];
  last.key = keys_.back();
  last.number = row.number;
}

void FirstRowsMerge::Told(size_t box, bool more) {
  const auto last = lasts_.find(box);
  if (last != lasts_.end()) last->second.more = more;
}

std::vector<size_t> FirstRowsMerge::AskFurther() {
  const auto before = [this](const std::string& one, const std::string& other) {
    return Before(one, other);
  };
  const bool full = keys_.size() >= rows_;
  if (full) {
    std::ranges::nth_element(keys_, keys_.begin() + rows_ - 1, before);
    keys_.resize(rows_);  // no other is on the page, whatever may come
  }
  std::vector<size_t> boxes;
  for (auto& [box, last] : lasts_) {
    // Rows that are equal to the page's last may stand there or not.
    const bool used_up = !full || Before(last.key, keys_[rows_ - 1]);
    if (!used_up || !last.more || last.asked_further) continue;
    last.asked_further = true;
    boxes.push_back(box);
  }
  return boxes;
}

}  // namespace nas
