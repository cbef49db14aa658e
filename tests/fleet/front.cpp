#include "tests/fleet/front.h"

#include "nas/base/json_text.h"

namespace fleet_test {

using nas_test::AmRoot;
using nas_test::Eventually;

Server FrontTest::StartFront(const std::vector<Box>& boxes, const std::string& more) {
  const std::string key = dir_ + "/office.key";
  nas_test::WriteFile(key, nas::ToHex(secret_key_) + "\n");
  chmod(key.c_str(), 0600);
  std::string file =
      "front = \"office\"\nrealm = \"OFFICE\"\nkey_file = \"" + key + "\"\n" + more + "[boxes]\n";
  for (const Box& box : boxes) {
    file += box.name + " = \"http://127.0.0.1:" + std::to_string(box.server.port) + "\"\n";
  }
  fleet_file_ = dir_ + "/fleet.toml";
  nas_test::WriteFile(fleet_file_, file);
  share_lines_ = "";
  state_ = MakeFolder("front-state");
  root_state_ = dir_ + "/front-root-state";
  Server front = Start(PamLines(), "", AmRoot() ? As::kRootWithLogins : As::kOrdinaryUser);
  fleet_file_ = "";
  return front;
}

Server FrontTest::LoggedIn(Server server, const std::string& user) {
  if (AmRoot()) {
    EXPECT_TRUE(server.LogIn(user, "right"));
  } else {
    server.Open();
  }
  return server;
}

void FrontTest::Search(const Server& server, Json::Value params) {
  const Json::Value started = server.Call("start", Text(params)).json();
  task_ = started["data"]["taskid"].asString();
  ASSERT_TRUE(Eventually([&] {
    status_ = server.Get("/searches/" + task_).json();
    return status_["finished"].asBool();
  })) << nas::JsonText(status_, nas::JsonBytes::kClean);
}

std::vector<Listed> FrontTest::List(const Server& server, Json::Value params) {
  params["taskid"] = task_;
  params["additional"] = "size,owner";
  const Json::Value reply = server.Call("list", Text(params)).json();
  EXPECT_EQ(reply["code"], 0);
  std::vector<Listed> files;
  for (const Json::Value& file : reply["data"]["files"]) {
    files.push_back({file["path"].asString(), file["name"].asString(), file["size"].asInt64(),
                     file["owner"]["user"].asString()});
    owners_.insert(files.back().owner);
  }
  total_ = reply["data"]["total"].asUInt64();
  return files;
}

std::string FrontTest::Text(const Json::Value& params) {
  return nas::JsonText(params, nas::JsonBytes::kRaw);
}

}  // namespace fleet_test
