#pragma once
// The rows that the boxes of a fleet find, as a third kind of source beside the walk and the index:
// they come judged, and go to the search's sink as they are. Each box is asked for the same search
// in its own locations, in the user's name; it decides by its own kernel what it tells.
//
// Nothing that a box says is believed but that it found these rows: names and folders must be some
// that were asked for, counts must agree with what came, and after rows_per_box of them it is asked
// no further. So a box that lies costs its own rows alone.
//
// Where it is known in what order the first page will be listed (first_page.h), the rows of that
// page come first, all together: boxes are asked for their first ones in that order, and those that
// had more for the page for further ones. A box that takes longer than first_page_ms to find all
// tells what it has found by then. All other rows come in the order found.

#include <json/value.h>

#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "nas/base/deadline.h"
#include "nas/fleet/asker.h"
#include "nas/fleet/question.h"
#include "nas/results/row_block.h"
#include "nas/search/first_rows.h"
#include "nas/search/judge.h"

namespace nas {

// "/BOX/SHARE/below", taken apart; or "/BOX", which is all shares there that the user can enter.
struct FleetLocation {
  const FleetBox* box = nullptr;
  std::string share;  // empty: all
  std::string path;   // below the share's root
};

// Nothing for a text that names no box of the configuration; kErrorIllegal and kErrorNoSuchFolder
// for one that is no location in it.
std::optional<Result<FleetLocation>> FindFleetLocation(const std::string& text);

class FleetSearch {
 public:
  struct Settings {
    bool recursive = true;
    bool contents = false;
    // Gives the name of an account that this machine does not have its number in the result file.
    std::function<void(std::uint32_t id, const std::string& name)> add_account;
    // Gives a share of a box its number in the result file, before its first row; from
    // `first_number` on.
    std::function<void(std::uint16_t number, const std::string& name)> add_share;
    std::uint16_t first_number = 0;
  };
  // The search is borrowed.
  FleetSearch(std::vector<FleetLocation> locations, Settings settings, SharedSearch& search);

  // Asks until every box has ended or the search is stopping. Throws what the sink throws, and
  // std::runtime_error where nobody can be asked.
  void Run();
  // Whether every box failed; a search of which nothing can be known has failed too.
  bool failed() const;
  // Adds "fleet" to the task property "walk". Callable from any thread.
  void Tell(Json::Value* walk) const;

 private:
  // One box, as far as it has come.
  struct Box {
    const FleetBox* box = nullptr;
    std::vector<const FleetLocation*> locations;
    std::string task;
    std::uint64_t next = 0;
    bool in_order = false;              // what it was asked for last
    bool waits = false;                 // to be asked on, once the first page is whole
    std::set<std::uint32_t> told_once;  // rows that came in order
    std::uint64_t lowest = 0;           // that the next row may have, in the order found
    bool told_any = false;
    std::map<std::string, std::uint16_t> shares;  // their numbers in the result file
    BoxState state = BoxState::kAsked;
    std::string why;
  };

  // A row that came, of the first page.
  struct HeldRow {
    const Box* box;
    FleetRow row;
  };

  const std::string& QuestionFor(const Box& box);
  void AskFirst(Box& box);
  void Took(Box& box, BoxAnswer answer);
  void TookPage(Box& box, const FleetPage& page);
  bool TakePage(Box& box, const FleetPage& page);
  bool CanTake(Box& box, const FleetRow& row);
  bool TakeNumber(Box& box, const FleetPage& page, const FleetRow& row);
  void TakeRow(const Box& box, const FleetRow& row);
  size_t BoxPlace(const Box& box) const { return static_cast<size_t>(&box - boxes_.data()); }
  void LookAtFirstPage();
  void ReleaseFirstPage();
  void AskRows(Box& box, const FleetPageRequest& page);
  void AskMore(Box& box);
  void EndSearches();
  void Finish(Box& box, BoxState state, const std::string& why);
  std::uint32_t IdOf(const std::string& name, bool user);

  const std::vector<FleetLocation> locations_;
  const Settings settings_;
  SharedSearch& search_;
  const FleetSettings& fleet_;
  const int order_wait_ms_;
  FleetPageRequest page_;
  std::string question_;  // the last one, and of which folders
  std::vector<std::string> question_locations_;
  std::optional<FirstRowsMerge> first_;  // until the first page is whole
  std::vector<HeldRow> held_;            // its rows, in the order they came
  std::optional<Deadline> first_page_due_;
  std::optional<FleetAsker> asker_;
  RowBlock block_;
  std::map<std::pair<bool, std::string>, std::uint32_t> ids_;  // by kind and name
  std::uint32_t next_id_;
  std::uint16_t next_share_;

  mutable std::mutex mutex_;  // guards state and why of each
  std::vector<Box> boxes_;
};

}  // namespace nas
