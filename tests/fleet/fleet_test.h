#pragma once
// Boxes, each a real `arbory serve` of its own, and somebody who signs for a front as a front does.

#include <string>
#include <vector>

#include "nas/fleet/token.h"
#include "tests/server/server_test.h"

namespace fleet_test {

using server_test::Reply;
using server_test::Server;

// Two users with different rights. The second is one of the system's own, whom boxes of tests let
// in all the same.
inline constexpr char kAnn[] = "nobody";
inline constexpr char kBob[] = "daemon";

// Variables of the environment, for tests that are run by hand: folders of programs of another
// version, for every second box and for fronts.
inline constexpr char kOtherBoxes[] = "ARBORY_OTHER_BOXES";
inline constexpr char kOtherFront[] = "ARBORY_OTHER_FRONT";

struct Box {
  std::string name;
  Server server;
  std::string share;  // the folder of its share "data"
};

class FleetTest : public server_test::ServerTest {
 protected:
  void SetUp() override;

  // A box that knows the front "office"; `more` goes into its settings of the fleet, before those
  // of the front, and `of_front` into the latter. Root's, where the tests are root's.
  Box StartBox(const std::string& name, const std::string& more = "lowest_uid = 1\n",
               const std::string& of_front = "");
  // A server as these tests start them, of the program in that folder; null: of this build's.
  Server StartOf(const char* other_bin_dir, const std::string& lines);
  // Of a server's settings: everybody's password is "right".
  std::string PamLines();
  // A file of a box's share, `user`'s own and closed to others where a user is given.
  static void MakeFile(const Box& box, const std::string& path, const std::string& user = "",
                       const std::string& text = "");
  // What a front asks for a user, signed now unless `token` says otherwise.
  nas::FleetToken TokenFor(const Box& box, const std::string& user, const std::string& method,
                           const std::string& target, const std::string& body) const;
  static Reply AskWith(const Box& box, const std::string& token, const std::string& method,
                       const std::string& target, const std::string& body);
  Reply Ask(const Box& box, const std::string& user, const std::string& method,
            const std::string& target, const std::string& body = "") const;
  // A question for all files, but for `more`, JSON members.
  static std::string Question(unsigned limit, const std::string& locations = R"(["/data"])",
                              const std::string& query = R"(["all"])");

  std::string secret_key_;
  std::string public_key_;
  std::string other_key_;  // somebody else's secret one
};

}  // namespace fleet_test
