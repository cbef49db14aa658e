// One search over several boxes, through a front.

#include <pwd.h>

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

TEST_F(FrontTest, TellsTheSortedUnionOfWhatEachBoxTells) {
  std::mt19937 random(20261122);
  const auto below = [&](int most) { return static_cast<int>(random() % most); };
  const std::vector<std::string> users =
      AmRoot() ? std::vector<std::string>{kAnn, kBob} : std::vector<std::string>{User()};
  std::vector<Box> boxes = {StartBox("box1"), StartBox("box2"), StartBox("box3")};
  for (const Box& box : boxes) {
    for (int i = 0; i < 120; ++i) {
      const std::string folder = "folder " + std::to_string(below(6));
      const std::string name = std::string(below(2) == 0 ? "Invoice " : "photo ") +
                               std::to_string(below(40)) + (below(2) == 0 ? ".txt" : ".PDF");
      MakeFile(box, folder + "/" + name, "", std::string(static_cast<size_t>(below(50)), 'x'));
    }
    if (!AmRoot()) continue;
    for (int i = 0; i < 6; ++i) {
      const std::string folder = box.share + "/folder " + std::to_string(i);
      const passwd* owner = getpwnam(users[static_cast<size_t>(below(2))].c_str());
      if (chown(folder.c_str(), owner->pw_uid, 0) == 0) {
        EXPECT_EQ(chmod(folder.c_str(), below(2) == 0 ? 0700 : 0755), 0);
      }
    }
  }
  const Server front = StartFront(boxes);
  std::map<std::string, std::vector<Server>> sessions;  // of each user, at the boxes and the front
  for (const std::string& user : users) {
    for (const Box& box : boxes) sessions[user].push_back(LoggedIn(box.server, user));
    sessions[user].push_back(LoggedIn(front, user));
  }
  const char* const patterns[] = {"invoice",  "*.pdf",   "1",          "photo ext:txt",
                                  "size:>20", "nothing", "owner:root", ""};
  const char* const columns[] = {"name", "size", "path"};
  std::set<size_t> seen;  // how many rows different users were told
  for (int round = 0; round < 16; ++round) {
    const std::string& user = users[static_cast<size_t>(round) % users.size()];
    const Server& person = sessions[user].back();
    Json::Value params;
    params["pattern"] = patterns[below(std::size(patterns))];
    const size_t asked = below(3) == 0 ? 1 : boxes.size();
    std::vector<Listed> wanted;
    for (size_t i = 0; i < asked; ++i) {
      params["folder_path"].append("/" + boxes[i].name + "/data");
    }
    SCOPED_TRACE(user + " " + Text(params));
    for (size_t i = 0; i < asked; ++i) {
      // What the box itself tells this user, who is asked for by name.
      Json::Value own = params;
      own["folder_path"] = Json::Value(Json::arrayValue);
      own["folder_path"].append("/data");
      const Server& at_box = sessions[user][i];
      Search(at_box, own);
      for (Listed file : List(at_box, Json::Value(Json::objectValue))) {
        file.path = "/" + boxes[i].name + file.path;
        wanted.push_back(file);
      }
    }
    Search(person, params);
    EXPECT_EQ(status_["progress"], 1);
    EXPECT_EQ(status_["walk"]["fleet"]["total"].asUInt(), asked);
    EXPECT_EQ(status_["walk"]["fleet"]["answered"].asUInt(), asked);
    std::vector<Listed> told = List(person, Json::Value(Json::objectValue));
    std::ranges::sort(told);
    std::ranges::sort(wanted);
    EXPECT_EQ(told, wanted);
    EXPECT_EQ(total_, wanted.size());
    seen.insert(wanted.size());

    Json::Value sorted(Json::objectValue);
    sorted["sort_by"] = columns[below(3)];
    sorted["sort_direction"] = below(2) == 0 ? "ASC" : "DESC";
    const std::vector<Listed> whole = List(person, sorted);
    ASSERT_EQ(whole.size(), wanted.size());
    const bool descending = sorted["sort_direction"] == "DESC";
    for (size_t i = 1; i < whole.size() && sorted["sort_by"] == "size"; ++i) {
      EXPECT_TRUE(descending ? whole[i - 1].size >= whole[i].size
                             : whole[i - 1].size <= whole[i].size);
    }
    // Its pages, end to end, are the whole.
    std::vector<Listed> pages;
    sorted["limit"] = 31;
    for (int at = 0; at < static_cast<int>(whole.size()); at += 31) {
      sorted["offset"] = at;
      std::ranges::copy(List(person, sorted), std::back_inserter(pages));
    }
    EXPECT_EQ(pages, whole);
  }
  EXPECT_GT(seen.size(), 4U) << "the searches hardly differ";
}

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
  EXPECT_EQ(status_["progress"], -1);
  params["folder_path"] = "/box1/../data";
  Search(front, params);
  EXPECT_EQ(status_["progress"], -1);
}

}  // namespace
}  // namespace fleet_test
