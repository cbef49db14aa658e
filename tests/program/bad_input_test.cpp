// What a request should not hold: each gets a clear code, and no search is left that says it runs.

#include "nas/base/json_text.h"
#include "tests/program/program_test.h"

namespace program_test {
namespace {

class BadInput : public ProgramTest {
 protected:
  static Json::Value With(const std::string& params, const std::string& id) {
    std::string text = params;
    const size_t at = text.find("ID");
    if (at != std::string::npos) text.replace(at, 2, id);
    return Json_(text);
  }
};

constexpr int kStarts = -1;  // start succeeds; what is wrong shows in the task

TEST_F(BadInput, Start) {
  WriteFile(share_ + "/file.txt", "x");
  symlink("/etc", (share_ + "/way_out").c_str());
  const std::string long_path = "/share/" + std::string(5000, 'p');
  const struct {
    const char* why;
    std::string params;
    int code;   // of the reply
    int error;  // of the search; 0: it succeeds
  } rows[] = {
      {"no folder", R"({"pattern": "x"})", 400, 0},
      {"an empty folder", R"({"pattern": "x", "folder_path": ""})", 400, 0},
      {"a folder of another type", R"({"pattern": "x", "folder_path": {"a": 1}})", 400, 0},
      {"nothing asked for", R"({"folder_path": "/share"})", kStarts, 401},
      {"a number as pattern", R"({"folder_path": "/share", "pattern": 5})", kStarts, 401},
      {"an object as pattern", R"({"folder_path": "/share", "pattern": {}})", kStarts, 401},
      {"a text as size", R"({"folder_path": "/share", "size_from": "x"})", kStarts, 401},
      {"a list as time", R"({"folder_path": "/share", "mtime_to": []})", kStarts, 401},
      {"an object as owner", R"({"folder_path": "/share", "owner": {}, "pattern": "x"})", kStarts,
       401},
      {"an unknown owner is no criterion",
       R"({"folder_path": "/share", "owner": "nob0dy", "pattern": "x"})", kStarts, 0},
      {"an unknown type", R"({"folder_path": "/share", "filetype": "spoon"})", kStarts, 418},
      {"a broken expression", R"({"folder_path": "/share", "pattern": "regex:("})", kStarts, 418},
      {"up and out", R"({"folder_path": "/share/../state", "pattern": "x"})", kStarts, 418},
      {"a link that leads out", R"({"folder_path": "/share/way_out", "pattern": "x"})", kStarts,
       418},
      {"an unknown share", R"({"folder_path": "/spoon", "pattern": "x"})", kStarts, 408},
      {"a missing folder", R"({"folder_path": "/share/spoon", "pattern": "x"})", kStarts, 408},
      {"a file", R"({"folder_path": "/share/file.txt", "pattern": "x"})", kStarts, 408},
      {"no slash in front", R"({"folder_path": "share", "pattern": "x"})", kStarts, 418},
      {"very long", R"({"folder_path": ")" + long_path + R"(", "pattern": "x"})", kStarts, 418},
      {"one good folder is enough", R"({"folder_path": ["/spoon", "/share"], "pattern": "x"})",
       kStarts, 0},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.why);
    const Reply reply = Call("start", Json_(row.params));
    EXPECT_EQ(reply.code, row.code == kStarts ? 0 : row.code);
    if (reply.code != 0) continue;
    const std::string id = reply.data["taskid"].asString();
    const Reply list = ListToEnd(id);
    EXPECT_EQ(list.code, row.error == 0 ? 0 : 600);
    EXPECT_EQ(TaskProperty(id, "progress"), row.error == 0 ? 1 : -1);
    EXPECT_EQ(TaskProperty(id, "data").get("errno", 0), row.error);
    Json::Value clean;
    clean["taskid"] = id;
    EXPECT_EQ(Call("clean", clean).code, 0);
  }
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); })) << Remains().front();
}

