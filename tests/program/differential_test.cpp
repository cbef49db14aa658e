// Every criterion against a naive walk, over a tree of hostile names, by both roads: the program,
// and the API as a browser uses it.

#include <fnmatch.h>
#include <regex.h>
#include <strings.h>

#include <algorithm>

#include "tests/program/program_test.h"
#include "tests/program/reference.h"

namespace program_test {
namespace {

using Wanted = std::function<bool(const Entry&)>;

struct Case {
  const char* why;
  const char* params;  // of "start", without "folder_path"
  Wanted wanted;
};

bool Holds(const std::string& text, const char* word) {
  return strcasestr(text.c_str(), word) != nullptr;
}
bool Ends(const std::string& text, const std::string& end) {
  return text.size() > end.size() &&
         strcasecmp(text.c_str() + text.size() - end.size(), end.c_str()) == 0;
}
bool Glob(const Entry& entry, const char* pattern) {
  return fnmatch(pattern, entry.name.c_str(), FNM_CASEFOLD) == 0;
}
bool MatchesRegex(const std::string& name, const char* expression) {
  regex_t compiled;
  EXPECT_EQ(regcomp(&compiled, expression, REG_EXTENDED | REG_ICASE | REG_NOSUB), 0);
  const bool matches = regexec(&compiled, name.c_str(), 0, nullptr, 0) == 0;
  regfree(&compiled);
  return matches;
}
bool IsCafe(const std::string& name) {
  return name.starts_with("caf\u00e9") || name.starts_with("cafe\u0301");
}
long Modified(const Entry& entry) { return entry.info.st_mtim.tv_sec; }
long Read(const Entry& entry) { return entry.info.st_atim.tv_sec; }

const std::vector<Case>& Cases() {
  static const std::vector<Case> cases = {
      {"everything", R"({"pattern": ""})", [](const Entry&) { return true; }},
      {"nothing", R"({"pattern": "no such name"})", [](const Entry&) { return false; }},
      {"a word, any case", R"({"pattern": "TXT"})",
       [](const Entry& e) { return Holds(e.name, "txt"); }},
      {"a glob is the whole name", R"({"pattern": "*.txt"})",
       [](const Entry& e) { return Glob(e, "*.txt"); }},
      {"one character and a set", R"({"pattern": "?mg[0-9].j*"})",
       [](const Entry& e) { return Glob(e, "?mg[0-9].j*"); }},
      {"two words and a third that is not", R"({"pattern": "a g !txt"})",
       [](const Entry& e) {
         return Holds(e.name, "a") && Holds(e.name, "g") && !Holds(e.name, "txt");
       }},
      {"either", R"({"pattern": "jpg|pdf"})",
       [](const Entry& e) { return Holds(e.name, "jpg") || Holds(e.name, "pdf"); }},
      {"a quoted wildcard is itself", R"({"pattern": "\"*\""})",
       [](const Entry& e) { return Holds(e.name, "*"); }},
      {"a regular expression", R"({"pattern": "regex:^[a-z]+[.](txt|jpg)$"})",
       [](const Entry& e) { return MatchesRegex(e.name, "^[a-z]+[.](txt|jpg)$"); }},
      {"composed finds decomposed", R"({"pattern": "caf\u00e9"})",
       [](const Entry& e) { return IsCafe(e.name); }},
      {"decomposed finds composed", R"({"pattern": "CAFE\u0301"})",
       [](const Entry& e) { return IsCafe(e.name); }},
      {"case beyond ASCII", R"({"pattern": "\u00fcber"})",
       [](const Entry& e) { return e.name.starts_with("\u00dcB") || e.name == "\u00dcber"; }},
      {"a newline is part of a name", R"({"pattern": "*\n*"})",
       [](const Entry& e) { return Holds(e.name, "\n"); }},
      {"a leading dash", R"({"pattern": "--help"})",
       [](const Entry& e) { return e.name == "--help"; }},
      {"what looks like SQL", R"({"pattern": "\"'; DROP\""})",
       [](const Entry& e) { return Holds(e.name, "'; drop"); }},
      {"one extension", R"({"extension": "txt"})",
       [](const Entry& e) { return !e.is_dir() && Ends(e.name, ".txt"); }},
      {"several, as people write them", R"({"extension": ".JPG; *.pdf,tar.gz"})",
       [](const Entry& e) {
         return !e.is_dir() &&
                (Ends(e.name, ".jpg") || Ends(e.name, ".pdf") || Ends(e.name, ".tar.gz"));
       }},
      {"folders", R"({"filetype": "dir"})", [](const Entry& e) { return e.is_dir(); }},
      {"files", R"({"filetype": "file"})", [](const Entry& e) { return !e.is_dir(); }},
      {"a category", R"({"filetype": "image"})",
       [](const Entry& e) {
         return !e.is_dir() && (Ends(e.name, ".jpg") || Ends(e.name, ".png"));
       }},
      {"size, both edges", R"({"size_from": 1023, "size_to": 1024})",
       [](const Entry& e) {
         return !e.is_dir() && e.info.st_size >= 1023 && e.info.st_size <= 1024;
       }},
      {"empty files", R"({"size_to": 0})",
       [](const Entry& e) { return !e.is_dir() && e.info.st_size == 0; }},
      {"bounds that cross", R"({"size_from": 2, "size_to": 1})",
       [](const Entry&) { return false; }},
      {"modified, both edges", R"({"mtime_from": 1700000010, "mtime_to": 1700000020})",
       [](const Entry& e) { return Modified(e) >= 1700000010 && Modified(e) <= 1700000020; }},
      {"last read", R"({"atime_to": 1699999990})",
       [](const Entry& e) { return Read(e) <= 1699999990; }},
      {"only the folder itself", R"({"pattern": "txt", "recursive": false})",
       [](const Entry& e) { return Holds(e.name, "txt"); }},
      {"criteria together",
       R"({"pattern": "a*", "extension": "txt", "size_from": 1, "mtime_from": 1700000030})",
       [](const Entry& e) {
         return Glob(e, "a*") && Ends(e.name, ".txt") && !e.is_dir() && e.info.st_size >= 1 &&
                Modified(e) >= 1700000030;
       }},
      {"contents", R"({"pattern": "the needle", "search_content": true})",
       [](const Entry& e) {
         const std::string text = TextOf(e.path);
         const auto has = [&](const char* word) {
           return Holds(e.name, word) || Holds(text, word);
         };
         return (Holds(e.name, "the") && Holds(e.name, "needle")) || (has("the") && has("needle"));
       }},
      {"contents of large files only",
       R"({"pattern": "needle", "size_from": 2000, "search_content": true})",
       [](const Entry& e) {
         return !e.is_dir() && e.info.st_size >= 2000 && Holds(TextOf(e.path), "needle");
       }},
  };
  return cases;
}

