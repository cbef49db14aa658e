// What may arrive at the server's door: hostile targets, bodies of every wrong kind, slow clients,
// several requests at once. After each the server must still answer.

#include <sys/socket.h>

#include <thread>

#include "arbory/server/service/guard.h"
#include "arbory/server/transport/addresses.h"
#include "arbory/server/transport/http_text.h"
#include "tests/server/server_test.h"

namespace server_test {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;
using std::chrono::steady_clock;

constexpr char kJson[] = "Content-Type: application/json\r\n";

class ProtocolTest : public ServerTest {};

TEST_F(ProtocolTest, HostileTargetsAreRefusedOnEveryRoute) {
  nas_test::WriteFile(dir_ + "/secret", "secret");
  Server server = Start("web_dir = \"" + MakeFolder("web") + "\"\n");
  server.Open();
  const char* routes[] = {"/",        "/assets/",     "/api/",    "/api/NUVA.Arbory.Search/2/",
                          "/shares/", "/searches/",   "/files/",  "/files/photo/",
                          "/health/", "/files/home/", "/session/"};
  const char* hostile[] = {
      "..",
      "../secret",
      "%2e%2e/secret",
      "..%2fsecret",
      "%2E%2E%2Fsecret",
      "a%00b",
      "a%0d%0aX:y",
      "a%0ab",
      "%2f",
      "%2fetc%2fpasswd",
      "./x",
      "a//b",
      "%",
      "%zz",
      "%2",
      "a/../secret",
      "%7f",
      "a/%2e/b",
  };
  for (const char* route : routes) {
    for (const char* end : hostile) {
      for (const char* method : {"GET", "POST"}) {
        const std::string target = std::string(route) + end;
        const Reply reply = server.Ask(method, target, "", kJson);
        EXPECT_EQ(reply.status, 400) << method << " " << target;
        EXPECT_TRUE(reply.body.find("secret") == std::string::npos) << reply.body;
      }
    }
    // Well-formed, but far longer than any name: no such thing, on every route.
    const std::string target = route + std::string(5000, 'a');
    const int status = server.Get(target).status;
    EXPECT_TRUE(status == 404 || status == 405) << status << " " << route;
  }
  // Nor is a route reached by a second name, which a proxy's rules would not know.
  for (const char* target : {"/metrics/", "/login/", "/health/", "/api/"}) {
    EXPECT_EQ(server.Get(target).status, 400) << target;
  }
  // Double encoding is decoded once: a name that holds a percent sign, and nothing else.
  EXPECT_EQ(server.Get("/files/photo/%252e%252e%252fsecret").status, 404);
  // What a log's reader sees is text: no commands to a terminal, and no line of any length.
  EXPECT_EQ(server.Get("/log\xC2\x9B[2J").status, 404);
  EXPECT_EQ(server.Ask(std::string(20'000, 'M'), "/log").status, 405);
  EXPECT_NE(Log().find("/log%C2%9B[2J"), std::string::npos) << Log();
  EXPECT_EQ(Log().find(std::string(100, 'M')), std::string::npos);
  EXPECT_EQ(Stop(server), 0);
}

TEST_F(ProtocolTest, MalformedRequestsAreRefused) {
  const Server server = Start();
  const std::string host = "Host: " + server.Host() + "\r\n";
  const struct {
    std::string text;
    int status;  // 0: ended without a reply
  } rows[] = {
      {"GET /health HTTP/1.1\r\n" + host + "\r\n", 200},
      {"GET /health HTTP/1.0\r\n" + host + "\r\n", 200},
      {"HEAD /health HTTP/1.1\r\n" + host + "\r\n", 200},
      {"GET /health HTTP/1.1\r\n\r\n", 400},
      {"GET /health HTTP/1.1\r\n" + host + host + "\r\n", 400},
      {"GET /health HTTP/2.0\r\n" + host + "\r\n", 400},
      {"GET /health\r\n\r\n", 400},
      {"GET health HTTP/1.1\r\n" + host + "\r\n", 400},
      {"GET http://127.0.0.1/health HTTP/1.1\r\n" + host + "\r\n", 200},
      {"GET HTTPS://127.0.0.1:9/health?a HTTP/1.1\r\nHost: evil.example\r\n\r\n", 200},
      {"GET http://evil.example/health HTTP/1.1\r\n" + host + "\r\n", 403},
      {"GET http://127.0.0.1/health HTTP/1.1\r\n\r\n", 400},
      {"GET http://evil@127.0.0.1/health HTTP/1.1\r\n" + host + "\r\n", 400},
      {"GET http:///health HTTP/1.1\r\n" + host + "\r\n", 400},
      {"GET ftp://127.0.0.1/health HTTP/1.1\r\n" + host + "\r\n", 400},
      {"OPTIONS * HTTP/1.1\r\n" + host + "\r\n", 400},
      {"GET /he\x01lth HTTP/1.1\r\n" + host + "\r\n", 400},
      {"GET /health HTTP/1.1\r\n" + host + "A b: c\r\n\r\n", 400},
      {"GET /health HTTP/1.1\r\n" + host + " folded: c\r\n\r\n", 403},
      {"BREW /health HTTP/1.1\r\n" + host + "\r\n", 405},
      {"DELETE /shares HTTP/1.1\r\n" + host + "\r\n", 405},
      {"GET /login HTTP/1.1\r\n" + host + "\r\n", 405},
      {"PUT /api/a/1/b HTTP/1.1\r\n" + host + "\r\n", 405},
      {"\x16\x03\x01\x02 a TLS hello\r\n\r\n", 400},
      {"GET /" + std::string(40'000, 'a') + " HTTP/1.1\r\n" + host + "\r\n", 431},
      {"POST /login HTTP/1.1\r\n" + host + "Content-Length: 2\r\nContent-Length: 3\r\n\r\n{}", 400},
      {"POST /login HTTP/1.1\r\n" + host +
           "Content-Length: 2\r\nTransfer-Encoding: chunked\r\n\r\n0\r\n\r\n",
       400},
      {"POST /login HTTP/1.1\r\n" + host + "Transfer-Encoding: xchunked\r\n\r\n0\r\n\r\n", 400},
      {"GET /health HTTP/1.1\r\n" + host + "Transfer-Encoding: chunked, identity\r\n\r\n", 400},
      {"GET /health HTTP/1.1\r\n" + host +
           "Transfer-Encoding: identity\r\nContent-Length: 2\r\n\r\n{}",
       400},
      {"POST /login HTTP/1.1\r\n" + host + "Content-Length: -2\r\n\r\n{}", 400},
      {"POST /login HTTP/1.1\r\n" + host + "Transfer-Encoding: chunked\r\n\r\nzz\r\n", 400},
      {"POST /login HTTP/1.1\r\n" + host + "Content-Length: 99999999999999999999\r\n\r\n", 400},
  };
  for (const auto& row : rows) {
    Client client(server.port);
    client.Send(row.text);
    client.HalfClose();
    const Reply reply = client.Read(row.text.starts_with("HEAD"));
    EXPECT_EQ(reply.status, row.status) << row.text.substr(0, 80);
    if (row.status >= 400 && reply.status != 0) {
      EXPECT_TRUE(reply.json()["error"].isString()) << row.text;
    }
    EXPECT_TRUE(client.Ended()) << row.text.substr(0, 80);
  }
}

TEST_F(ProtocolTest, BodiesOfEveryWrongKindAreRefused) {
  Server server = StartMisbehaving("body_bytes = 1000\nheader_seconds = 1\n");
  const std::string target = "/api/Test/1/echo";
  const std::string deep(600, '[');
  const struct {
    std::string body;
    std::string type;
    int status;
  } rows[] = {
      {"", "", 200},
      {"", "application/json", 200},
      {"{}", "application/json", 200},
      {"{\"text\":\"a\"}", "Application/JSON ; charset=utf-8", 200},
      {"{\"text\":\"" + std::string(900, 'a') + "\"}", "application/json", 200},
      {"{\"text\":\"\\u0000\xff\xfe\"}", "application/json", 200},
      {"{}", "", 415},
      {"{}", "text/plain", 415},
      {"a=b", "application/x-www-form-urlencoded", 415},
      {"{}", "application/jsonp", 415},
      {"{", "application/json", 400},
      {"{} {}", "application/json", 400},
      {"[]", "application/json", 400},
      {"null", "application/json", 400},
      {"7", "application/json", 400},
      {"{\"a\":" + deep, "application/json", 400},
      {std::string("\0", 1), "application/json", 400},
      {std::string("{}\0{}", 5), "application/json", 400},
      {"{\"text\":\"" + std::string(1000, 'a') + "\"}", "application/json", 413},
  };
  for (const auto& row : rows) {
    // With an Origin, so that the body alone is what may be wrong.
    std::string fields = "Origin: http://" + server.Host() + "\r\n";
    if (!row.type.empty()) fields += "Content-Type: " + row.type + "\r\n";
    const Reply reply = server.Ask("POST", target, row.body, fields);
    EXPECT_EQ(reply.status, row.status) << row.body.substr(0, 40) << " " << row.type;
    if (reply.status == 200) {
      EXPECT_EQ(reply.code(), 0) << reply.body;
    }
  }
  // Every length of a body that stops short, the client waiting for the reply or not.
  const std::string whole = server.RequestText("POST", target, "{\"text\":\"abc\"}", kJson);
  for (size_t length = whole.size() - 14; length < whole.size(); ++length) {
    Client client(server.port);
    client.Send(whole.substr(0, length));
    client.HalfClose();
    EXPECT_EQ(client.Read().status, 400) << length;
  }
  // In chunks, and by a client that first asks whether the body is welcome.
  Client client(server.port);
  const std::string head = "POST " + target + " HTTP/1.1\r\nHost: " + server.Host() +
                           "\r\nCookie: " + server.cookie + "\r\n" + kJson;
  client.Send(head +
              "Transfer-Encoding: chunked\r\n\r\n8\r\n{\"text\":\r\n4\r\n\"b\"}\r\n0\r\n\r\n");
  EXPECT_EQ(client.Read().json()["data"]["text"], "b");
  client.Send(head + "Content-Length: 2\r\nExpect: 100-continue\r\n\r\n");
  char wait[64] = {};
  EXPECT_GT(recv(client.fd(), wait, sizeof wait - 1, 0), 0);
  EXPECT_STREQ(wait, "HTTP/1.1 100 Continue\r\n\r\n");
  client.Send("{}");
  EXPECT_EQ(client.Read().status, 200);
  client.Send(head + "Content-Length: 2000\r\nExpect: 100-continue\r\n\r\n");
  EXPECT_EQ(client.Read().status, 413) << "asked for before it was sent";
}

TEST_F(ProtocolTest, PipelinedAndSplitRequestsAreAnsweredInOrder) {
  Server server = StartMisbehaving();
  std::string three;
  for (const char* text : {"a", "b", "c"}) {
    three += server.RequestText("POST", "/api/Test/1/echo",
                                "{\"text\":\"" + std::string(text) + "\"}", kJson);
  }
  three += server.RequestText("GET", "/health", "", "Connection: close\r\n");
  for (const size_t piece : {three.size(), size_t{1}, size_t{7}}) {
    Client client(server.port);
    for (size_t at = 0; at < three.size(); at += piece) client.Send(three.substr(at, piece));
    for (const char* text : {"a", "b", "c"}) {
      EXPECT_EQ(client.Read().json()["data"]["text"], text) << piece;
    }
    EXPECT_EQ(client.Read().status, 200);
    EXPECT_TRUE(client.Ended());
  }
}

TEST_F(ProtocolTest, SlowClientsAreLetGo) {
  Server server = StartMisbehaving("header_seconds = 1\nidle_seconds = 1\nstall_seconds = 1\n");
  const std::string text = server.RequestText("POST", "/api/Test/1/echo", "{\"a\":1}", kJson);
  // A byte now and then does not prolong a request's time, in its header or its body.
  for (const size_t begun : {size_t{20}, text.size() - 6}) {
    Client client(server.port);
    client.Send(text.substr(0, begun));
    const auto from = steady_clock::now();
    std::thread drip([&] {
      for (size_t at = begun; at < begun + 5 && client.Send(text.substr(at, 1)); ++at) {
        std::this_thread::sleep_for(milliseconds(300));
      }
    });
    EXPECT_EQ(client.Read().status, 408) << begun;
    EXPECT_LT(steady_clock::now() - from, seconds(10));
    drip.join();
    EXPECT_TRUE(client.Ended());
  }
  // One that says nothing between requests, and one that takes nothing of its reply.
  Client idle(server.port);
  EXPECT_TRUE(idle.Ended());
  Client stalled(server.port);
  stalled.Send(server.RequestText("POST", "/api/Test/1/big", "{\"bytes\":50000000}", kJson));
  EXPECT_TRUE(Eventually([&] {
    return server.Get("/metrics").body.find("\narbory_running_calls 0\n") != std::string::npos;
  })) << "its child is still there";
  EXPECT_EQ(stalled.Read().status, 0) << "the rest of the reply came after all";
}

TEST_F(ProtocolTest, AFullServerEndsWhatWaitsOfTheGreediest) {
  Server server = StartMisbehaving("max_connections = 3\n");
  const auto connect = [&](const char* from) {
    auto client = std::make_unique<Client>(server.port, from);
    client->Send(server.RequestText("GET", "/health", "", ""));
    EXPECT_EQ(client->Read().status, 200) << from;
    return client;
  };
  const auto answers = [&](Client& client) {
    client.Send(server.RequestText("GET", "/health", "", ""));
    return client.Read().status == 200;
  };
  const auto polite = connect("127.0.0.2");
  const auto older = connect("127.0.0.1");
  const auto newer = connect("127.0.0.1");
  const auto third = connect("127.0.0.3");
  EXPECT_TRUE(older->Ended());
  EXPECT_TRUE(answers(*polite) && answers(*newer) && answers(*third));
  const auto again = connect("127.0.0.2");
  EXPECT_TRUE(polite->Ended()) << "with as many as all others, one's own go";
  for (Client* client : {newer.get(), third.get(), again.get()}) {
    client->Send(server.RequestText("POST", "/api/Test/1/sleep", R"({"ms":60000})", kJson));
  }
  std::this_thread::sleep_for(milliseconds(300));
  EXPECT_TRUE(Client(server.port, "127.0.0.4").Ended()) << "nobody waits";
}

TEST(AddressesTest, TheClientIsTheLastWhomAProxyNames) {
  const arbory::Proxies proxies({"127.0.0.1", "10.0.0.1", "2001:db8::1"});
  const struct {
    const char* peer;
    arbory::Fields fields;
    const char* client;
  } rows[] = {
      {"127.0.0.1", {}, "127.0.0.1"},
      {"1.2.3.4", {{"x-forwarded-for", "5.6.7.8"}}, "1.2.3.4"},
      {"127.0.0.1", {{"x-forwarded-for", "5.6.7.8"}}, "5.6.7.8"},
      {"::ffff:127.0.0.1", {{"x-forwarded-for", "::ffff:5.6.7.8"}}, "5.6.7.8"},
      {"127.0.0.1", {{"x-forwarded-for", "9.9.9.9, 5.6.7.8 "}}, "5.6.7.8"},
      {"127.0.0.1", {{"x-forwarded-for", "9.9.9.9,5.6.7.8,10.0.0.1"}}, "5.6.7.8"},
      {"127.0.0.1", {{"x-forwarded-for", "9.9.9.9"}, {"x-forwarded-for", "5.6.7.8"}}, "5.6.7.8"},
      {"127.0.0.1", {{"x-forwarded-for", "2001:DB8:0::7"}}, "2001:db8::7"},
      {"2001:db8::1", {{"x-forwarded-for", "5.6.7.8, 127.0.0.1"}}, "5.6.7.8"},
      {"127.0.0.1", {{"x-forwarded-for", "5.6.7.8, unknown, 10.0.0.1"}}, "10.0.0.1"},
      {"127.0.0.1", {{"x-forwarded-for", "5.6.7.8,"}}, "127.0.0.1"},
      {"127.0.0.1", {{"x-forwarded-for", ""}}, "127.0.0.1"},
      {"127.0.0.1", {{"x-real-ip", "5.6.7.8"}}, "127.0.0.1"},
      {"127.0.0.1", {{"x-forwarded-for", "10.0.0.1"}}, "10.0.0.1"},
  };
  for (const auto& row : rows) {
    arbory::HttpRequest request;
    request.fields = row.fields;
    EXPECT_EQ(proxies.ClientOf(row.peer, request).text, row.client)
        << row.peer << " " << (row.fields.empty() ? "" : row.fields[0].second);
  }
  EXPECT_THROW(arbory::Proxies({"nas.home"}), std::runtime_error);
  for (const auto& [address, network] : {std::pair("1.2.3.4", "1.2.3.4"),
                                         {"::ffff:1.2.3.4", "1.2.3.4"},
                                         {"2001:db8:1:2:3:4:5:6", "2001:db8:1:2::"},
                                         {"", ""}}) {
    EXPECT_EQ(arbory::NetworkOf(address), network);
  }
}

TEST(GuardTest, HostsAndOriginsFollowTheirTable) {
  const struct {
    const char* host;
    bool loopback;  // the server listens there
    bool good;
  } hosts[] = {
      {"127.0.0.1:8750", true, true},
      {"localhost", true, true},
      {"LOCALHOST:9", true, true},
      {"[::1]:8750", true, true},
      {"nas.home", true, true},
      {"nas.home:443", true, true},
      {"evil.example", true, false},
      {"127.0.0.1.evil.example", true, false},
      {"localhost:80@evil", true, false},
      {"localhost.evil.example:8750", true, false},
      {"", true, false},
      {"[::2]:8750", true, false},
      {"evil.example", false, true},
  };
  for (const auto& row : hosts) {
    const arbory::SiteRules rules{row.loopback, false, {"https://nas.home"}};
    arbory::HttpRequest request;
    request.fields = {{"host", row.host}};
    EXPECT_EQ(arbory::TroubleWithHost(request, rules).empty(), row.good) << row.host;
  }

  const struct {
    arbory::Fields fields;  // beside the host
    bool tls;
    bool good;
  } origins[] = {
      {{{"origin", "http://h:1"}, {"cookie", "a"}}, false, true},
      {{{"origin", "HTTP://H:1"}, {"cookie", "a"}}, false, true},
      {{{"origin", "https://h:1"}, {"cookie", "a"}}, true, true},
      {{{"origin", "https://nas.home"}, {"cookie", "a"}}, false, true},
      {{{"origin", "https://h:1"}, {"cookie", "a"}}, false, false},
      {{{"origin", "http://h:2"}}, false, false},
      {{{"origin", "http://h"}}, false, false},
      {{{"origin", "null"}}, false, false},
      {{{"origin", ""}}, false, false},
      {{{"origin", "http://h:1.evil.example"}}, false, false},
      {{{"origin", "http://h:1"}, {"origin", "http://evil"}}, false, false},
      {{}, false, true},
      {{{"content-type", "text/plain"}}, false, true},
      {{{"cookie", "a"}, {"content-type", "application/json"}}, false, true},
      {{{"cookie", "a"}}, false, false},
      {{{"cookie", "a"}, {"content-type", "text/plain"}}, false, false},
      {{{"cookie", "a"}, {"content-type", "application/json"}, {"sec-fetch-site", "cross-site"}},
       false,
       false},
  };
  for (const auto& row : origins) {
    arbory::HttpRequest request;
    request.fields = row.fields;
    request.fields.emplace_back("host", "h:1");
    std::string shown;
    for (const auto& [name, value] : row.fields) shown += name + "=" + value + " ";
    EXPECT_EQ(arbory::TroubleWithOrigin(request, {true, row.tls, {"https://nas.home"}}).empty(),
              row.good)
        << shown;
  }
}

TEST_F(ProtocolTest, TheGuardStandsBeforeEveryPost) {
  Server server = Start();
  server.Open();
  const std::string evil = std::string(kJson) + "Origin: http://evil.example\r\n";
  for (const char* target : {"/login", "/logout", "/api/NUVA.Arbory.Search/2/list", "/api/a/b/c"}) {
    EXPECT_EQ(server.Ask("POST", target, "{}", evil).status, 403) << target;
    EXPECT_EQ(server.Ask("POST", target, "").status, 403) << target << " without a type";
  }
  EXPECT_EQ(server.Get("/session").status, 200) << "a refused logout ends nothing";
  Client client(server.port);
  client.Send("GET /session HTTP/1.1\r\nHost: evil.example\r\nCookie: " + server.cookie +
              "\r\n\r\n");
  EXPECT_EQ(client.Read().status, 403);
}

}  // namespace
}  // namespace server_test
