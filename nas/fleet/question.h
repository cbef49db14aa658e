#pragma once
// What a front asks a box and what it is told: the bodies of /fleet/search and /fleet/rows
// (docs/fleet.md). JSON whose strings keep their bytes, as names need not be UTF-8. Owners travel
// as names, since every machine has numbers of its own.
//
// A page, as a box sends it:
//
//   "protocol"   kFleetProtocol
//   "version"    of the box's program
//   "task"       for further pages
//   "finished"   whether no more rows will be found
//   "error"      a platform error's number, of a search that failed
//   "source", "index"   where names come from, as in the task property "walk"
//   "total"      rows found so far
//   "next"       the row after the last one here: "after" of the next request
//   "users", "groups"   names
//   "folders"    [share, path below its root]
//   "rows"       [folder, name, mode, user, group, size, modified, opened, changed, created,
//   number]:
//                folder, user and group by their places above; created is null where none is known
//
// Rows come in the order found, numbered from 0, so that a page neither repeats a row nor leaves
// one out while the search goes on. A request that names a column is told the first rows in its
// order instead, or the first behind the row `behind`, of those found by then: "next" is then the
// request's "after", but for a finished search all of whose rows are on the page.

#include <json/value.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "nas/base/accounts.h"
#include "nas/base/error.h"
#include "nas/files/attributes.h"
#include "nas/match/query.h"
#include "nas/results/block_reader.h"
#include "nas/results/row_sorter.h"

namespace nas {

// Of what both ends say. A box that does not know a word of a query refuses the question. Members
// that are not known are passed over, those of questions and those of pages, so one that changes
// what is meant needs another protocol. In the first one rows had no numbers.
inline constexpr int kFleetProtocol = 2;
// Of one page.
inline constexpr unsigned kMostFleetRows = 2000;
// A page ends with the row that makes it longer than that, however few there are.
inline constexpr size_t kMostFleetPageBytes = size_t{192} << 10;
// That a box may be asked to wait.
inline constexpr int kMostFleetWaitMs = 1000;

struct FleetPageRequest {
  unsigned limit = kMostFleetRows;
  // For as many rows, or the search's end; in an order, for the end alone. Further rows that are
  // the first are told as soon as there is one.
  int wait_ms = 0;
  std::uint64_t after = 0;  // the first row wanted
  SortColumn column = SortColumn::kFound;
  bool ascending = true;
  std::optional<std::uint32_t> behind = {};  // a row's number, in the order of a column
};

struct FleetQuestion {
  QueryNode query;
  bool contents = false;  // contents can stand in for names
  bool recursive = true;
  std::vector<std::string> locations;  // "/SHARE/below", as the box has them
  FleetPageRequest page;
};

std::string FleetQuestionText(const FleetQuestion& question);
// kErrorIllegal for what is no question of this protocol. Looks accounts up.
Result<FleetQuestion> ReadFleetQuestion(const Json::Value& json);

Json::Value FleetPageRequestJson(const FleetPageRequest& page);
Result<FleetPageRequest> ReadFleetPageRequest(const Json::Value& json);

// Collects a page's rows.
class FleetPageWriter {
 public:
  void Add(const ResultRow& row, std::uint32_t number);
  // Whether the page is as long as it may be.
  bool full() const { return bytes_ >= kMostFleetPageBytes; }
  // Moves "users", "groups", "folders" and "rows" there.
  void Finish(Json::Value* page);

 private:
  static unsigned Place(Json::Value& names, std::map<std::string, unsigned>& known,
                        const std::string& name);

  AccountTexts accounts_;
  Json::Value users_{Json::arrayValue};
  Json::Value groups_{Json::arrayValue};
  Json::Value folders_{Json::arrayValue};
  Json::Value rows_{Json::arrayValue};
  std::map<std::string, unsigned> known_users_;
  std::map<std::string, unsigned> known_groups_;
  std::string last_folder_;  // share, NUL, path
  size_t bytes_ = 0;         // of the page's text, about
};

// A row as it came, valid as long as the page. Nothing of it is believed but that it is in order.
struct FleetRow {
  std::string share;
  std::string folder;
  std::string name;
  std::string user;
  std::string group;
  FileAttributes attributes;  // without owners and folder
  std::uint32_t number = 0;
};

struct FleetPage {
  std::string version;
  std::string task;
  std::string index;
  std::string source;
  bool finished = false;
  int error = 0;
  std::uint64_t total = 0;
  std::uint64_t next = 0;
  std::vector<FleetRow> rows;
};

// kErrorIllegal for what is no page: among others names that hold "/" or NUL, or mean a folder.
// With EPROTONOSUPPORT where it says that it is of another protocol.
Result<FleetPage> ReadFleetPage(std::string_view text);

}  // namespace nas
