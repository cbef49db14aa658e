// What may arrive at the server's door: hostile targets, bodies of every wrong kind, slow clients,
// several requests at once. After each the server must still answer.

#include <sys/socket.h>

#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/tcp.hpp>

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
  const char* hostile[] = {"..",
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
                           "a/%2e/b"};
  for (const char* route : routes) {
    for (const char* end : hostile) {
      for (const char* method : {"GET", "POST"}) {
        const std::string target = std::string(route) + end;
        const Reply reply = server.Ask(method, target, "", kJson);
        const bool names_file =
            std::string_view(route).starts_with("/files/") && std::string_view(method) == "GET";
        // A name may hold these; there is no such file.
        const std::string_view bytes = end;
        const bool is_name =
            names_file && (bytes == "a%0d%0aX:y" || bytes == "a%0ab" || bytes == "%7f");
        EXPECT_EQ(reply.status, is_name ? 404 : 400) << method << " " << target;
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
  const std::string get = "GET /health HTTP/1.1\r\n" + host;
  const std::string post = "POST /login HTTP/1.1\r\n" + host;
  const std::string chunked = "Transfer-Encoding: chunked\r\n";
  const std::pair<int, std::vector<std::string>> rows[] = {
      {200,
       {get + "\r\n", "GET /health HTTP/1.0\r\n" + host + "\r\n",
        "HEAD /health HTTP/1.1\r\n" + host + "\r\n",
        "GET http://127.0.0.1/health HTTP/1.1\r\n" + host + "\r\n",
        "GET HTTPS://127.0.0.1:9/health?a HTTP/1.1\r\nHost: evil.example\r\n\r\n"}},
      {403,
       {"GET http://evil.example/health HTTP/1.1\r\n" + host + "\r\n", get + " folded: c\r\n\r\n"}},
      {405,
       {"BREW /health HTTP/1.1\r\n" + host + "\r\n", "DELETE /shares HTTP/1.1\r\n" + host + "\r\n",
        "GET /login HTTP/1.1\r\n" + host + "\r\n", "PUT /api/a/1/b HTTP/1.1\r\n" + host + "\r\n"}},
      {431, {"GET /" + std::string(40'000, 'a') + " HTTP/1.1\r\n" + host + "\r\n"}},
      {400,
       {"GET /health HTTP/1.1\r\n\r\n",
        get + host + "\r\n",
        "GET /health HTTP/2.0\r\n" + host + "\r\n",
        "GET /health\r\n\r\n",
        "GET health HTTP/1.1\r\n" + host + "\r\n",
        "GET http://127.0.0.1/health HTTP/1.1\r\n\r\n",
        "GET http://evil@127.0.0.1/health HTTP/1.1\r\n" + host + "\r\n",
        "GET http:///health HTTP/1.1\r\n" + host + "\r\n",
        "GET ftp://127.0.0.1/health HTTP/1.1\r\n" + host + "\r\n",
        "OPTIONS * HTTP/1.1\r\n" + host + "\r\n",
        "GET /he\x01lth HTTP/1.1\r\n" + host + "\r\n",
        get + "A b: c\r\n\r\n",
        "\x16\x03\x01\x02 a TLS hello\r\n\r\n",
        post + "Content-Length: 2\r\nContent-Length: 3\r\n\r\n{}",
        post + "Content-Length: 2\r\n" + chunked + "\r\n0\r\n\r\n",
        post + "Transfer-Encoding: xchunked\r\n\r\n0\r\n\r\n",
        get + "Transfer-Encoding: chunked, identity\r\n\r\n",
        get + "Transfer-Encoding: identity\r\nContent-Length: 2\r\n\r\n{}",
        post + "Content-Length: -2\r\n\r\n{}",
        post + chunked + "\r\nzz\r\n",
        post + "Content-Length: 99999999999999999999\r\n\r\n"}},
  };
  for (const auto& [status, texts] : rows) {
    for (const std::string& text : texts) {
      SCOPED_TRACE(text.substr(0, 80));
      Client client(server.port);
      client.Send(text);
      client.HalfClose();
      const Reply reply = client.Read(text.starts_with("HEAD"));
      EXPECT_EQ(reply.status, status);
      EXPECT_EQ(reply.status >= 400, status >= 400 && reply.json()["error"].isString());
      EXPECT_TRUE(client.Ended());
    }
  }
}

TEST_F(ProtocolTest, BodiesOfEveryWrongKindAreRefused) {
  Server server = StartMisbehaving("body_bytes = 1000\nheader_seconds = 1\n");
  const std::string target = "/api/Test/1/echo";
  const std::string json = "application/json";
  const struct {
    int status;
    std::vector<std::pair<std::string, std::string>> rows;  // bodies and their types
  } kinds[] = {
      {200,
       {{"", ""},
        {"", json},
        {"{}", json},
        {"{\"text\":\"a\"}", "Application/JSON ; charset=utf-8"},
        {"{\"text\":\"" + std::string(900, 'a') + "\"}", json},
        {"{\"text\":\"\\u0000\xff\xfe\"}", json}}},
      {415,
       {{"{}", ""},
        {"{}", "text/plain"},
        {"a=b", "application/x-www-form-urlencoded"},
        {"{}", "application/jsonp"}}},
      {413, {{"{\"text\":\"" + std::string(1000, 'a') + "\"}", json}}},
  };
  // With an Origin, so that the body alone is what may be wrong.
  const std::string origin = "Origin: http://" + server.Host() + "\r\n";
  const auto ask = [&](const std::string& body, const std::string& type) {
    return server.Ask("POST", target, body,
                      origin + (type.empty() ? "" : "Content-Type: " + type + "\r\n"));
  };
  for (const auto& kind : kinds) {
    for (const auto& [body, type] : kind.rows) {
      const Reply reply = ask(body, type);
      EXPECT_EQ(reply.status, kind.status) << body.substr(0, 40) << " " << type;
      EXPECT_TRUE(reply.status != 200 || reply.code() == 0) << reply.body;
    }
  }
  for (const std::string& bad :
       {std::string("{"), std::string("{} {}"), std::string("[]"), std::string("null"),
        std::string("7"), "{\"a\":" + std::string(600, '['), std::string("\0", 1),
        std::string("{}\0{}", 5)}) {
    EXPECT_EQ(ask(bad, json).status, 400) << bad;
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
  EXPECT_TRUE(Eventually([&] { return server.Counts("arbory_running_calls 0"); }))
      << "its child is still there";
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
  const std::tuple<const char*, arbory::Fields, const char*> rows[] = {
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
  for (const auto& [peer, fields, client] : rows) {
    arbory::HttpRequest request;
    request.fields = fields;
    EXPECT_EQ(proxies.ClientOf(peer, request).text, client)
        << peer << " " << (fields.empty() ? "" : fields[0].second);
  }
  EXPECT_THROW(arbory::Proxies({"nas.home"}), std::runtime_error);
  for (const auto& [address, network] : {std::pair("1.2.3.4", "1.2.3.4"),
                                         {"::ffff:1.2.3.4", "1.2.3.4"},
                                         {"2001:db8:1:2:3:4:5:6", "2001:db8:1:2::"},
                                         {"", ""}}) {
    EXPECT_EQ(arbory::NetworkOf(address), network);
  }
}

// What is printed for a server on all addresses leads to it.
TEST_F(ProtocolTest, AServerOnAllAddressesIsReachedAtOneOfThem) {
  namespace asio = boost::asio;
  asio::io_context context;
  const std::string own = arbory::OwnAddress("0.0.0.0");
  ASSERT_NE(own, "0.0.0.0");
  asio::ip::tcp::acceptor all(context, {asio::ip::make_address("0.0.0.0"), 0});
  asio::ip::tcp::socket socket(context);
  boost::system::error_code error;
  socket.connect({asio::ip::make_address(own), all.local_endpoint().port()}, error);
  EXPECT_FALSE(error) << own << ": " << error.message();
}

// A disk that is not mounted is no reason not to serve the others.
TEST_F(ProtocolTest, AShareWithoutItsFolderIsToldOfAtTheStart) {
  const std::string gone = dir_ + "/gone";
  share_lines_ += "gone = \"" + gone + "\"\n";
  Server server = Start();
  EXPECT_NE(Log().find(":5: the share gone is not offered: there is no folder " + gone),
            std::string::npos)
      << Log();
  EXPECT_EQ(Log().find("the share photo"), std::string::npos) << Log();
}

TEST(GuardTest, HostsAndOriginsFollowTheirTable) {
  const auto is_good = [](const char* host, bool on_loopback) {
    arbory::HttpRequest request;
    request.fields = {{"host", host}};
    return arbory::TroubleWithHost(request, {on_loopback, false, {"https://nas.home"}}).empty();
  };
  for (const char* good :
       {"127.0.0.1:8750", "localhost", "LOCALHOST:9", "[::1]:8750", "nas.home", "nas.home:443"}) {
    EXPECT_TRUE(is_good(good, true)) << good;
  }
  for (const char* bad : {"evil.example", "127.0.0.1.evil.example", "localhost:80@evil",
                          "localhost.evil.example:8750", "", "[::2]:8750"}) {
    EXPECT_FALSE(is_good(bad, true)) << bad;
  }
  EXPECT_TRUE(is_good("evil.example", false)) << "it listens to others as well";

  const std::pair<std::string, std::string> cookie = {"cookie", "a"};
  const std::pair<std::string, std::string> json = {"content-type", "application/json"};
  const std::pair<std::string, std::string> text = {"content-type", "text/plain"};
  const auto origin = [](const char* from) { return std::pair("origin", std::string(from)); };
  const auto is_let_in = [](arbory::Fields fields, bool tls) {
    arbory::HttpRequest request;
    request.fields = std::move(fields);
    request.fields.emplace_back("host", "h:1");
    return arbory::TroubleWithOrigin(request, {true, tls, {"https://nas.home"}}).empty();
  };
  for (const char* good : {"http://h:1", "HTTP://H:1", "https://nas.home"}) {
    EXPECT_TRUE(is_let_in({origin(good), cookie}, false)) << good;
  }
  EXPECT_TRUE(is_let_in({origin("https://h:1"), cookie}, true));
  for (const char* bad :
       {"https://h:1", "http://h:2", "http://h", "null", "", "http://h:1.evil.example"}) {
    EXPECT_FALSE(is_let_in({origin(bad), cookie}, false)) << bad;
  }
  EXPECT_FALSE(is_let_in({origin("http://h:1"), origin("http://evil")}, false)) << "two";
  // Without an origin, a cookie takes what no form of another site can send.
  EXPECT_TRUE(is_let_in({}, false) && is_let_in({text}, false));
  EXPECT_TRUE(is_let_in({cookie, json}, false));
  EXPECT_FALSE(is_let_in({cookie}, false) || is_let_in({cookie, text}, false));
  EXPECT_FALSE(is_let_in({cookie, json, {"sec-fetch-site", "cross-site"}}, false));
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
