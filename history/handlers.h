#pragma once
// Handlers of the API "NUVA.Arbory.Search.History", which reads, adds to and empties the history of
// the kind that "search_type" selects. The spelling "Histort" is theirs.

#include "api/webfm_webapi.h"

// Answers {"history": [records], "total": their number}; a store that cannot be used is an empty
// history.
class SearchHistortGet final : public FileWebAPI {
 public:
  using FileWebAPI::FileWebAPI;
  void Process() override;
};

// Adds the record of one pattern.
class SearchHistortSet final : public FileWebAPI {
 public:
  using FileWebAPI::FileWebAPI;
  void Process() override;
};

// Removes every record.
class SearchHistortDelete final : public FileWebAPI {
 public:
  using FileWebAPI::FileWebAPI;
  void Process() override;
};