// The other methods, on a finished search of one file.
TEST_F(BadInput, LaterCalls) {
  WriteFile(share_ + "/file.txt", "x");
  const std::string id = Start(Json_(R"({"folder_path": "/share", "pattern": "file"})"));
  ASSERT_EQ(ListToEnd(id).data["total"], 1);
  const struct {
    const char* why;
    const char* method;
    const char* params;
    int code;
    const char* data;  // expected; null: whatever it is
  } rows[] = {
      {"no id", "list", "{}", 400, nullptr},
      {"an object as id", "list", R"({"taskid": {}})", 400, nullptr},
      {"a path as id", "list", R"({"taskid": "../x"})", 0, R"({"finished":true})"},
      {"an unknown id", "list", R"({"taskid": "0123456789abcdef0123456789abcdef"})", 0,
       R"({"finished":true})"},
      {"a list as offset", "list", R"({"taskid": "ID", "offset": []})", 600, nullptr},
      {"a text as limit", "list", R"({"taskid": "ID", "limit": "x"})", 600, nullptr},
      {"an unknown column", "list", R"({"taskid": "ID", "sort_by": "name; DROP TABLE files"})", 600,
       nullptr},
      {"an object as column", "list", R"({"taskid": "ID", "sort_by": {}})", 100, nullptr},
      {"a broken filter", "list", R"({"taskid": "ID", "pattern": "regex:("})", 600, nullptr},
      {"a filter that looks like SQL", "list", R"({"taskid": "ID", "pattern": "' OR 1=1 --"})", 0,
       nullptr},
      {"an offset past the end", "list", R"({"taskid": "ID", "offset": 99})", 0,
       R"({"files":[],"finished":true,"offset":99,"total":1})"},
      {"unknown attributes", "list",
       R"({"taskid": "ID", "limit": 1, "additional": ["size", 5, {}, "spoon"]})", 0,
       R"({"files":[{"is_dir":false,"name":"file.txt","path":"/share/file.txt","size":1}],"finished":true,"offset":0,"total":1})"},
      {"no id", "stop", "{}", 400, nullptr},
      {"an object as id", "stop", R"({"taskid": {}})", 0, nullptr},
      {"a path as id", "stop", R"({"taskid": "../x"})", 0, nullptr},
      {"no id", "clean", "{}", 400, nullptr},
      {"paths as ids", "clean", R"({"taskid": ["../x", "/etc/passwd", ""]})", 0, "{}"},
      {"a method by another spelling", "List", R"({"taskid": "ID"})", 101, nullptr},
      {"an action that is none", "Clean", R"({"action": "everything"})", 101, nullptr},
      {"an object as action", "Clean", R"({"action": {}})", 101, nullptr},
      {"an action beside a method of its own", "clean", R"({"action": "cleanall"})", 400, nullptr},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(std::string(row.method) + ": " + row.why);
    const Reply reply = Call(row.method, With(row.params, id));
    EXPECT_EQ(reply.code, row.code);
    if (row.data != nullptr) {
      EXPECT_EQ(reply.data, Json_(row.data));
    }
  }
  EXPECT_EQ(ListToEnd(id).data["total"], 1) << "the search is not what it was";
}

// The command line: what is wrong is said in one line, nothing is printed and nothing stays.
TEST_F(BadInput, CommandLine) {
  WriteFile(share_ + "/file.txt", "x");
  // A record that kept it could not be read again.
  const std::string deep = "{\"folder_path\":" + std::string(nas::kRequestMaxDepth, '[') +
                           std::string(nas::kRequestMaxDepth, ']') + "}";
  const struct {
    std::vector<std::string> words;
    const char* said;  // part of the message
  } rows[] = {
      {{}, "give a command"},
      {{"serach", "x"}, "'serach' is no command"},
      {{"search"}, "PATTERN"},
      {{"search", "x", "spoon"}, "cannot search 'spoon'"},
      {{"search", "x", "file.txt"}, "not a folder"},
      {{"search", "x", "new\nline"}, "'new\\x0Aline'"},
      {{"search", "x", std::string(5000, 'p')}, "too long"},
      {{"search", "regex:("}, "'regex:(': missing"},
      {{"search", "-y"}, "-- before"},
      {{"search", "x", "-x"}, "COMMAND"},
      {{"search", "x", "-c", "-X", "ls"}, "--count and --exec-batch"},
      {{"search", "x", "-t", "spoon"}, "there are file, dir"},
      {{"search", "x", "--owner", "nob0dy"}, "no user 'nob0dy'"},
      {{"search", "x", "--group", "nob0dy"}, "no group 'nob0dy'"},
      {{"search", "x", "--size-from", "1X"}, "'1X' is not a size"},
      {{"search", "x", "--mtime-to", "2026-02-30"}, "not a time"},
      {{"search", "x", "--sort", "spoon"}, "spoon"},
      {{"search", "x", "--desc"}, "--sort"},
      {{"search", "x", "--limit", "-1"}, "'-1'"},
      {{"search", "x", "--limit", "9223372036854775808"}, "is not a number of files"},
      {{"search", "x", "--color", "spoon"}, "'spoon' is none of auto, always and never"},
      {{"search", "x", "--json", "-l"}, "--json"},
      {{"search", "x", "--share", "spoon"}, "NAME=DIR"},
      {{"search", "x", "--share", "[spoon]"}, "'[spoon]'"},
      {{"search", "x", "--share", "home=/etc"}, "home"},
      {{"search", "x", "--config", "/nonexistent/x.toml"}, "/nonexistent/x.toml"},
      {{"search", "x", "--user", "nob0dy"}, "no user 'nob0dy'"},
      {{"call", "NUVA.Arbory.Search", "3", "start"},
       "no method NUVA.Arbory.Search 3 start; there are NUVA.Arbory.Search 1 start, "
       "NUVA.Arbory.Search 1 list, NUVA.Arbory.Search 1 stop, NUVA.Arbory.Search 1 clean, "
       "NUVA.Arbory.Search 2 start, NUVA.Arbory.Search 2 list, NUVA.Arbory.Search 2 stop, "
       "NUVA.Arbory.Search 2 clean, NUVA.Arbory.Search.History 1 get, "
       "NUVA.Arbory.Search.History 1 set, NUVA.Arbory.Search.History 1 delete\n"},
      {{"call", "NUVA.Arbory.Search", "2", "start", "[]"}, "object"},
      {{"call", "NUVA.Arbory.Search", "2", "start", "{"}, "not valid JSON"},
      {{"call", "NUVA.Arbory.Search", "2", "start", deep}, "not valid JSON"},
      {{"call", "NUVA.Arbory.Search", "x", "start"}, "VERSION"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(testing::PrintToString(row.words));
    const Output output = Run(row.words);
    EXPECT_EQ(output.exit_code, 2);
    EXPECT_EQ(output.out, "");
    EXPECT_EQ(Pieces(output.err, '\n').size(), 1U) << output.err;
    EXPECT_THAT(output.err, testing::HasSubstr(row.said));
  }
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); }));
}

