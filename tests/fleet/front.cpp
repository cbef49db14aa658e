#include "tests/fleet/front.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cstdlib>

#include "nas/base/json_text.h"

namespace fleet_test {

using nas_test::AmRoot;
using nas_test::Eventually;

namespace {

// Letters in lower case, numbers by their value.
std::string Natural(const std::string& text) {
  std::string key;
  for (size_t at = 0; at < text.size();) {
    const auto byte = static_cast<unsigned char>(text[at]);
    if (!isdigit(byte)) {
      key += static_cast<char>(tolower(byte));
      ++at;
      continue;
    }
    size_t end = at;
    while (end < text.size() && isdigit(static_cast<unsigned char>(text[end]))) ++end;
    while (at + 1 < end && text[at] == '0') ++at;
    key.append("0").append(1, static_cast<char>(end - at)).append(text, at, end - at);
    at = end;
  }
  return key;
}

std::string Padded(std::int64_t number) {
  constexpr size_t kDigits = 20;
  const std::string text = std::to_string(number);
  return std::string(kDigits - text.size(), '0') + text;
}

}  // namespace

std::string KeyOf(const Listed& file, const std::string& column) {
  if (column == "name") return Natural(file.name);
  if (column == "size") return Padded(file.size);
  if (column == "user") return Natural(file.owner);
  if (column == "type") {
    const size_t dot = file.name.rfind('.');
    return file.folder || dot == std::string::npos ? std::string(file.folder ? "" : "1")
                                                   : "1" + Natural(file.name.substr(dot));
  }
  std::string folder = file.path.substr(0, file.path.size() - file.name.size() - 1);
  std::ranges::replace(folder, '/', '\1');
  return Natural(folder) + '\0' + Natural(file.name);
}

std::vector<std::string> KeysOf(const std::vector<Listed>& files, const std::string& column) {
  std::vector<std::string> keys;
  for (const Listed& file : files) keys.push_back(KeyOf(file, column));
  return keys;
}

void FrontTest::TearDown() {
  for (const pid_t pid : indexes_) {
    kill(pid, SIGTERM);
    waitpid(pid, nullptr, 0);
  }
  FleetTest::TearDown();
}

void FrontTest::StartIndex(const Box& box) {
  const std::string config = dir_ + "/" + box.name + "-index.toml";
  const std::string state =
      AmRoot() ? dir_ + "/" + box.name + "-root-state" : dir_ + "/" + box.name + "-state";
  nas_test::WriteFile(config, "state_dir = \"" + state + "\"\nvolumes = []\n[shares]\ndata = \"" +
                                  box.share + "\"\n");
  const pid_t pid = fork();
  if (pid == 0) {
    prctl(PR_SET_PDEATHSIG, SIGTERM);
    const int log = open((dir_ + "/index.log").c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
    dup2(log, STDOUT_FILENO);
    dup2(log, STDERR_FILENO);
    execl(ARBORY_BIN_DIR "/arbory", "arbory", "index", "--config", config.c_str(), nullptr);
    _exit(98);
  }
  indexes_.push_back(pid);
  const std::string ask = ARBORY_BIN_DIR "/arbory index --status --json --config " + config +
                          " 2>&1 | grep -q '\"attributes\": *\"current\"'";
  EXPECT_TRUE(Eventually([&] { return std::system(ask.c_str()) == 0; }))
      << nas_test::ReadFile(dir_ + "/index.log");
}

void FrontTest::WriteFleetFile(const std::vector<Box>& boxes, const std::string& more) {
  std::string file = "front = \"office\"\nrealm = \"OFFICE\"\nkey_file = \"" + dir_ +
                     "/office.key\"\n" + more + "[boxes]\n";
  for (size_t i = 0; i < boxes.size(); ++i) {
    const std::string address = i < addresses_.size()
                                    ? addresses_[i]
                                    : "http://127.0.0.1:" + std::to_string(boxes[i].server.port);
    file += boxes[i].name + " = \"" + address + "\"\n";
  }
  nas_test::WriteFile(dir_ + "/fleet.toml", file);
}

Server FrontTest::StartFront(const std::vector<Box>& boxes, const std::string& more) {
  const std::string key = dir_ + "/office.key";
  nas_test::WriteFile(key, nas::ToHex(secret_key_) + "\n");
  chmod(key.c_str(), 0600);
  WriteFleetFile(boxes, more);
  fleet_file_ = dir_ + "/fleet.toml";
  share_lines_ = "";
  state_ = MakeFolder("front-state");
  root_state_ = dir_ + "/front-root-state";
  const Server front = StartOf(std::getenv(kOtherFront), PamLines());
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
  std::vector<Listed> files = FilesOf(reply["data"]["files"]);
  for (const Listed& file : files) owners_.insert(file.owner);
  total_ = reply["data"]["total"].asUInt64();
  return files;
}

std::vector<Listed> FrontTest::FilesOf(const Json::Value& files) {
  std::vector<Listed> listed;
  for (const Json::Value& file : files) {
    listed.push_back({file["path"].asString(), file["name"].asString(), file["size"].asInt64(),
                      file["owner"]["user"].asString(), file["is_dir"].asBool()});
  }
  return listed;
}

std::string FrontTest::Text(const Json::Value& params) {
  return nas::JsonText(params, nas::JsonBytes::kRaw);
}

}  // namespace fleet_test
