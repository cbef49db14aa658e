// A fleet behind HAProxy, as `arbory fleet config` sets it up. Left out where there is none.

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <map>

#include "tests/fleet/proxy.h"

namespace fleet_test {
namespace {

using nas_test::Eventually;

class ProxyTest : public ProxiedTest {
 protected:
  void SetUp() override {
    ProxiedTest::SetUp();
    if (!HaveProxy()) GTEST_SKIP() << "haproxy is not installed";
  }

  // The states of the boxes that do not answer a search for all of them.
  std::map<std::string, std::string> Troubles(const Server& front, const std::vector<Box>& boxes) {
    Json::Value params;
    params["pattern"] = "plan";
    for (const Box& box : boxes) params["folder_path"].append("/" + box.name + "/data");
    Search(front, params);
    rows_ = List(front, Json::Value(Json::objectValue)).size();
    std::map<std::string, std::string> states;
    for (const Json::Value& box : status_["walk"]["fleet"]["boxes"]) {
      states[box["name"].asString()] = box["state"].asString();
    }
    return states;
  }

  size_t rows_ = 0;
};

TEST_F(ProxyTest, BoxesFailAndComeBack) {
  std::vector<Box> boxes;
  for (const char* name : {"box1", "box2", "box3", "box4", "box5"}) {
    boxes.push_back(StartBox(name));
    MakeFile(boxes.back(), std::string("plan of ") + name);
  }
  const Server front = LoggedIn(StartFront(boxes, Settings()), User());
  StartProxy();
  using States = std::map<std::string, std::string>;
  ASSERT_TRUE(Eventually([&] { return Troubles(front, boxes).empty(); }))
      << nas_test::ReadFile(dir_ + "/haproxy.log");
  EXPECT_EQ(rows_, 5U);
  kill(boxes[0].server.pid, SIGSTOP);
  EXPECT_EQ(Stop(boxes[1].server), 0);
  EXPECT_EQ(Troubles(front, boxes), (States{{"box1", "late"}, {"box2", "down"}}));
  EXPECT_EQ(rows_, 3U);
  EXPECT_EQ(front.Get("/files/box3/data/plan%20of%20box3").status, 200);
  EXPECT_EQ(front.Get("/files/box2/data/plan%20of%20box2").status, 503);
  kill(boxes[0].server.pid, SIGCONT);
  // It comes back at another address, which the proxy is told of while it runs.
  boxes[1] = StartBox("box2");
  WriteFleetFile(boxes, Settings());
  const std::string before = nas_test::ReadFile(dir_ + "/haproxy.cfg");
  ReloadProxy();
  EXPECT_NE(nas_test::ReadFile(dir_ + "/haproxy.cfg"), before);
  EXPECT_TRUE(Eventually([&] { return Troubles(front, boxes).empty(); }))
      << nas_test::ReadFile(dir_ + "/haproxy.log");
  EXPECT_EQ(rows_, 5U);
  // What has not changed is not read anew.
  EXPECT_EQ(std::system(ConfigCommand("false").c_str()), 0);
}

// Certificates of an authority of the test's own, as docs/fleet.md makes them.
TEST_F(ProxyTest, ABoxWithAnothersCertificateIsNotBelieved) {
  if (access("/usr/bin/openssl", X_OK) != 0) GTEST_SKIP() << "openssl is not installed";
  const std::string script = ARBORY_SOURCE_DIR "/packaging/fleet/make-certificates";
  ASSERT_EQ(std::system((script + " " + dir_ + "/tls front localhost >/dev/null 2>&1").c_str()), 0);
  std::vector<Box> boxes = {StartBox("box1"), StartBox("box2")};
  for (const Box& box : boxes) MakeFile(box, "plan of " + box.name);
  // The same certificate before both; the second is asked for by another name.
  const std::string tls = dir_ + "/tls.cfg";
  std::string text =
      "defaults\n mode http\n timeout connect 5s\n timeout client 1m\n"
      " timeout server 1m\n";
  const Listener listeners[] = {Listen(), Listen()};
  for (size_t i = 0; i < boxes.size(); ++i) {
    const std::string number = std::to_string(i);
    text += "listen box" + number + "\n bind fd@" + std::to_string(listeners[i].socket_fd.get()) +
            " ssl crt " + dir_ + "/tls/localhost.pem ca-file " + dir_ +
            "/tls/ca.pem verify required\n http-request set-header Host 127.0.0.1:" +
            std::to_string(boxes[i].server.port) +
            "\n server s 127.0.0.1:" + std::to_string(boxes[i].server.port) + "\n";
  }
  nas_test::WriteFile(tls, text);
  const pid_t before_boxes =
      StartHaproxy(tls, {listeners[0].socket_fd.get(), listeners[1].socket_fd.get()});
  const Server front = LoggedIn(StartFront(boxes, Settings()), User());
  addresses_ = {"https://localhost:" + listeners[0].port, "https://127.0.0.1:" + listeners[1].port};
  WriteFleetFile(boxes, Settings());
  StartProxy();
  std::map<std::string, std::string> states;
  EXPECT_TRUE(Eventually([&] {
    states = Troubles(front, boxes);
    return !states.contains("box1");
  })) << nas_test::ReadFile(dir_ + "/haproxy.log");
  EXPECT_EQ(states, (std::map<std::string, std::string>{{"box2", "down"}}));
  EXPECT_EQ(rows_, 1U);
  kill(before_boxes, SIGTERM);
  waitpid(before_boxes, nullptr, 0);
}

}  // namespace
}  // namespace fleet_test
