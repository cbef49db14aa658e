// Calls and their children: searches as clients see them, limits, large replies, children that die,
// and the server's end.

#include <fstream>
#include <set>

#include "tests/server/server_test.h"

namespace server_test {
namespace {

namespace fs = std::filesystem;
using nas_test::WriteFile;
using std::chrono::milliseconds;
using std::chrono::seconds;
using std::chrono::steady_clock;

constexpr char kJson[] = "Content-Type: application/json\r\n";

class CallTest : public ServerTest {
 protected:
  static bool IsRunning(pid_t pid) {
    // A process that has ended but was not reaped yet still takes signals.
    std::ifstream stat("/proc/" + std::to_string(pid) + "/stat");
    std::string line;
    return std::getline(stat, line) && line.find(") Z ") == std::string::npos;
  }
  static size_t OpenFiles(const Server& server) {
    size_t count = 0;
    for (const auto& entry :
         fs::directory_iterator("/proc/" + std::to_string(server.pid) + "/fd")) {
      count += entry.path().empty() ? 0 : 1;
    }
    return count;
  }
  static long PeakKilobytes(const Server& server) {
    std::ifstream status("/proc/" + std::to_string(server.pid) + "/status");
    for (std::string line; std::getline(status, line);) {
      if (line.starts_with("VmHWM:")) return std::stol(line.substr(6));
    }
    return -1;
  }
};

TEST_F(CallTest, ASearchIsStartedListedAndCleaned) {
  for (const char* name : {"report.txt", "Report \"2\" <b>.md", "sub-report.pdf", "other.txt"}) {
    WriteFile(share_ + "/" + name, "x");
  }
  Server server = Start();
  server.Open();
  const Json::Value started =
      server.Call("start", R"({"folder_path":["/photo"],"pattern":"report"})").json();
  ASSERT_EQ(started["code"], 0);
  const std::string task = started["data"]["taskid"].asString();
  const std::string query = "{\"taskid\":\"" + task + "\"";
  Json::Value state;
  EXPECT_TRUE(Eventually([&] {
    state = server.Get("/searches/" + task).json();
    return state["finished"].asBool();
  }));
  EXPECT_EQ(state["progress"], 1);
  EXPECT_EQ(state["location"][0], "/photo");
  EXPECT_EQ(state["walk"]["phase"], "done");
  EXPECT_EQ(state["walk"]["matches"], 3);
  const Json::Value page = server.Call("list", query + R"(,"limit":2,"sort_by":"name"})").json();
  EXPECT_EQ(page["data"]["total"], 3);
  EXPECT_EQ(page["data"]["files"].size(), 2U);
  EXPECT_EQ(page["data"]["files"][0]["name"], "Report \"2\" <b>.md");
  EXPECT_EQ(page["data"]["finished"], true);
  const std::string all =
      server.Call("list", query + R"(,"additional":"size,time,owner,perm"})").body;
  EXPECT_EQ(all.find(dir_), std::string::npos) << "a path of the machine: " << all;

  EXPECT_EQ(server.Call("clean", query + "}").code(), 0);
  EXPECT_TRUE(Eventually([&] { return server.Get("/searches/" + task).status == 404; }));
  // Clean-all is reached by another spelling of the method.
  EXPECT_EQ(server.Call("Clean", R"({"action":"cleanall"})").code(), 0);
  EXPECT_EQ(server.Call("Clean", "{}").code(), 101);
}

TEST_F(CallTest, RequestsWithoutARowAreAnsweredByTheServer) {
  Server server = Start();
  server.Open();
  const struct {
    const char* target;
    int status, code;
  } rows[] = {
      {"/api/NUVA.Arbory.Search/2/list", 200, 400},  // made, and refused by the module
      {"/api/NUVA.Arbory.Search/2/START", 200, 101},
      {"/api/NUVA.Arbory.Search/3/list", 404, 104},
      {"/api/NUVA.Arbory.Search/02x/list", 404, 104},
      {"/api/NUVA.Arbory.Search/-1/list", 404, 104},
      {"/api/NUVA.Arbory.Search/2/cleanall", 404, 103},
      {"/api/NUVA.Arbory.Search.History/1/list", 404, 103},
      {"/api/nuva.arbory.search/2/list", 404, 102},
      {"/api/%22%3E/2/list", 404, 102},
      {"/api/NUVA.Arbory.Search/2", 405, 405},
      {"/nothing", 405, 405},
  };
  for (const auto& row : rows) {
    const Reply reply = server.Post(row.target, "{}");
    EXPECT_EQ(reply.status, row.status) << row.target;
    EXPECT_EQ(reply.code(), row.code) << row.target << " " << reply.body;
  }
  EXPECT_EQ(server.Get("/api").json().size(), 11U);
  for (const char* id : {"x", "00000000000000000000000000000000", "%22"}) {
    EXPECT_EQ(server.Get(std::string("/searches/") + id).status, 404) << id;
  }
}

TEST_F(CallTest, ADyingChildIsAnsweredForAtOnce) {
  Server server = StartMisbehaving();
  const auto begun = steady_clock::now();
  for (const char* call : {"throw", "die"}) {
    const Reply reply = server.Post(std::string("/api/Test/1/") + call, "{}");
    EXPECT_EQ(reply.body, R"({"code":100,"data":null})") << call;
  }
  // Its worker holds the pipe open, which must not be waited for.
  EXPECT_EQ(server.Post("/api/Test/1/worker", R"({"die":1})").code(), 100);
  EXPECT_EQ(server.Post("/api/Test/1/echo", "{}").json()["data"]["user"], User());
  EXPECT_LT(steady_clock::now() - begun, seconds(10));
}

TEST_F(CallTest, ACallThatNeverAnswersIsEnded) {
  Server server = StartMisbehaving("call_seconds = 1\n");
  const auto begun = steady_clock::now();
  EXPECT_EQ(server.Post("/api/Test/1/sleep", R"({"ms":60000})").code(), 100);
  EXPECT_LT(steady_clock::now() - begun, seconds(10));
  // The same when nobody waits for it any more.
  {
    Client(server.port)
        .Send(server.RequestText("POST", "/api/Test/1/sleep", R"({"ms":60000})", kJson));
  }
  EXPECT_TRUE(Eventually([&] { return server.Counts("arbory_running_calls 0"); }));
}

TEST_F(CallTest, CallsAtOnceAreBounded) {
  Server server = StartMisbehaving("max_calls = 2\n");
  const std::string sleep =
      server.RequestText("POST", "/api/Test/1/sleep", R"({"ms":3000})", kJson);
  Client first(server.port);
  Client second(server.port);
  first.Send(sleep);
  second.Send(sleep);
  Reply refused;
  EXPECT_TRUE(Eventually([&] {
    refused = server.Post("/api/Test/1/echo", "{}");
    return refused.status == 503;
  }));
  EXPECT_EQ(refused.fields["retry-after"], "1");
  EXPECT_EQ(server.Get("/health").status, 200) << "what needs no child goes on";
  EXPECT_EQ(first.Read().code(), 0);
  EXPECT_EQ(second.Read().code(), 0);
  EXPECT_TRUE(Eventually([&] { return server.Post("/api/Test/1/echo", "{}").status == 200; }));
}

TEST_F(CallTest, DownloadsTakeNoCalls) {
  WriteFile(share_ + "/film", "");
  fs::resize_file(share_ + "/film", 100'000'000);  // more than pipes and sockets hold
  Server server = StartMisbehaving("max_calls = 1\n");
  Client slow(server.port);
  slow.Send(server.RequestText("GET", "/files/photo/film", "", ""));
  EXPECT_TRUE(Eventually([&] { return server.Get("/files/photo/film").status == 503; }));
  EXPECT_EQ(server.Post("/api/Test/1/echo", "{}").status, 200);
}

TEST_F(CallTest, ALargeReplyIsPassedOnAsItIsTaken) {
  Server server = StartMisbehaving();
  server.Post("/api/Test/1/echo", "{}");
  const long before = PeakKilobytes(server);
  constexpr int kBytes = 48'000'000;  // far above what the pipes and sockets on its way hold
  Client client(server.port);
  client.Send(server.RequestText("POST", "/api/Test/1/big",
                                 "{\"bytes\":" + std::to_string(kBytes) + "}", kJson));
  EXPECT_TRUE(Eventually([&] { return server.Counts("arbory_running_calls 1"); }));
  EXPECT_EQ(server.Post("/api/Test/1/echo", "{}").status, 200) << "others wait meanwhile";
  const Reply reply = client.Read();
  EXPECT_EQ(reply.status, 200);
  const std::string text(kBytes, 'x');
  EXPECT_TRUE(reply.body == R"({"code":0,"data":")" + text + "\"}");
  EXPECT_LT(PeakKilobytes(server) - before, 20'000) << "the server held the reply";
}

TEST_F(CallTest, LargeBodiesAreHeldOnlySoFar) {
  // Deep enough that reading one takes far longer than anything the loop does, and almost as large
  // as a body may be.
  constexpr int kDepth = 90;
  constexpr int kUnits = 2000;
  const std::string unit = std::string(kDepth, '[') + std::string(kDepth, ']') + ",";
  std::string body = "{\"text\":[";
  for (int at = 0; at < kUnits; ++at) body += unit;
  body += std::string(1'000'000 - body.size(), ' ') + "1]}";
  Server server = StartMisbehaving();
  server.Post("/api/Test/1/echo", "{}");
  const long before = PeakKilobytes(server);
  const std::string echo = server.RequestText("POST", "/api/Test/1/echo", body, kJson);
  constexpr int kClients = 40;
  constexpr int kHeld = 2;  // of one user
  std::vector<std::unique_ptr<Client>> clients;
  for (int at = 0; at < kClients; ++at) {
    clients.push_back(std::make_unique<Client>(server.port));
    clients.back()->Send(echo.substr(0, echo.size() - 1));
  }
  for (const auto& client : clients) client->Send("}");
  std::map<int, int> statuses;
  for (const auto& client : clients) ++statuses[client->Read().status];
  EXPECT_EQ(statuses[200], kHeld) << "the others find no room, as none is read before all came";
  EXPECT_EQ(statuses[503], kClients - kHeld);
  EXPECT_LT(PeakKilobytes(server) - before, 30'000) << "the server held or read the bodies";
  EXPECT_TRUE(Eventually([&] { return server.Post("/api/Test/1/echo", body).status == 200; }))
      << "the room is given back";
  // Without a length, by somebody unknown, and for a row that there is not.
  const std::string head = "POST /api/Test/1/echo HTTP/1.1\r\nHost: " + server.Host() + "\r\n" +
                           kJson + "Transfer-Encoding: chunked\r\n";
  const std::string chunk = "10000\r\n" + std::string(0x10000, ' ') + "\r\n";
  for (const bool known : {true, false}) {
    Client client(server.port);
    client.Send(head + (known ? "Cookie: " + server.cookie + "\r\n" : "") + "\r\n" + chunk + chunk +
                "2\r\n{}\r\n0\r\n\r\n");
    EXPECT_EQ(client.Read().status, known ? 200 : 401);
    client.Send(server.RequestText("GET", "/health", "", ""));
    EXPECT_EQ(client.Read().status, 200) << "the connection goes on";
  }
  EXPECT_EQ(server.Post("/api/Test/1/none", "[]").status, 400);
  EXPECT_EQ(server.Post("/api/Test/1/none", "{\"a\":1}").code(), 103);
  EXPECT_EQ(server.Post("/logout", "{" + std::string(20'000, ' ') + "}").status, 413);
}

TEST_F(CallTest, NothingIsLeftOpenAfterManyCalls) {
  Server server = StartMisbehaving();
  server.Post("/api/Test/1/echo", "{}");
  const size_t before = OpenFiles(server);
  for (int round = 0; round < 100; ++round) {
    server.Post("/api/Test/1/echo", "{}");
    server.Post("/api/Test/1/die", "{}");
    server.Get("/files/photo/none");
    // Gone before the reply, and in the midst of one.
    Client(server.port).Send(server.RequestText("POST", "/api/Test/1/echo", "{}", kJson));
    Client(server.port)
        .Send(server.RequestText("POST", "/api/Test/1/big", R"({"bytes":1000000})", kJson));
  }
  EXPECT_TRUE(Eventually([&] { return OpenFiles(server) <= before; }))
      << OpenFiles(server) << " after, " << before << " before";
}

TEST_F(CallTest, TermEndsItWithAllThatItStarted) {
  Server server = StartMisbehaving();
  std::set<pid_t> workers;
  for (int at = 0; at < 3; ++at) {
    workers.insert(server.Post("/api/Test/1/worker", "{}").json()["data"].asInt());
  }
  for (const pid_t worker : workers) EXPECT_TRUE(IsRunning(worker));
  EXPECT_TRUE(Eventually([&] { return server.Counts("arbory_workers 3"); }));
  // A call that may finish, one that may not, and a connection that only waits.
  Client quick(server.port), endless(server.port), idle(server.port);
  quick.Send(server.RequestText("POST", "/api/Test/1/sleep", R"({"ms":1500})", kJson));
  endless.Send(server.RequestText("POST", "/api/Test/1/sleep", R"({"ms":90000})", kJson));
  EXPECT_TRUE(Eventually([&] { return server.Counts("arbory_running_calls 2"); }));
  const auto begun = steady_clock::now();
  EXPECT_EQ(Stop(server), 0);
  EXPECT_LT(steady_clock::now() - begun, seconds(12));
  EXPECT_EQ(quick.Read().code(), 0);
  EXPECT_EQ(endless.Read().status, 0);
  EXPECT_TRUE(idle.Ended());
  for (const pid_t worker : workers) EXPECT_FALSE(IsRunning(worker));
}

TEST_F(CallTest, ASearchWithALeaseEndsWhenNobodyAsksAfterIt) {
  const std::string endless = share_ + "/endless.log";
  WriteFile(endless, std::string(size_t{1} << 18, 'a'));
  ASSERT_EQ(truncate(endless.c_str(), off_t{1} << 42), 0);
  Server server = Start("", "lease_seconds = 2\n");
  server.Open();
  const auto start = [&](const std::string& fields) {
    const Reply reply = server.Ask(
        "POST", "/api/NUVA.Arbory.Search/2/start",
        R"({"folder_path":["/photo"],"pattern":"b","search_content":true})", kJson + fields);
    EXPECT_EQ(reply.code(), 0);
    return "/searches/" + reply.json()["data"]["taskid"].asString();
  };
  const std::string without = start("");
  const std::string with = start("Arbory-Lease: 1\r\n");
  const std::string asked = start("Arbory-Lease: 1\r\n");
  for (int look = 0; look < 50; ++look) {  // for more than twice the lease
    ASSERT_EQ(server.Get(asked).json()["finished"], false);
    std::this_thread::sleep_for(milliseconds(100));
  }
  const std::string tasks = state_ + "/users/" + User() + "/tasks";
  EXPECT_TRUE(Eventually([&] {
    size_t records = 0;
    for (const auto& entry : fs::directory_iterator(tasks)) {
      records += entry.path().extension() == ".json" ? 1 : 0;
    }
    return records == 1;
  }));
  for (const std::string& gone : {with, asked}) EXPECT_EQ(server.Get(gone).status, 404);
  EXPECT_EQ(server.Get(without).json()["finished"], false) << "nobody asked after it either";
}

TEST_F(CallTest, StoppingLeavesSearchesWhole) {
  // Contents that take a while: an expression that fails late, at many places of every line.
  const std::string line = "c" + std::string(200, 'a');
  {
    std::ofstream file(share_ + "/large.txt");
    for (int at = 0; at < 500'000; ++at) file << line << '\n';
  }
  const std::string start =
      R"({"folder_path":"/photo","pattern":"regex:a[^b\\n]{150}c","search_content":true})";
  Server server = Start();
  server.Open();
  const std::string task = server.Call("start", start).json()["data"]["taskid"].asString();
  const std::string other = server.Call("start", start).json()["data"]["taskid"].asString();
  for (const std::string& id : {task, other}) {
    Json::Value state;
    ASSERT_TRUE(Eventually([&] {
      state = server.Get("/searches/" + id).json();
      return state["walk"]["phase"] == "contents";
    }));
    ASSERT_FALSE(state["finished"].asBool());
  }
  // Asked to, the logout stops what runs.
  const Reply left = server.Post("/logout", R"({"stop_searches":true})");
  EXPECT_EQ(left.json()["stopped"], 2) << left.body;
  EXPECT_EQ(Stop(server), 0);
  server = Start();
  server.Open();
  for (const std::string& id : {task, other}) {
    const Json::Value state = server.Get("/searches/" + id).json();
    EXPECT_TRUE(state["finished"].asBool());
    EXPECT_EQ(state["progress"], 0) << "stopped, not complete";
    EXPECT_EQ(server.Call("list", "{\"taskid\":\"" + id + "\"}").code(), 0);
  }
  // A server that ends stops its searches too.
  const std::string last = server.Call("start", start).json()["data"]["taskid"].asString();
  EXPECT_TRUE(Eventually(
      [&] { return server.Get("/searches/" + last).json()["walk"]["phase"] == "contents"; }));
  const auto begun = steady_clock::now();
  EXPECT_EQ(Stop(server), 0);
  EXPECT_LT(steady_clock::now() - begun, seconds(4)) << "its search was killed, not told";
  server = Start();
  server.Open();
  EXPECT_TRUE(server.Get("/searches/" + last).json()["finished"].asBool());
}

TEST_F(CallTest, TheCountsAreThere) {
  Server server = Start();
  server.Open();
  server.Call("list", "{}");
  server.Get("/shares");
  const std::string metrics = server.Get("/metrics").body;
  for (const char* line :
       {"arbory_calls_total{method=\"NUVA.Arbory.Search/list\",code=\"400\"} 1\n",
        "arbory_call_seconds_count{method=\"shares\"} 1\n", "arbory_sessions 1\n",
        "arbory_replies_total{status=\"303\"} 1\n"}) {
    EXPECT_NE(metrics.find(line), std::string::npos) << line << metrics;
  }
}

}  // namespace
}  // namespace server_test
