// Whether what is said of the interface is what there is: the description for programs against the
// running server.

#include <sstream>

#include "tests/server/server_test.h"

namespace server_test {
namespace {

using nas_test::WriteFile;

class DescriptionTest : public ServerTest {
 protected:
  void SetUp() override {
    ServerTest::SetUp();
    WriteFile(share_ + "/a.txt", "a");
    server_ = Start();
    stranger_ = server_;
    server_.Open();
    task_ = server_.Call("start", R"({"folder_path":"/photo","pattern":"a"})")
                .json()["data"]["taskid"]
                .asString();
    const std::string progress = "/searches/" + task_;
    EXPECT_TRUE(Eventually([&] { return server_.Get(progress).json()["finished"].asBool(); }));
    document_ = server_.Get("/api/openapi.json").json();
  }

  // The path with names of what there is.
  std::string Filled(std::string path) const {
    const std::pair<const char*, std::string> values[] = {
        {"{taskid}", task_}, {"{share}", "photo"}, {"{path}", "a.txt"}};
    for (const auto& [part, value] : values) {
      const size_t at = path.find(part);
      if (at != std::string::npos) path.replace(at, std::string(part).size(), value);
    }
    EXPECT_EQ(path.find('{'), std::string::npos) << path;
    return path;
  }

  Server server_;
  Server stranger_;  // without a session
  std::string task_;
  Json::Value document_;
};

TEST_F(DescriptionTest, TheServerAnswersWhatItDescribes) {
  const Json::Value& paths = document_["paths"];
  ASSERT_GT(paths.size(), 15U);
  const std::string& cookie = server_.cookie;
  EXPECT_EQ(document_["components"]["securitySchemes"]["session"]["name"],
            cookie.substr(0, cookie.find('=')));
  for (const std::string& path : paths.getMemberNames()) {
    const std::string target = Filled(path);
    for (const auto& [method, verb] : {std::pair("GET", "get"), {"POST", "post"}}) {
      const std::string shown = std::string(method) + " " + path;
      const Reply reply = stranger_.Ask(method, target);
      if (!paths[path].isMember(verb)) {
        EXPECT_EQ(reply.status, 405) << shown;
        EXPECT_EQ(reply.fields.at("allow"), verb[0] == 'g' ? "POST" : "GET, HEAD") << shown;
        continue;
      }
      const bool is_private = paths[path][verb].isMember("security");
      EXPECT_EQ(reply.status == 401, is_private) << shown << " " << reply.status;
      EXPECT_NE(reply.status, 404) << shown;
      EXPECT_NE(reply.status, 405) << shown;
      if (!is_private || path == "/logout") continue;
      const Reply known = verb[0] == 'p' ? server_.Post(target, "{}") : server_.Ask(method, target);
      EXPECT_EQ(known.status, 200) << shown;
      const std::string type = known.fields.at("content-type");
      EXPECT_TRUE(
          paths[path][verb]["responses"]["200"]["content"].isMember(type.substr(0, type.find(';'))))
          << shown << " " << type;
    }
  }
  EXPECT_EQ(server_.Post("/logout", "{}").status, 200);
}

TEST_F(DescriptionTest, RowsAndReferencesAreWhole) {
  for (const Json::Value& row : server_.Get("/api").json()) {
    const std::string path = "/api/" + row["api"].asString() + "/" + row["version"].asString() +
                             "/" + row["method"].asString();
    EXPECT_TRUE(document_["paths"][path]["post"]["requestBody"].isObject()) << path;
  }
  constexpr std::string_view kRef = "\"$ref\":\"#/";
  const std::string text = server_.Get("/api/openapi.json").body;
  for (size_t at = 0; (at = text.find(kRef, at)) != std::string::npos; ++at) {
    const size_t from = at + kRef.size();
    std::stringstream path(text.substr(from, text.find('"', from) - from));
    const Json::Value* node = &document_;
    for (std::string part; std::getline(path, part, '/');) node = &(*node)[part];
    EXPECT_TRUE(node->isObject()) << path.str();
  }
}

}  // namespace
}  // namespace server_test
