// One search over several boxes, through a front.

#include <pwd.h>
#include <sys/stat.h>

#include <algorithm>
#include <map>
#include <random>
#include <utility>

#include "nas/base/json_text.h"
#include "tests/fleet/front.h"

namespace fleet_test {
namespace {

using nas_test::AmRoot;
using nas_test::Eventually;

TEST_F(FrontTest, NamesBoxesThatDoNotAnswer) {
  std::vector<Box> boxes = {StartBox("box1"), StartBox("box2"), StartBox("box3")};
  for (const Box& box : boxes) MakeFile(box, "plan of " + box.name + ".txt");
  const std::string key =
      std::exchange(public_key_, std::string(public_key_.rbegin(), public_key_.rend()));
  boxes.push_back(StartBox("box4"));  // knows another front by that name
  public_key_ = key;
  Box plain{"box5", {}, ""};  // knows no fronts
  root_state_ = dir_ + "/plain-root-state";
  state_ = MakeFolder("plain-state");
  plain.server = Start("", "", AmRoot() ? As::kRootWithLogins : As::kOrdinaryUser);
  boxes.push_back(plain);
  const Server front = LoggedIn(StartFront(boxes, "deadline_ms = 700\n"), User());
  EXPECT_EQ(Stop(boxes[1].server), 0);
  kill(boxes[2].server.pid, SIGSTOP);

  const Json::Value shares = front.Get("/shares").json();
  EXPECT_EQ(shares["shares"].size(), 1U) << Text(shares);
  EXPECT_EQ(shares["shares"][0]["name"], "box1/data");
  Json::Value params;
  params["pattern"] = "plan";
  for (const Box& box : boxes) params["folder_path"].append("/" + box.name + "/data");
  Search(front, params);
  kill(boxes[2].server.pid, SIGCONT);
  EXPECT_EQ(List(front, Json::Value(Json::objectValue)).size(), 1U);
  const Json::Value& fleet = status_["walk"]["fleet"];
  std::map<std::string, std::string> states;
  for (const Json::Value& box : fleet["boxes"]) {
    states[box["name"].asString()] = box["state"].asString();
    EXPECT_FALSE(box["why"].asString().empty());
  }
  const std::map<std::string, std::string> wanted = {
      {"box2", "down"}, {"box3", "late"}, {"box4", "refused"}, {"box5", "old"}};
  EXPECT_EQ(states, wanted) << Text(fleet);
  for (const char* count : {"answered", "late", "down", "refused", "old"}) {
    EXPECT_EQ(fleet[count], 1) << count;
  }
  for (const auto& [box, state] : wanted) EXPECT_EQ(shares["boxes"][box]["state"], state) << box;
}

TEST_F(FrontTest, AKeyThatOthersCanReadIsNotUsed) {
  const std::vector<Box> boxes = {StartBox("box1"), StartBox("box2")};
  const Server front = LoggedIn(StartFront(boxes), User());
  EXPECT_EQ(front.Get("/shares").json()["shares"].size(), 2U);
  ASSERT_EQ(chmod((dir_ + "/office.key").c_str(), 0644), 0);
  const Json::Value shares = front.Get("/shares").json();
  EXPECT_EQ(shares["shares"].size(), 0U);
  for (const Box& box : boxes) {
    EXPECT_EQ(shares["boxes"][box.name]["why"], "this machine's key cannot be used");
  }
}

TEST_F(FrontTest, ASearchIsStoppedAndCleanedWithWhatBoxesKeep) {
  const Box box = StartBox("box1");
  for (int i = 0; i < 3000; ++i) MakeFile(box, "f/" + std::to_string(i));
  const Server front = LoggedIn(StartFront({box}), User());
  Json::Value params;
  params["pattern"] = "";
  params["folder_path"] = "/box1/data";
  Search(front, params);
  Json::Value page;
  page["limit"] = 5;
  EXPECT_EQ(List(front, page).size(), 5U);
  EXPECT_EQ(total_, 3001U) << "one more than two pages of a box hold";
  EXPECT_EQ(owners_, std::set<std::string>{nas_test::Me()});
  EXPECT_EQ(front.Call("clean", R"({"taskid":")" + task_ + "\"}").json()["code"], 0);
  const auto left = [&] {
    size_t count = 0;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(dir_)) {
      count += entry.path().extension() == ".db" && entry.path().parent_path().filename() == User();
    }
    return count;
  };
  EXPECT_TRUE(Eventually([&] { return left() == 0; })) << left();
  const Json::Value gone = front.Call("list", R"({"taskid":")" + task_ + "\"}").json();
  EXPECT_EQ(gone["data"]["finished"], true);
  params["folder_path"] = "/box1/elsewhere";
  Search(front, params);
  EXPECT_EQ(status_["progress"], -1) << "nothing can be known of that";
  params["folder_path"] = "/box1";
  Search(front, params);
  EXPECT_EQ(status_["progress"], 1);
  EXPECT_EQ(List(front, page).size(), 5U);
  EXPECT_EQ(total_, 3001U) << "of all shares of the box";
  params["folder_path"] = "/box1/../data";
  Search(front, params);
  EXPECT_EQ(status_["progress"], -1);
}

}  // namespace
}  // namespace fleet_test
