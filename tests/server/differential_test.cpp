// The searches that the program's tests compare with a naive walk, once more over HTTP.

#include "nas/base/json_text.h"
#include "tests/program/cases.h"
#include "tests/server/server_test.h"

namespace server_test {
namespace {

using program_test::Found;

class Differential : public ServerTest {
 protected:
  Found ByHttp(const Server& server, Json::Value params, const std::string& folder) const {
    params["folder_path"] = "/photo" + folder.substr(share_.size());
    const std::string text = nas::JsonText(params, nas::JsonBytes::kRaw);
    const Json::Value started = server.Call("start", text).json();
    EXPECT_EQ(started["code"].asInt(), 0);
    Json::Value ask;
    ask["taskid"] = started["data"]["taskid"];
    const std::string id = nas::JsonText(ask, nas::JsonBytes::kRaw);
    ask["additional"] = "real_path";
    const std::string listing = nas::JsonText(ask, nas::JsonBytes::kRaw);
    Json::Value reply;
    EXPECT_TRUE(Eventually([&] {
      reply = server.Call("list", listing).json();
      return reply["code"].asInt() == 0 && reply["data"]["finished"].asBool();
    }));
    EXPECT_EQ(server.Call("clean", id).code(), 0);
    Found found{{}, 0, true};
    for (const Json::Value& file : reply["data"]["files"]) {
      found.paths.push_back(file["real_path"].asString());
    }
    EXPECT_EQ(reply["data"]["total"].asUInt64(), found.paths.size());
    return found;
  }
};

TEST_F(Differential, EveryCriterionOverHttp) {
  program_test::MakeHostileTree(share_ + "/tree");
  Server server = Start();
  server.Open();
  program_test::CompareAll(share_ + "/tree", [&](const auto& params, const auto& folder) {
    return ByHttp(server, params, folder);
  });
}

}  // namespace
}  // namespace server_test
