// What the server tells a form: what was typed means, and what a search came close to.

#include "tests/server/server_test.h"

namespace server_test {
namespace {

using nas_test::WriteFile;

class QueryTest : public ServerTest {};

TEST_F(QueryTest, WhatWasTypedIsReadOrToldWhatIsWrong) {
  Server server = Start();
  server.Open();
  const struct {
    const char* typed;
    const char* params;     // beside the pattern and the choices
    const char* criterion;  // that is wrong
    const char* sentence;   // of its words
  } rows[] = {
      {R"({})", "{}", "", ""},
      {R"({"size_from":"1,5 KB","size_to":"2k"})", R"({"size_from":1536,"size_to":2048})", "", ""},
      {R"({"mtime":"1767225600..1767225700"})",
       R"({"mtime_from":1767225600,"mtime_to":1767225700})", "", ""},
      {R"({"crtime":"1767225600..9999-01-01"})",
       R"({"crtime_from":1767225600,"crtime_to":2147483647})", "", ""},
      {R"({"owner":"root","filetype":"image","extension":"jpg, png"})",
       R"({"owner":"root","filetype":"image","extension":"jpg, png"})", "", ""},
      {R"({"pattern":"regex:("})", "", "pattern", "'regex:(': missing"},
      {R"({"pattern":"a size:>1xb"})", "", "pattern", "'size:>1xb': write a size as in"},
      {R"({"pattern":"owner:nob0dy"})", "", "pattern", "there is no user 'nob0dy'"},
      {R"({"owner":"nob0dy"})", "", "owner", "there is no user 'nob0dy'"},
      {R"({"size_from":"huge"})", "", "size_from", "'huge' is not a size"},
      {R"({"size_from":"2k","size_to":"1k"})", "", "size_to", "'1k' is less than '2k'"},
      {R"({"atime":"ever"})", "", "atime", "'ever': write a time as in"},
      {R"({"mtime":"2026-02..2026-01"})", "", "mtime", "write 2026-01..2026-02"},
      {R"({"mtime":"2026,2024"})", "", "mtime", "several times"},
      {R"({"mtime":">2040"})", "", "mtime", "lies outside"},
      {R"({"filetype":"spoon"})", "", "filetype", "there are file, dir"},
  };
  for (const auto& row : rows) {
    const Reply answer = server.Post("/query", row.typed);
    const Json::Value reply = answer.json();
    EXPECT_EQ(reply["wrong"]["criterion"].asString(), row.criterion) << row.typed << answer.body;
    EXPECT_NE(reply["wrong"]["sentence"].asString().find(row.sentence), std::string::npos)
        << row.typed << answer.body;
    if (*row.criterion != '\0') continue;
    Json::Value params = Parsed(row.params);
    params["pattern"] = "";
    params["recursive"] = true;
    params["search_content"] = false;
    EXPECT_EQ(reply["params"], params) << row.typed;
  }
  for (const char* broken : {"[]", "{", R"({"pattern":{"a":1}})"}) {
    EXPECT_EQ(server.Post("/query", broken).status, 400) << broken;
  }
}

TEST_F(QueryTest, ASearchThatFoundNothingIsToldWhatItCameCloseTo) {
  for (const char* name : {"plan.txt", "report.txt", "rapart.jpg"})
    WriteFile(share_ + "/" + name, "x");
  Server server = Start();
  server.Open();
  const std::string typed = R"("pattern":"raport ext:pdf|txt")";
  const std::string task = server.Call("start", R"({"folder_path":["/photo"],)" + typed + "}")
                               .json()["data"]["taskid"]
                               .asString();
  const std::string route = "/searches/" + task + "/misses";
  const Json::Value near = server.Post(route, "{" + typed + "}").json();
  EXPECT_EQ(near["entries"], 3);
  EXPECT_EQ(near["folders"], 1);
  EXPECT_EQ(near["complete"], true);
  EXPECT_EQ(near["meant"], "");
  EXPECT_EQ(near["terms"][0],
            Parsed(R"({"written":"raport","without":2,"names":["report.txt","rapart.jpg"]})"));
  EXPECT_EQ(near["terms"][1]["written"], "ext:pdf|txt");
  EXPECT_EQ(server.Post(route, R"({"pattern":"regex:("})").status, 400);
  EXPECT_EQ(server.Post(route, R"({"size_from":"much"})").status, 400);
  EXPECT_EQ(server.Post("/searches/none/misses", "{}").status, 404);
}

}  // namespace
}  // namespace server_test
