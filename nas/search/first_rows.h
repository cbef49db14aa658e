#pragma once
// The first page of a search over many boxes, put together from the first rows of each: a box is
// asked for a few, and for more only where the page took all of them.

#include <cstdint>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "nas/fleet/question.h"
#include "nas/system/first_page.h"

namespace nas {

// How many rows each of so many boxes is asked for at first: so many that, were the page's rows
// spread evenly, one page in a hundred would need more of any.
unsigned FirstRowsOfEach(unsigned page_rows, unsigned boxes);

// For one thread. Boxes are named by places of the caller's.
class FirstRowsMerge {
 public:
  // Nothing is asked for in an order where `page` names none.
  FirstRowsMerge(const FirstPage& page, unsigned boxes);

  // For what is asked of every box first.
  bool wanted() const { return column_ != SortColumn::kFound && rows_ > 0; }
  FleetPageRequest FirstRequest(int wait_ms) const;
  unsigned most_rows() const { return rows_; }  // of one request
  // What came. `more`: the box has further rows in that order.
  void Add(size_t box, const std::string& share, const FleetRow& row);
  void Told(size_t box, bool more);
  // The boxes of which the page has all rows that were told, though they have more; none of them
  // twice. And what they are asked for.
  std::vector<size_t> AskFurther();
  FleetPageRequest FurtherRequest(size_t box, int wait_ms) const;

 private:
  struct Last {
    std::string key;
    std::uint32_t number = 0;
    bool more = false;
    bool asked_further = false;
  };
  bool Before(const std::string& one, const std::string& other) const {
    return ascending_ ? one < other : other < one;
  }

  SortColumn column_;
  const bool ascending_;
  const unsigned rows_;
  const unsigned of_each_;
  std::vector<std::string> keys_;
  std::map<size_t, Last> lasts_;  // of boxes that told any row
};

}  // namespace nas
