#include "arbory/nothing_found.h"

#include <exception>
#include <string>
#include <vector>

#include "arbory/comparators.h"
#include "arbory/search_text.h"
#include "arbory/terminal.h"
#include "nas/match/meant_query.h"
#include "nas/search/near_misses.h"

namespace arbory {
namespace {

void ComplainOfTerm(const nas::NearMisses::Term& term, bool one_of_several) {
  const std::string what = term.written.empty() ? "one of the options" : "'" + term.written + "'";
  if (term.without > 0 && one_of_several) {
    Complain("without " + what + " there would be " + Counted(term.without, "file", "files"));
  }
  if (term.names.empty()) return;
  std::string names;
  for (const std::string& name : term.names) names += (names.empty() ? "" : ", ") + name;
  Complain("near to " + what + ": " + names);
}

void Explain(const Json::Value& params, std::chrono::milliseconds most) {
  const auto near = NearMissesOf(params, most);
  if (!near) return;
  Complain("nothing found among " + std::string(near->complete ? "" : "more than ") +
           Counted(near->entries, "name", "names") + " in " +
           Counted(near->folders, "folder", "folders"));
  if (near->left_out > 0) {
    Complain(Counted(near->left_out, "folder", "folders") +
             " of the system's own or of its temporary files " +
             (near->left_out == 1 ? "is" : "are") + " never searched");
  }
  const std::string meant = nas::MeantQuery(params["pattern"].asString());
  if (!meant.empty()) Complain("did you mean '" + meant + "'?");
  for (const auto& term : near->terms) ComplainOfTerm(term, near->terms.size() > 1);
}

}  // namespace

std::optional<nas::NearMisses> NearMissesOf(const Json::Value& params,
                                            std::chrono::milliseconds most) {
  std::vector<nas::Location> locations;
  for (const Json::Value& text : params["folder_path"]) {
    auto location = nas::OpenLocation(text.asString());
    if (location) locations.push_back(std::move(*location));
  }
  if (locations.empty()) return std::nullopt;
  const Comparators comparators(params);
  return nas::LookForNearMisses(locations, comparators.get(), params["recursive"].asBool(), most);
}

void ExplainNothing(const Json::Value& params, std::chrono::milliseconds most) try {
  Explain(params, most);
} catch (const std::exception&) {
  // The search itself has said what it had to say.
}

}  // namespace arbory