// Whoever reads the output has to hear that it is not whole, and no file of the program's own gets
// it by having the number of a closed descriptor.
TEST_F(BadInput, OutputThatNobodyTakesIsAnError) {
  WriteFile(share_ + "/file.txt", "x");
  const char* const rows[] = {
      "search file >/dev/full",
      "search file -c >/dev/full",
      "search file >&-",
      "search file -x echo >/dev/full",
      "--help >/dev/full",
      "search -V >/dev/full",
      "search file <&- >&-",
      "search file <&- >&- 2>&-",
      "why file.txt file . >/dev/full",
  };
  for (const char* const words : rows) {
    SCOPED_TRACE(words);
    const std::string command = "cd " + share_ + " && exec 2>" + dir_ +
                                "/errors && ARBORY_CONFIG=" + dir_ + "/as-" + nas_test::Me() +
                                "/arbory.toml exec " + program_ + " " + words;
    const int status = system(command.c_str());
    EXPECT_EQ(WIFEXITED(status) ? WEXITSTATUS(status) : -1, 2);
    const std::string errors = nas_test::ReadFile(dir_ + "/errors");
    if (std::string_view(words).find("2>") != std::string_view::npos) continue;
    EXPECT_THAT(errors, testing::StartsWith("arbory: cannot write to standard output: "));
    EXPECT_EQ(Pieces(errors, '\n').size(), 1U);
  }
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); }));
}

TEST_F(BadInput, NinthSearchIsRefused) {
  MakeEndlessFile(share_ + "/endless.log");
  Json::Value clean;
  for (int number = 0; number < 8; ++number) {
    const std::string id = Start(Json_(R"({"folder_path": "/share", "pattern": "x"})"));
    clean["taskid"].append(id);
  }
  EXPECT_EQ(Call("start", Json_(R"({"folder_path": "/share", "pattern": "x"})")).code, 401);
  EXPECT_EQ(Call("clean", clean).code, 0);
  EXPECT_TRUE(Eventually([&] { return Remains().empty(); }));
}

TEST_F(BadInput, NoPlaceForWhatASearchKeeps) {
  WriteFile(dir_ + "/none.toml", "state_dir = \"/nowhere/state\"\n");
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    const Output output = Run({"search", "x", "--config", dir_ + "/none.toml"});
    EXPECT_EQ(output.exit_code, 2);
    EXPECT_THAT(output.err, testing::HasSubstr("/nowhere/state cannot be used (/nowhere: Perm"));
  }));
}

TEST_F(BadInput, OnlyRootActsForOthers) {
  EXPECT_TRUE(InOrdinaryChild([&](const std::string&) {
    const Output output = Run({"search", "x", "--user", "root"});
    EXPECT_EQ(output.exit_code, 2);
    EXPECT_THAT(output.err, testing::HasSubstr("only root"));
  }));
}

}  // namespace
}  // namespace program_test
