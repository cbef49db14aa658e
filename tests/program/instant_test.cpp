// Instant answers: the best of what a walk finds, however they are come by.

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <random>

#include "nas/match/folded_name.h"
#include "nas/search/folder_walk.h"
#include "nas/search/index_best.h"
#include "nas/search/index_names.h"
#include "nas/search/instant.h"
#include "nas/search/instant_rank.h"
#include "tests/program/kept_rows.h"
#include "tests/program/program_test.h"
#include "tests/program/reference.h"
#include "tests/program/watched_tree.h"

namespace program_test {
namespace {

namespace fs = std::filesystem;

constexpr int kInOrder = 1500;

class Instant : public ProgramTest {
 protected:
  void SetUp() override {
    ProgramTest::SetUp();
    tree_ = share_ + "/tree";
    MakeHostileTree(tree_);
  }

  // Ranks of these, the best first.
  static std::vector<nas::InstantRank> RanksOf(const auto& paths, const std::string& folder,
                                               const std::string& query) {
    const nas::InstantRanking ranking(nas::Query::Parse(query)->root());
    std::vector<nas::InstantRank> ranks;
    for (const std::string& path : paths) {
      struct stat status = {};
      EXPECT_EQ(lstat(path.c_str(), &status), 0) << path;
      const auto depth = std::ranges::count(std::string_view(path).substr(folder.size()), '/');
      ranks.push_back(ranking.Rank(nas::FoldText(fs::path(path).filename().native()),
                                   static_cast<int>(depth), status.st_mtime));
    }
    std::ranges::sort(ranks);
    return ranks;
  }

