// The index as a source of names against a walk: every criterion, over a tree as it was scanned and
// as it has become since, for root and for users who may not see all of it.

#include <fcntl.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <random>
#include <thread>

#include "arbory/comparators.h"
#include "nas/base/json_text.h"
#include "nas/search/content_reading.h"
#include "nas/search/folder_walk.h"
#include "nas/search/index_answer.h"
#include "nas/search/index_names.h"
#include "nas/search/indexed_walk.h"
#include "nas/search/search_job.h"
#include "tests/program/cases.h"
#include "tests/program/kept_rows.h"
#include "tests/program/program_test.h"
#include "tests/program/watched_tree.h"

namespace program_test {
namespace {

namespace fs = std::filesystem;

struct Seen {
  std::multiset<std::string> paths;
  Json::Value walk;
  Json::Value source = {};  // as IndexedWalk tells it
};

// Does things to a tree that programs do, and notes them.
class Vandal {
 public:
  Vandal(std::string root, WatchedTree& tree, unsigned seed)
      : root_(std::move(root)), tree_(tree), random_(seed) {}

  void Act() {
    switch (Pick(10)) {
      case 0:
      case 1:
        return Make();
      case 2:
      case 3:
        return Rename();
      case 4:
        return Remove();
      case 5:
        return Write();
      case 6:
        return Chmod();
      case 7:
        return Link();
      case 8:
        return Replace();
      default:
        return MakeFolder();
    }
  }

 private:
  size_t Pick(size_t count) { return random_() % count; }
  std::string Any(bool folder) {
    std::vector<std::string> all = {root_};
    for (const auto& entry : fs::recursive_directory_iterator(root_)) {
      if (entry.is_directory() == folder && !entry.is_symlink()) all.push_back(entry.path());
    }
    return all.size() == 1 ? all[0] : all[folder ? Pick(all.size()) : 1 + Pick(all.size() - 1)];
  }
  std::string NewName() { return "new-" + std::to_string(Pick(12)) + (Pick(2) ? ".txt" : ".jpg"); }
  // As a watcher does: by the name, or by all of the folder where it has lost count.
  void Note(const std::string& path) {
    if (Pick(8) == 0) {
      tree_.NoteFolder(fs::path(path).parent_path());
    } else {
      tree_.NoteName(path);
    }
  }

  void Make() {
    const std::string path = Any(true) + "/" + NewName();
    if (fs::is_directory(path)) return;
    WriteFile(path, std::string(Pick(2000), 'x') + "the needle");
    Note(path);
  }
  void MakeFolder() {
    const std::string path = Any(true) + "/" + NewName();
    if (mkdir(path.c_str(), 0755) != 0) return;
    Note(path);
    WriteFile(path + "/inside.txt", "the needle");
    tree_.NoteName(path + "/inside.txt");
  }
  void Rename() {
    const std::string from = Any(Pick(2) == 0);
    const std::string to = Any(true) + "/" + NewName();
    if (from == root_ || to.starts_with(from + "/")) return;
    if (rename(from.c_str(), to.c_str()) != 0) return;
    Note(from);
    Note(to);
  }
  void Remove() {
    const std::string path = Any(Pick(3) == 0);
    if (path == root_ || Pick(2) == 0) return;
    fs::remove_all(path);
    Note(path);
  }
  // Another folder in the place of one, by the same name and perhaps with the same inode number.
  void Replace() {
    const std::string path = Any(true);
    if (path == root_) return;
    fs::remove_all(path);
    Note(path);
    fs::create_directory(path);
    Note(path);
    WriteFile(path + "/other.txt", "");
  }
  void Write() {
    const std::string path = Any(false);
    if (path == root_ || !fs::is_regular_file(fs::symlink_status(path))) return;
    fs::resize_file(path, Pick(3000));
    tree_.NoteInode(path);
  }
  void Chmod() {
    const std::string path = Any(Pick(2) == 0);
    if (path == root_) return;
    if (chmod(path.c_str(), Pick(3) == 0 ? 0700 : 0755) == 0) Note(path);
  }
  void Link() {
    const std::string path = Any(true) + "/" + NewName();
    if (Pick(2) == 0) {
      if (symlink("..", path.c_str()) == 0) Note(path);
      return;
    }
    const std::string from = Any(false);
    if (from == root_ || link(from.c_str(), path.c_str()) != 0) return;
    Note(path);
    tree_.NoteInode(from);
  }

  const std::string root_;
  WatchedTree& tree_;
  std::mt19937 random_;
};

class Index : public ProgramTest {
 protected:
  void SetUp() override {
    ProgramTest::SetUp();
    tree_ = share_ + "/tree";
    MakeHostileTree(tree_);
  }

