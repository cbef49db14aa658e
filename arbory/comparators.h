#pragma once
// The criteria of a search as the engine judges them, for commands that ask it themselves.

#include <json/value.h>

#include <string>
#include <vector>

#include "platform/filesearch.h"

namespace arbory {

// Appends the engine's comparator of a criterion that is given as text; false for a text that is
// none, which the engine also says of an owner or group that does not exist.
bool AppendComparator(FileSearch::FindFactory::_tag_FIND_FIELD_ field, const std::string& text,
                      std::vector<FileSearch::FindComp*>* comps);

// Owns the comparators that the module makes of the same parameters (search_request.h).
class Comparators {
 public:
  // Throws UsageError for a text that is no criterion.
  explicit Comparators(const Json::Value& params);
  ~Comparators();
  Comparators(const Comparators&) = delete;
  Comparators& operator=(const Comparators&) = delete;

  const std::vector<FileSearch::FindComp*>& get() const { return comps_; }

 private:
  void AddText(const Json::Value& params, const char* name,
               FileSearch::FindFactory::_tag_FIND_FIELD_ field);
  template <class Comp, class Number>
  void AddBounds(const Json::Value& params, const std::string& name, const char* least,
                 const char* most);

  std::vector<FileSearch::FindComp*> comps_;
};

}  // namespace arbory
