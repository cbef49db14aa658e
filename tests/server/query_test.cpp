// What the server tells a form: what was typed means, and what a search came close to.

#include <algorithm>

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
      {R"({"size_from":"2k","size_to":"1k"})", "", "size_to",
       "the largest size '1k' is less than the smallest, '2k'"},
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

TEST_F(QueryTest, PlacesAreCountedAsBrowsersDo) {
  Server server = Start();
  server.Open();
  const struct {
    const char* typed;
    const char* spans;  // begin, value and end of each
    const char* completion;
  } rows[] = {
      {R"({"pattern":""})", "", ""},
      {R"({"pattern":"ab size:>1k"})", "0-2 3:8-11", ""},
      {R"({"pattern":"\u00e9\ud83d\ude00 size:","caret":9})", "0-3 4:9-9", "9-9 >1MB"},
      {"{\"pattern\":\"\xff\xe2\x82 ty\",\"caret\":5}", "0-2 3-5", "3-5 type:"},
      {R"({"pattern":"plan","caret":2})", "0-4", ""},
      {R"({"pattern":"ty","caret":1000000})", "0-2", "0-2 type:"},
  };
  for (const auto& row : rows) {
    const Json::Value reply = server.Post("/query", row.typed).json();
    std::string spans;
    for (const Json::Value& span : reply["spans"]) {
      spans += (spans.empty() ? "" : " ") + span["begin"].asString();
      if (span.isMember("value")) spans += ":" + span["value"].asString();
      spans += "-" + span["end"].asString();
    }
    EXPECT_EQ(spans, row.spans) << row.typed;
    std::string told;
    if (const Json::Value& offered = reply["completion"]; !offered.isNull()) {
      told = offered["begin"].asString() + "-" + offered["end"].asString() + " " +
             offered["items"][0]["text"].asString();
    }
    EXPECT_EQ(told, row.completion) << row.typed;
  }
  EXPECT_EQ(server.Post("/query", R"({"caret":-1})").status, 400);
  // What is refused tells where; what is begun tells of its words.
  const Json::Value wrong = server.Post("/query", R"({"pattern":"a size:1xb"})").json();
  EXPECT_EQ(wrong["spans"][1]["wrong"].asString().substr(0, 12), "write a size");
  const Json::Value begun =
      server.Post("/searches", R"({"folder_path":["/photo"],"pattern":"Plan|*.{a,b}"})").json();
  EXPECT_EQ(begun["spans"][0]["words"], Parsed(R"([{"text":"Plan","as":"literal"}])"));
  EXPECT_EQ(
      begun["spans"][2]["words"],
      Parsed(R"([{"text":"*.a","as":"glob","in":"name"},{"text":"*.b","as":"glob","in":"name"}])"));
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

TEST_F(QueryTest, PastSearchesAreOneListByTime) {
  Server server = Start();
  server.Open();
  const std::string long_text(5000, 'x');
  const struct {
    std::string change;
    int status;
    const char* searches;  // afterwards; a name behind ":"
  } rows[] = {
      {R"({"add":"q=a"})", 200, "q=a"},
      {R"({"add":"q=b"})", 200, "q=b q=a"},
      {R"({"add":"q=a"})", 200, "q=a q=b"},
      {R"({"pin":"q=b","name":"Bees"})", 200, "q=a q=b:Bees"},
      {R"({"add":"q=b"})", 200, "q=b:Bees q=a"},
      {R"({"pin":"q=c","name":"new"})", 200, "q=c:new q=b:Bees q=a"},
      {R"({"remove":"q=c"})", 200, "q=b:Bees q=a"},
      {R"({"remove":"q=nothing"})", 200, "q=b:Bees q=a"},
      {"{\"add\":\"" + long_text + "\"}", 400, ""},
      {"{\"pin\":\"q=a\",\"name\":\"" + long_text + "\"}", 400, ""},
      {R"({"add":{}})", 400, ""},
      {R"({"clear":true})", 200, "q=b:Bees"},
      {R"({"pin":"q=b"})", 200, "q=b"},
      {R"({"clear":true})", 200, ""},
  };
  const auto told = [](const Reply& reply) {
    std::string text;
    const Json::Value body = reply.json();
    for (const Json::Value& one : body["searches"]) {
      text += (text.empty() ? "" : " ") + one["search"].asString();
      if (one.isMember("name")) text += ":" + one["name"].asString();
    }
    return text;
  };
  const auto change = [&](const std::string& word, const std::string& search) {
    return server.Post("/past", "{\"" + word + "\":\"" + search + "\",\"name\":\"n\"}");
  };
  for (const auto& row : rows) {
    const Reply reply = server.Post("/past", row.change);
    EXPECT_EQ(reply.status, row.status) << row.change;
    EXPECT_EQ(told(reply), row.searches) << row.change;
  }
  // More than is kept: the oldest go, and no pin.
  change("pin", "pinned");
  for (int i = 0; i < 105; ++i) change("add", std::to_string(i));
  const std::string kept = told(server.Get("/past"));
  EXPECT_EQ(std::count(kept.begin(), kept.end(), ' '), 100);
  EXPECT_TRUE(kept.starts_with("104 103 ") && kept.ends_with(" 5 pinned:n")) << kept;
  for (int i = 1; i < 50; ++i) EXPECT_EQ(change("pin", "p" + std::to_string(i)).status, 200) << i;
  EXPECT_EQ(change("pin", "one more").status, 400);
  // A damaged list counts as empty, and can be written again.
  const std::string path = state_ + "/users/" + User() + "/preference/page_searches.json";
  for (const char* damage : {"{", "[]", R"({"searches":[3,{"search":4}]})"}) {
    WriteFile(path, damage);
    EXPECT_EQ(told(server.Get("/past")), "") << damage;
    EXPECT_EQ(told(change("add", "a")), "a") << damage;
  }
}

}  // namespace
}  // namespace server_test
