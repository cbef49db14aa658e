#pragma once
// The files whose names did not match and whose contents may, as a source: what judges have put
// into the search's list of candidates.

#include <vector>

#include "nas/search/location.h"
#include "nas/search/name_source.h"

namespace nas {

class ContentReading : public NameSource {
 public:
  // Both are borrowed. To be fed from once every other source has come to its end.
  ContentReading(const std::vector<Location>& locations, SharedSearch& search)
      : locations_(locations), search_(search) {}

  void Feed(size_t thread, Judge& judge) override;

 private:
  void Read(const CandidateList::Record& record, Judge& judge);

  const std::vector<Location>& locations_;
  SharedSearch& search_;
};

}  // namespace nas
