// Every criterion against a naive walk, over a tree of hostile names, by each way there is: the
// engine alone, the program, and the API as a browser uses it. The way over HTTP is the server
// tests'.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>

#include "arbory/comparators.h"
#include "nas/search/content_reading.h"
#include "nas/search/explain.h"
#include "nas/search/folder_walk.h"
#include "nas/search/search_job.h"
#include "nas/system/config.h"
#include "tests/program/cases.h"
#include "tests/program/kept_rows.h"
#include "tests/program/program_test.h"

namespace program_test {
namespace {

// The paths of `-0`, without what marks folders.
std::vector<std::string> PathsOf(const Output& output) {
  std::vector<std::string> paths = Pieces(output.out, '\0');
  for (std::string& path : paths) {
    if (path.ends_with('/')) path.pop_back();
  }
  return paths;
}

// The same search as words of a command line.
std::vector<std::string> Arguments(const Json::Value& params, const std::string& folder) {
  std::vector<std::string> words = {"search", "-a0"};
  std::string pattern = params.get("pattern", "").asString();
  for (const std::string& name : params.getMemberNames()) {
    const Json::Value& value = params[name];
    std::string option = "--" + name;
    std::replace(option.begin(), option.end(), '_', '-');
    if (name == "recursive") {
      if (!value.asBool()) words.push_back("--no-recursive");
    } else if (name == "search_content") {
      if (value.asBool()) words.push_back("--content");
    } else if (name == "filetype") {
      // "file" is whatever is no folder to the API, and a regular file to people.
      if (value == "file")
        pattern.insert(0, "!type:dir ");
      else
        words.insert(words.end(), {"--type", value.asString()});
    } else if (name != "pattern" && name != "folder_path") {
      words.insert(words.end(), {option, value.asString()});
    }
  }
  words.insert(words.end(), {"--", pattern, folder});
  return words;
}

class Differential : public ProgramTest {
 protected:
  Found ByEngine(const Json::Value& params, const std::string& folder) const {
    EngineSearch engine(params, share_, folder, dir_);
    nas::FolderWalk walk(engine.locations, params["recursive"].asBool(), engine.search);
    engine.Run(walk);
    const Json::Value seen = engine.search.progress.ToJson();
    EXPECT_EQ(seen["matches"].asUInt64(), engine.rows.paths().size());
    EXPECT_EQ(seen["skipped"]["other"].asUInt64(), 0) << "something was opened that never is";
    return {engine.rows.paths(), static_cast<size_t>(seen["skipped"]["permission"].asUInt64())};
  }

  // Asks of every file there is whether it would be found.
  Found ByExplaining(const Json::Value& params, const std::string& folder) const {
    std::vector<nas::Location> locations;
    locations.push_back(std::move(*nas::OpenLocation("/share" + folder.substr(share_.size()))));
    const arbory::Comparators comparators(params);
    const nas::ExplainedSearch search{locations, comparators.get(), params["recursive"].asBool(),
                                      params["search_content"].asBool()};
    Found found;
    for (const std::string& path : Walk(folder, true, [](const Entry&) { return true; }).paths) {
      const auto answer = nas::Explain(search, 0, path.substr(folder.size() + 1));
      EXPECT_TRUE(answer) << path;
      if (answer && answer->refusal == nas::Refusal::kNone) found.paths.push_back(path);
    }
    return found;
  }

  Found ByProgram(const Json::Value& params, const std::string& folder) {
    const Output output = Run(Arguments(params, folder));
    Found found{PathsOf(output)};
    // The API finds nothing between bounds that cross; a person is told.
    if (params.isMember("size_from") && params.isMember("size_to") &&
        params["size_to"] < params["size_from"]) {
      EXPECT_EQ(output.exit_code, 2);
      found.refused = true;
      return found;
    }
    EXPECT_EQ(output.exit_code, found.paths.empty() ? 1 : 0) << output.err;
    const size_t nothing = output.err.find("arbory: nothing found among ");
    EXPECT_EQ(nothing != std::string::npos, found.paths.empty()) << output.err;
    for (const std::string& line : Pieces(output.err.substr(0, nothing), '\n')) {
      char what[sizeof("folders could not be read (permission denied)")] = "";
      size_t count = 0;
      EXPECT_EQ(std::sscanf(line.c_str(), "arbory: %zu %45[^\n]", &count, what), 2) << line;
      const std::string_view rest = what;
      if (rest.starts_with("file")) continue;
      EXPECT_TRUE(rest.starts_with("folder") &&
                  rest.ends_with(" could not be read (permission denied)"))
          << line;
      found.unreadable = count;
    }
    return found;
  }