  // The search by one source of names or another.
  Seen Search(const Json::Value& params, const std::string& folder, const WatchedTree* index) {
    EngineSearch engine(params, share_, folder, results_);
    const std::vector<nas::Location>& locations = engine.locations;
    nas::SharedSearch& search = engine.search;
    search.names_alone = names_alone_;
    const bool recursive = params["recursive"].asBool();
    std::unique_ptr<nas::NameSource> names;
    std::optional<nas::IndexSnapshot> snapshot;
    if (index != nullptr) {
      snapshot.emplace(index->snapshot());
      const auto top = nas::IndexNames::FolderOf(*snapshot, locations.front());
      EXPECT_NE(top, nas::NameTable::kNoFolder);
      const nas::IndexNames::Place place{
          locations, top, {}, nas::FolderGate::RulesFor(locations, recursive)};
      names = std::make_unique<nas::IndexNames>(*snapshot, place, search);
    } else if (ask_) {
      names = std::make_unique<nas::IndexedWalk>(
          locations,
          nas::IndexedWalk::Settings{.recursive = recursive,
                                     .texts_too = params["search_content"].asBool(),
                                     .temporary_folder = results_,
                                     .ask = ask_},
          search);
    } else {
      names = std::make_unique<nas::FolderWalk>(locations, recursive, search);
    }
    engine.Run(*names);
    const std::vector<std::string>& paths = engine.rows.paths();
    Seen seen{{paths.begin(), paths.end()}, search.progress.ToJson()};
    if (ask_) static_cast<nas::IndexedWalk&>(*names).Tell(&seen.source);
    return seen;
  }

  Way ByIndex(const WatchedTree& index) {
    return [this, &index](const Json::Value& params, const std::string& folder) {
      const Seen seen = Search(params, folder, &index);
      EXPECT_EQ(seen.walk["skipped"]["other"].asUInt64(), 0);
      EXPECT_EQ(seen.walk["skipped"]["vanished"].asUInt64(), 0);
      EXPECT_EQ(seen.walk["matches"].asUInt64(), seen.paths.size());
      return Found{{seen.paths.begin(), seen.paths.end()},
                   static_cast<size_t>(seen.walk["skipped"]["permission"].asUInt64())};
    };
  }

  // Every case by both sources: the same rows, the same counts of what was left out; with all that
  // rows tell and with names alone.
  void CompareWithWalk(const std::string& folder, const WatchedTree& index) {
    for (const Case& row : Cases()) {
      SCOPED_TRACE(row.why);
      Json::Value params;
      ASSERT_TRUE(nas::ParseJson(row.params, &params));
      if (!params.isMember("recursive")) params["recursive"] = true;
      if (!params.isMember("search_content")) params["search_content"] = false;
      for (names_alone_ = true;; names_alone_ = false) {
        const Seen walked = Search(params, folder, nullptr);
        const Seen indexed = Search(params, folder, &index);
        EXPECT_EQ(indexed.paths, walked.paths) << names_alone_;
        for (const char* counted : {"skipped", "files", "matches"}) {
          EXPECT_EQ(indexed.walk[counted], walked.walk[counted]) << counted << names_alone_;
        }
        if (!names_alone_) break;
      }
    }
  }