// The same search as words of a command line.
std::vector<std::string> Arguments(const Json::Value& params, const std::string& folder) {
  std::vector<std::string> words = {"search", "-0"};
  for (const std::string& name : params.getMemberNames()) {
    const Json::Value& value = params[name];
    std::string option = "--" + name;
    std::replace(option.begin(), option.end(), '_', '-');
    if (name == "recursive") {
      if (!value.asBool()) words.push_back("--no-recursive");
    } else if (name == "search_content") {
      if (value.asBool()) words.push_back("--content");
    } else if (name == "filetype") {
      words.insert(words.end(), {"--type", value.asString()});
    } else if (name != "pattern" && name != "folder_path") {
      words.insert(words.end(), {option, value.asString()});
    }
  }
  words.insert(words.end(), {"--", params.get("pattern", "").asString(), folder});
  return words;
}

class Differential : public ProgramTest {
 protected:
  void Compare(const Case& row, const std::string& folder) {
    SCOPED_TRACE(row.why);
    const Json::Value params = Json_(row.params);
    const Reference expected = Walk(folder, params.get("recursive", true).asBool(), row.wanted);
    const Output output = Run(Arguments(params, folder));
    const auto pieces = Pieces(output.out, '\0');
    EXPECT_EQ(std::set<std::string>(pieces.begin(), pieces.end()), expected.paths);
    EXPECT_EQ(pieces.size(), expected.paths.size()) << "a path is printed twice";
    EXPECT_EQ(output.exit_code, expected.paths.empty() ? 1 : 0) << output.err;
    const std::string count = std::to_string(expected.unreadable);
    const std::string skipped = "arbory: " + count + " folder" +
                                (expected.unreadable == 1 ? "" : "s") +
                                " could not be read (permission denied)\n";
    const bool entered = params.get("recursive", true).asBool() && expected.unreadable > 0;
    EXPECT_EQ(output.err, entered ? skipped : "");
  }
};