  Found ByApi(Json::Value params, const std::string& folder) {
    params["folder_path"] = "/share" + folder.substr(share_.size());
    const Reply reply = ListToEnd(Start(params));
    EXPECT_EQ(reply.data["total"].asUInt64(), reply.data["files"].size());
    Found found{{}, 0, true};
    for (const Json::Value& file : reply.data["files"]) {
      found.paths.push_back(file["real_path"].asString());
    }
    return found;
  }

  Way Program() {
    return [this](const auto& params, const auto& folder) { return ByProgram(params, folder); };
  }
};

TEST_F(Differential, EveryCriterionThroughTheEngine) {
  MakeHostileTree(share_ + "/tree");
  CompareAll(share_ + "/tree",
             [this](const auto& params, const auto& folder) { return ByEngine(params, folder); });
}

TEST_F(Differential, EveryCriterionExplained) {
  MakeHostileTree(share_ + "/tree");
  CompareAll(share_ + "/tree", [this](const auto& params, const auto& folder) {
    return ByExplaining(params, folder);
  });
}

TEST_F(Differential, EveryCriterionThroughTheProgram) {
  MakeHostileTree(share_ + "/tree");
  CompareAll(share_ + "/tree", Program());
}

TEST_F(Differential, EveryCriterionThroughTheApi) {
  MakeHostileTree(share_ + "/tree");
  CompareAll(share_ + "/tree",
             [this](const auto& params, const auto& folder) { return ByApi(params, folder); });
}

TEST_F(Differential, UnreadableFoldersAreSkippedAndCountedForAnOrdinaryUser) {
  MakeHostileTree(share_ + "/tree");
  for (const char* below : {"/docs", "/\u00dcber"}) {
    ASSERT_EQ(chmod((share_ + "/tree" + below).c_str(), 0), 0);
  }
  EXPECT_TRUE(
      InOrdinaryChild([&](const std::string&) { CompareAll(share_ + "/tree", Program()); }));
}

TEST_F(Differential, OwnerAndGroup) {
  SKIP_UNLESS_ROOT();
  MakeHostileTree(share_ + "/tree");
  const std::vector<Case> cases = {
      {"owner", R"({"owner": "daemon"})", [](const Entry& e) { return e.info.st_uid == 1; }},
      {"group", R"({"group": "bin"})", [](const Entry& e) { return e.info.st_gid == 2; }},
      {"both", R"({"owner": "root", "group": "bin"})", [](const Entry&) { return false; }},
  };
  for (const Case& row : cases) Compare(row, share_ + "/tree", Program());
}

// A folder is reached through whatever share it lies in, or one of its own, and searched once.
TEST_F(Differential, FoldersOfEveryKind) {
  MakeHostileTree(share_ + "/tree");
  MakeHostileTree(dir_ + "/elsewhere/homes/ann");
  const std::string tree = share_ + "/tree";
  const auto all = [](const Entry&) { return true; };
  struct {
    const char* why;
    std::vector<std::string> folders;
    std::vector<std::string> walked;
  } const cases[] = {
      {"the current folder", {}, {share_}},
      {"a relative one", {"tree/docs"}, {tree + "/docs"}},
      {"one twice, and one inside it", {tree, "tree/", tree + "/docs"}, {tree}},
      {"a share and a folder outside every share",
       {tree, dir_ + "/elsewhere"},
       {tree, dir_ + "/elsewhere"}},
      {"inside a folder called homes",
       {dir_ + "/elsewhere/homes/ann"},
       {dir_ + "/elsewhere/homes/ann"}},
      {"two outside of the same name",
       {dir_ + "/elsewhere/homes/ann/docs", dir_ + "/one/docs"},
       {dir_ + "/elsewhere/homes/ann/docs", dir_ + "/one/docs"}},
      {"a name with a comma and one in brackets",
       {tree + "/comma, folder", "[x,y]"},
       {tree + "/comma, folder", share_ + "/[x,y]"}},
      {"through a symbolic link", {tree + "/docs/loop.txt"}, {tree}},
  };
  MakeFolder("one/docs/below");
  MakeFolder("volume1/share/[x,y]/below");
  for (const auto& row : cases) {
    SCOPED_TRACE(row.why);
    std::set<std::string> expected;
    for (const std::string& folder : row.walked) expected.merge(Walk(folder, true, all).paths);
    std::vector<std::string> words = {"search", "-a0", ""};
    words.insert(words.end(), row.folders.begin(), row.folders.end());
    const Output output = Run(words);
    const auto pieces = PathsOf(output);
    EXPECT_EQ(std::set<std::string>(pieces.begin(), pieces.end()), expected) << output.err;
    EXPECT_EQ(pieces.size(), expected.size());
  }
}

}  // namespace
}  // namespace program_test
