// That a fleet's answer is the sorted union of what its boxes tell the same user: random trees and
// rights, queries, columns, users and pages.

#include <pwd.h>

#include <algorithm>
#include <map>
#include <random>
#include <set>

#include "tests/fleet/front.h"

namespace fleet_test {
namespace {

using nas_test::AmRoot;

constexpr const char* kPatterns[] = {"invoice",  "*.pdf",   "1",          "photo ext:txt",
                                     "size:>20", "nothing", "owner:root", ""};
constexpr const char* kColumns[] = {"name", "size", "path", "type", "user"};

class UnionTest : public FrontTest {
 protected:
  void SetUp() override {
    FrontTest::SetUp();
    users_ = AmRoot() ? std::vector<std::string>{kAnn, kBob} : std::vector<std::string>{User()};
  }

  int Below(int most) { return static_cast<int>(random_() % static_cast<unsigned>(most)); }

  // The first boxes have most files, so that rows are not spread evenly. Half of the folders are
  // closed to one of the users.
  void MakeTree(const Box& box, int files) {
    for (int i = 0; i < files; ++i) {
      const std::string folder = "folder " + std::to_string(Below(6));
      const std::string name = std::string(Below(2) == 0 ? "Invoice " : "photo ") +
                               std::to_string(Below(400)) + (Below(2) == 0 ? ".txt" : ".PDF");
      MakeFile(box, folder + "/" + name, "", std::string(static_cast<size_t>(Below(50)), 'x'));
    }
    if (!AmRoot()) return;
    for (int i = 0; i < 6; ++i) {
      const std::string folder = box.share + "/folder " + std::to_string(i);
      const passwd* owner = getpwnam(users_[static_cast<size_t>(Below(2))].c_str());
      if (chown(folder.c_str(), owner->pw_uid, 0) == 0) {
        EXPECT_EQ(chmod(folder.c_str(), Below(2) == 0 ? 0700 : 0755), 0);
      }
    }
  }

  // What each box tells the user of a search, by itself.
  std::vector<Listed> AskBoxes(const std::vector<Server>& sessions, const std::vector<Box>& boxes,
                               Json::Value params) {
    std::vector<Listed> all;
    for (size_t i = 0; i < boxes.size(); ++i) {
      params["folder_path"] = Json::Value(Json::arrayValue);
      params["folder_path"].append("/data");
      Search(sessions[i], params);
      for (Listed file : List(sessions[i], Json::Value(Json::objectValue))) {
        file.path = "/" + boxes[i].name + file.path;
        all.push_back(file);
      }
    }
    return all;
  }

  // `page` is that part of the files, sorted by the column; equal ones may stand in any order.
  static void CheckPage(const std::vector<Listed>& page, const std::vector<Listed>& all,
                        const Json::Value& listing) {
    const std::string column = listing["sort_by"].asString();
    std::vector<std::string> keys = KeysOf(all, column);
    std::ranges::sort(keys);
    if (listing["sort_direction"] == "DESC") std::ranges::reverse(keys);
    const size_t from = std::min<size_t>(keys.size(), listing["offset"].asUInt());
    const size_t count = std::min<size_t>(keys.size() - from, listing["limit"].asUInt());
    const auto begin = keys.begin() + static_cast<std::ptrdiff_t>(from);
    keys = {begin, begin + static_cast<std::ptrdiff_t>(count)};
    EXPECT_EQ(KeysOf(page, column), keys);
    const std::set<Listed> known(all.begin(), all.end());
    const std::set<Listed> told(page.begin(), page.end());
    EXPECT_EQ(told.size(), page.size()) << "a row came twice";
    EXPECT_TRUE(std::ranges::includes(known, told)) << "a row that no box tells";
  }

  Json::Value RandomListing() {
    Json::Value listing;
    listing["sort_by"] = kColumns[Below(std::size(kColumns))];
    listing["sort_direction"] = Below(2) == 0 ? "ASC" : "DESC";
    listing["limit"] = Below(2) == 0 ? 100 : 7;
    listing["additional"] = "size,owner";
    return listing;
  }

  // The first rows of a search that is just begun, as soon as there are any.
  std::vector<Listed> Begin(const Server& front, Json::Value params, const Json::Value& listing) {
    params["list"] = listing;
    const Json::Value begun = front.Post("/searches", Text(params)).json();
    task_ = begun["taskid"].asString();
    EXPECT_TRUE(begun["page"].isObject()) << Text(begun);
    Json::Value page = begun["page"];
    EXPECT_TRUE(nas_test::Eventually([&] {
      if (page["finished"].asBool() || !page["files"].empty()) return true;
      Json::Value again = listing;
      again["taskid"] = task_;
      page = front.Call("list", Text(again)).json()["data"];
      return false;
    }));
    return FilesOf(page["files"]);
  }

  std::mt19937 random_{20261122};
  std::vector<std::string> users_;
};

TEST_F(UnionTest, TellsTheSortedUnionOfWhatEachBoxTells) {
  std::vector<Box> boxes;
  for (const int files : {300, 120, 120, 40, 5}) {
    boxes.push_back(StartBox("box" + std::to_string(boxes.size() + 1)));
    MakeTree(boxes.back(), files);
  }
  const Server front = StartFront(boxes, "deadline_ms = 40000\nfirst_page_ms = 1000\n");
  std::map<std::string, std::vector<Server>> sessions;  // of each user, at the boxes and the front
  for (const std::string& user : users_) {
    for (const Box& box : boxes) sessions[user].push_back(LoggedIn(box.server, user));
    sessions[user].push_back(LoggedIn(front, user));
  }
  std::set<size_t> seen;  // how many rows different users were told
  for (int round = 0; round < 16; ++round) {
    const std::string& user = users_[static_cast<size_t>(round) % users_.size()];
    const Server& person = sessions[user].back();
    Json::Value params;
    params["pattern"] = kPatterns[Below(std::size(kPatterns))];
    const size_t asked = Below(3) == 0 ? 1 : boxes.size();
    for (size_t i = 0; i < asked; ++i) {
      params["folder_path"].append("/" + boxes[i].name + "/data");
    }
    SCOPED_TRACE(user + " " + Text(params));
    const std::vector<Listed> wanted =
        AskBoxes(sessions[user], {boxes.begin(), boxes.begin() + static_cast<long>(asked)}, params);
    seen.insert(wanted.size());

    Json::Value listing = RandomListing();
    SCOPED_TRACE(Text(listing));
    CheckPage(Begin(person, params, listing), wanted, listing);

    Search(person, params);
    EXPECT_EQ(status_["progress"], 1);
    EXPECT_EQ(status_["walk"]["fleet"]["total"].asUInt(), asked);
    EXPECT_EQ(status_["walk"]["fleet"]["answered"].asUInt(), asked);
    listing["offset"] = Below(100);
    CheckPage(List(person, listing), wanted, listing);
    EXPECT_EQ(total_, wanted.size());
  }
  EXPECT_GT(seen.size(), 4U) << "the searches hardly differ";
}

}  // namespace
}  // namespace fleet_test