  // The best by the index are as good as the best of all that a walk finds.
  void ExpectBest(const WatchedTree& index, const std::string& folder, const std::string& query) {
    constexpr std::chrono::milliseconds kEnough(60'000);
    Json::Value params;
    params["pattern"] = query;
    params["recursive"] = true;
    params["search_content"] = false;
    EngineSearch walk(params, share_, folder, dir_);
    nas::FolderWalk walked(walk.locations, true, walk.search);
    walk.Run(walked);
    std::vector<nas::InstantRank> all = RanksOf(walk.rows.paths(), folder, query);
    for (const size_t most : {size_t{100}, size_t{3}}) {
      EngineSearch engine(params, share_, folder, dir_);
      const nas::IndexSnapshot snapshot = index.snapshot();
      const auto top = nas::IndexNames::FolderOf(snapshot, engine.locations.front());
      nas::IndexNames names(
          snapshot, {engine.locations, top, {}, nas::FolderGate::RulesFor(engine.locations, true)},
          engine.search);
      nas::FindBest(names, snapshot, engine.locations.front(), engine.search, most,
                    {.ranking = kEnough, .best = kEnough, .further = {}, .in_order = kInOrder});
      all.resize(std::min(all.size(), most));
      EXPECT_EQ(RanksOf(engine.rows.paths(), folder, query), all) << most;
    }
  }

  std::string tree_;
};

// What is shown while somebody types: some of what a walk finds, all of it where there is room, in
// the order of what is most likely meant.
TEST_F(Instant, AreTheBestOfWhatAWalkFinds) {
  for (const char* name : {"/plan.txt", "/docs/floorplan.txt", "/docs/the plan.txt",
                           "/docs/planet.txt", "/docs/deep/plan b.txt"}) {
    WriteFile(tree_ + name, "");
  }
  WatchedTree index(share_, dir_);
  WriteFile(tree_ + "/docs/plan of today.txt", "");
  index.NoteName(tree_ + "/docs/plan of today.txt");
  fs::remove(tree_ + "/docs/planet.txt");  // noticed by looking, not by a note
  std::vector<nas::Location> locations;
  locations.push_back(std::move(*nas::OpenLocation("/share/tree")));
  const struct {
    const char* why;
    const char* query;
    size_t most;
    std::vector<std::string> names;
    bool complete;
  } rows[] = {
      {"the word first in the name, by itself, shallow; then within others",
       "plan",
       100,
       {"plan.txt", "plan of today.txt", "plan b.txt", "the plan.txt", "floorplan.txt"},
       true},
      {"fewer than there are", "plan", 2, {"plan.txt", "plan of today.txt"}, false},
      {"nothing", "no such name", 100, {}, true},
      {"by a regular expression", "regex:^floor.lan", 100, {"floorplan.txt"}, true},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.why);
    Answers answers(index, -1);
    const auto reply =
        nas::AskInstantly(locations, nas::Query::Parse(row.query)->root(), true, row.most, {},
                          [&](int location, bool) { return answers.Ask(location); });
    ASSERT_TRUE(reply);
    EXPECT_EQ(reply->state, nas::kIndexCurrent);
    std::vector<std::string> names;
    for (const auto& found : reply->rows) names.push_back(found.name);
    EXPECT_EQ(names, row.names);
    EXPECT_GE(reply->found, names.size());
    if (row.complete) {
      EXPECT_EQ(reply->found, names.size());
    }
  }
}

// So many that those which begin with what is asked for leave no room for the others.
TEST_F(Instant, AreTheBestOfVeryMany) {
  constexpr int kMany = 5000;
  for (int i = 0; i < kMany; ++i) WriteFile(tree_ + "/docs/deep/q" + std::to_string(i), "");
  for (int i = 0; i < kMany; ++i) WriteFile(tree_ + "/docs/" + std::to_string(i) + "q", "");
  WriteFile(tree_ + "/docs/q", "");
  const WatchedTree index(share_, dir_);
  std::vector<nas::Location> locations;
  locations.push_back(std::move(*nas::OpenLocation("/share/tree")));
  Answers answers(index, -1);
  nas::InstantReply reply;
  // A machine that does much else may not come that far at once.
  for (int tries = 0; tries < 50 && reply.rows.size() < 100; ++tries) {
    reply = nas::AskInstantly(locations, nas::Query::Parse("q")->root(), true, 100, {},
                              [&](int location, bool) { return answers.Ask(location); })
                .value_or({});
    EXPECT_TRUE(reply.more);
    for (const auto& row : reply.rows) EXPECT_TRUE(row.name.starts_with("q")) << row.name;
  }
  ASSERT_EQ(reply.rows.size(), 100U);
  EXPECT_EQ(reply.rows.front().name, "q");
}

// Folders of several depths, with names of few words, all of another age.
void MakeNames(const std::string& root, int count, std::mt19937& random) {
  static constexpr const char* kWords[] = {"photo", "music", "plan", "e", "\u00c9t\u00e9", "a1"};
  std::vector<std::string> folders = {root};
  for (int i = 0; i < count; ++i) {
    const std::string& folder = folders[random() % folders.size()];
    std::string name = kWords[random() % std::size(kWords)];
    name += std::string(random() % 3, "-_x"[random() % 3]) + kWords[random() % std::size(kWords)];
    std::string path =
        folder + "/" + name + std::to_string(i) + (random() % 8 == 0 ? " within" : "xwithin");
    if (i % 50 == 49) {
      fs::create_directory(path);
      folders.push_back(path);
      continue;
    }
    path += i % 7 == 0 ? ".jpg" : ".txt";
    WriteFile(path, i % 90 == 0 ? "text" : "");
    const fs::file_time_type now = fs::file_time_type::clock::now();
    fs::last_write_time(path, now - std::chrono::seconds(random() % 1'000'000));
  }
}

// However the best are come by: by going through the table's order, by words, or by putting all in
// order.
TEST_F(Instant, HasNoWorseThanAnyOther) {
  constexpr int kNames = 2 * kInOrder;
  std::mt19937 random(7);
  fs::create_directory(tree_ + "/many");
  MakeNames(tree_ + "/many", kNames, random);
  for (int i = 0; i < 8; ++i) WriteFile(tree_ + "/many/rare" + std::to_string(i), "");
  WriteFile(tree_ + "/docs/deep/rare", "");
  WatchedTree index(share_, dir_);
  for (const char* name : {"/many/photo", "/many/music e", "/docs/xphoto.jpg"}) {
    const fs::path folder = fs::path(tree_ + name).parent_path();
    const fs::file_time_type time = fs::last_write_time(folder);
    WriteFile(tree_ + name, "");
    index.NoteName(tree_ + name);
    fs::last_write_time(folder, time);  // which puts it in order
  }
  const char* const queries[] = {"photo",  "e",        "o",          "photo|music plan",
                                 "*.jpg",  "!photo",   "size:>1",    "\u00e9t\u00e9",
                                 "rare",   "*rare*",   "within",     "path:many/",
                                 "a1.jpg", "x",        "type:image", "regex:^p",
                                 "plan1",  "type:dir", "1",          "ext:jpg music",
                                 "!x !e"};
  for (const char* query : queries) {
    SCOPED_TRACE(query);
    ExpectBest(index, tree_, query);
  }
  ExpectBest(index, tree_ + "/docs", "o");  // few of the table's names
}

}  // namespace
}  // namespace program_test
