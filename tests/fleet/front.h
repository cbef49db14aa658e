#pragma once
// A front that asks boxes, and a person before it.

#include <json/value.h>

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "tests/fleet/fleet_test.h"

namespace fleet_test {

// A file as a listing shows it.
struct Listed {
  std::string path;
  std::string name;
  std::int64_t size = 0;
  std::string owner;
  bool folder = false;
  auto operator<=>(const Listed&) const = default;
};

// What a listing by that column is sorted by, as a text; for names of ASCII.
std::string KeyOf(const Listed& file, const std::string& column);
// Of all of them, in the listing's order.
std::vector<std::string> KeysOf(const std::vector<Listed>& files, const std::string& column);

class FrontTest : public FleetTest {
 protected:
  void TearDown() override;

  // An index daemon of the box's own, that knows all when this returns.
  void StartIndex(const Box& box);
  // A front that asks these; `more` goes into its file, before the boxes.
  Server StartFront(const std::vector<Box>& boxes,
                    const std::string& more = "deadline_ms = 5000\n");
  void WriteFleetFile(const std::vector<Box>& boxes, const std::string& more);
  static Server LoggedIn(Server server, const std::string& user);
  // Runs a search to its end and leaves its id in task_.
  void Search(const Server& server, Json::Value params);
  std::vector<Listed> List(const Server& server, Json::Value params);
  static std::vector<Listed> FilesOf(const Json::Value& files);
  static std::string Text(const Json::Value& params);

  std::vector<std::string> addresses_;  // of the boxes, where they are others than their own
  std::string task_;
  Json::Value status_;
  std::uint64_t total_ = 0;
  std::set<std::string> owners_;

 private:
  std::vector<pid_t> indexes_;
};

}  // namespace fleet_test
