#pragma once
// Boxes with random trees and rights, random questions, and what may be told of them: by each box
// itself, and by the kernel alone.

#include <map>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "tests/fleet/proxy.h"

namespace fleet_test {

// For a front's file: boxes have the time to find all before they tell the first rows.
inline constexpr char kInOrder[] = "first_page_ms = 1000\n";

class UnionTest : public ProxiedTest {
 protected:
  void SetUp() override;

  int Below(int most) { return static_cast<int>(random_() % static_cast<unsigned>(most)); }
  // The first boxes have most files, so that rows are not spread evenly. Half of the folders are
  // closed to one of the users.
  void MakeTree(const Box& box, int files);
  // Makes, removes and moves files and opens and closes folders, a few each.
  void ChangeTree(const Box& box);

  std::string RandomPattern();
  Json::Value RandomListing();
  // What the box tells the user of a search, by itself, as a front names it. `session` is the
  // user's, there.
  std::vector<Listed> AskBox(const Server& session, const Box& box, Json::Value params);
  // The paths of all that the user can see on the box, by a process that is this user and walks.
  static std::set<std::string> Visible(const Box& box, const std::string& user);
  // `page` is that part of the files, sorted by the column; equal ones may stand in any order.
  static void CheckPage(const std::vector<Listed>& page, const std::vector<Listed>& all,
                        const Json::Value& listing);
  // The first rows of a search that is just begun, as soon as there are any.
  std::vector<Listed> Begin(const Server& front, Json::Value params, const Json::Value& listing);

  std::mt19937 random_{20261122};
  std::vector<std::string> users_;
};

}  // namespace fleet_test