TEST_F(Differential, EveryCriterionThroughTheProgram) {
  MakeHostileTree(share_ + "/tree");
  for (const Case& row : Cases()) Compare(row, share_ + "/tree");
}

TEST_F(Differential, EveryCriterionThroughTheApi) {
  MakeHostileTree(share_ + "/tree");
  for (const Case& row : Cases()) {
    SCOPED_TRACE(row.why);
    Json::Value params = Json_(row.params);
    const Reference expected =
        Walk(share_ + "/tree", params.get("recursive", true).asBool(), row.wanted);
    params["folder_path"] = "/share/tree";
    if (!params.isMember("search_content")) params["search_content"] = false;
    const Reply reply = ListToEnd(Start(params));
    // Names that are not UTF-8 are cleaned for the client, so paths are counted and the clean ones
    // compared.
    EXPECT_EQ(reply.data["total"].asUInt64(), expected.paths.size());
    EXPECT_EQ(reply.data["files"].size(), expected.paths.size());
    for (const Json::Value& file : reply.data["files"]) {
      const std::string path = file["real_path"].asString();
      const bool cleaned = path.find("\uFFFD") != std::string::npos;
      EXPECT_TRUE(cleaned || expected.paths.contains(path)) << path;
    }
  }
}

TEST_F(Differential, UnreadableFoldersAreSkippedAndCountedForAnOrdinaryUser) {
  MakeHostileTree(share_ + "/tree");
  for (const char* below : {"/docs", "/\u00dcber"}) {
    ASSERT_EQ(chmod((share_ + "/tree" + below).c_str(), 0), 0);
  }
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    for (const Case& row : Cases()) Compare(row, share_ + "/tree");
  }));
}

TEST_F(Differential, OwnerAndGroup) {
  SKIP_UNLESS_ROOT();
  MakeHostileTree(share_ + "/tree");
  const std::vector<Case> cases = {
      {"owner", R"({"owner": "daemon"})", [](const Entry& e) { return e.info.st_uid == 1; }},
      {"group", R"({"group": "bin"})", [](const Entry& e) { return e.info.st_gid == 2; }},
      {"both", R"({"owner": "root", "group": "bin"})", [](const Entry&) { return false; }},
  };
  for (const Case& row : cases) Compare(row, share_ + "/tree");
}

// A folder is reached through whatever share it lies in, or one of its own, and searched once.
TEST_F(Differential, FoldersOfEveryKind) {
  MakeHostileTree(share_ + "/tree");
  MakeHostileTree(dir_ + "/elsewhere/homes/ann");
  const std::string tree = share_ + "/tree";
  const Wanted all = [](const Entry&) { return true; };
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
    std::vector<std::string> words = {"search", "-0", ""};
    words.insert(words.end(), row.folders.begin(), row.folders.end());
    const Output output = Run(words);
    const auto pieces = Pieces(output.out, '\0');
    EXPECT_EQ(std::set<std::string>(pieces.begin(), pieces.end()), expected) << output.err;
    EXPECT_EQ(pieces.size(), expected.size());
  }
}

}  // namespace
}  // namespace program_test