  std::function<nas::IndexAnswer(int location, bool asks_times)> ask_;  // where not empty
  bool names_alone_ = false;
  std::string tree_;
  std::string results_ = "/tmp";  // for the files that wait to be read
};

TEST_F(Index, EveryCriterionOverWhatWasScanned) {
  const WatchedTree index(share_, dir_);
  CompareAll(tree_, ByIndex(index));
  CompareWithWalk(tree_ + "/docs", index);
}

TEST_F(Index, EveryCriterionAfterRandomChanges) {
  constexpr int kRounds = 12;
  constexpr int kActions = 8;
  for (unsigned seed = 1; seed <= 3; ++seed) {
    fs::remove_all(tree_);
    MakeHostileTree(tree_);
    WatchedTree index(share_, dir_);
    Vandal vandal(tree_, index, seed);
    for (int round = 0; round < kRounds; ++round) {
      SCOPED_TRACE("seed " + std::to_string(seed) + ", round " + std::to_string(round));
      for (int i = 0; i < kActions; ++i) vandal.Act();
      CompareWithWalk(share_, index);
      if (HasFailure()) return;
    }
  }
}

// Becomes another user for good, without other groups.
void Become(uid_t user) {
  ASSERT_EQ(setgroups(0, nullptr), 0);
  ASSERT_EQ(setresgid(user, user, user), 0);
  ASSERT_EQ(setresuid(user, user, user), 0);
}

// Half of the tree is another's, or closed in part.
TEST_F(Index, UsersFindWhatTheirOwnWalkFindsAndLearnOfNothingElse) {
  SKIP_UNLESS_ROOT();
  constexpr uid_t kOwner = 1;
  constexpr uid_t kMember = 2;
  constexpr uid_t kStranger = 65'534;
  MakeFolder("volume1/share/tree/listed/below");
  MakeFolder("volume1/share/tree/entered/below/deeper");
  for (const char* name :
       {"/listed/a.txt", "/listed/below/b.txt", "/entered/c.txt", "/entered/below/deeper/d.txt"}) {
    WriteFile(tree_ + name, "the needle");
  }
  const struct {
    const char* path;
    uid_t owner;
    gid_t group;
    mode_t mode;
  } folders[] = {{"/docs", kOwner, kMember, 0750},
                 {"/listed", 0, 0, 0744},
                 {"/entered", 0, 0, 0711},
                 {"/docs/deep", kMember, kMember, 0700}};
  for (const auto& folder : folders) {
    const std::string path = tree_ + folder.path;
    ASSERT_EQ(chown(path.c_str(), folder.owner, folder.group), 0);
    ASSERT_EQ(chmod(path.c_str(), folder.mode), 0);
  }
  ASSERT_EQ(chmod(dir_.c_str(), 0755), 0);
  const WatchedTree index(share_, dir_);
  for (const uid_t user : {kOwner, kMember, kStranger}) {
    SCOPED_TRACE(user);
    EXPECT_TRUE(nas_test::InChild([&] {
      Become(user);
      CompareWithWalk(tree_, index);
    }));
  }
  // Names in a closed folder change nothing that a stranger is told.
  const Json::Value params = Json_(R"({"pattern": "secret", "recursive": true})");
  EXPECT_TRUE(nas_test::InChild([&] {
    WriteFile(tree_ + "/docs/deep/secret.txt", "");
    const WatchedTree later(share_, dir_);
    WriteFile(tree_ + "/entered/below/secret.txt", "");
    WatchedTree noted(share_, dir_);
    noted.NoteName(tree_ + "/docs/deep/secret.txt");
    Become(kStranger);
    const Json::Value before = Search(params, tree_, &index).walk;
    EXPECT_EQ(Search(params, tree_, &later).walk, before);
    EXPECT_EQ(Search(params, tree_, &noted).walk, before);
  }));
}

// Where some process's mappings are hidden, any file that has a page may have changed.
TEST_F(Index, DoesNotBelieveTimesOfFilesThatMayBeMapped) {
  WriteFile(tree_ + "/docs/mapped", "x");
  WriteFile(tree_ + "/docs/empty", "");
  const WatchedTree index(share_, dir_);
  const fs::file_time_type old = fs::file_time_type::clock::now() - std::chrono::hours(100'000);
  fs::last_write_time(tree_ + "/docs/mapped", old);  // as silently
  nas::IndexSnapshot snapshot = index.snapshot();
  for (const bool known : {true, false}) {
    snapshot.mappings_known = known;
    Json::Value params;
    params["pattern"] = "modified:<2020";
    EngineSearch engine(params, share_, tree_, results_);
    const auto top = nas::IndexNames::FolderOf(snapshot, engine.locations.front());
    nas::IndexNames names(
        snapshot, {engine.locations, top, {}, nas::FolderGate::RulesFor(engine.locations, true)},
        engine.search);
    nas::EntryFilter filter(names.filter(), engine.locations.front());
    std::vector<nas::NameTable::EntryId> found;
    while (names.NextCandidates(filter, &found) > 0) {
    }
    std::set<std::string_view> candidates;
    for (const auto entry : found) candidates.insert(index.table().name(entry));
    EXPECT_EQ(candidates.contains("mapped"), !known);
    EXPECT_FALSE(candidates.contains("empty"));
    EXPECT_FALSE(candidates.contains("docs"));
  }
}

TEST_F(Index, AnswersOverAConnectionThatMayBreak) {
  for (int i = 0; i < 3000; ++i) WriteFile(tree_ + "/many-" + std::to_string(i) + ".txt", "");
  const WatchedTree index(share_, dir_);
  const struct {
    const char* why;
    int frames;
    const char* source;
  } rows[] = {
      {"whole", -1, "index"}, {"broken at once", 0, "walk"}, {"broken among its rows", 2, "walk"}};
  for (const auto& row : rows) {
    for (const Case& one : Cases()) {
      SCOPED_TRACE(std::string(row.why) + ": " + one.why);
      Json::Value params = Json_(one.params);
      for (const char* flag : {"recursive", "search_content"}) {
        if (!params.isMember(flag)) params[flag] = flag == std::string_view("recursive");
      }
      const Seen walked = Search(params, tree_, nullptr);
      Answers answers(index, row.frames);
      ask_ = [&](int location, bool) { return answers.Ask(location); };
      const Seen answered = Search(params, tree_, nullptr);
      ask_ = nullptr;
      EXPECT_EQ(answered.paths, walked.paths);
      EXPECT_EQ(answered.walk["skipped"], walked.walk["skipped"]);
      EXPECT_EQ(answered.walk["matches"], walked.walk["matches"]);
      // A short answer is whole before it breaks.
      if (row.frames <= 0) {
        EXPECT_EQ(answered.source["source"], row.source);
      }
    }
  }
}

}  // namespace
}  // namespace program_test
