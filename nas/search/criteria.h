#pragma once
// The criteria of a search as one tree. Those that a request gives in parameters of their own are
// comparators (platform/filesearch.h), because the module makes them; each is a part of the tree,
// and so is all of the pattern.

#include <utility>
#include <vector>

#include "nas/match/query.h"
#include "nas/match/query_match.h"
#include "nas/search/pruning.h"
#include "nas/search/refusal.h"
#include "platform/filesearch.h"

namespace FileSearch {

struct Criterion {
  nas::QueryNode node;
};

}  // namespace FileSearch

namespace nas {

class NodeComp : public FileSearch::FindComp {
 public:
  explicit NodeComp(QueryNode node) : node_(std::move(node)) {}
  FileSearch::Criterion criterion() const override { return {node_}; }

 private:
  QueryNode node_;
};

struct Criteria {
  explicit Criteria(const std::vector<FileSearch::FindComp*>& comps);

  QueryNode root;  // all of them, cheapest first
  Pruning pruning;
  bool ask_attributes = false;
  bool ask_paths = false;
};

// Why an entry that the tree refuses, as far as it is known, is left out: by the first criterion
// that it does not meet.
Refusal WhyNot(const QueryNode& node, const QuerySubject& subject);

}  // namespace nas
