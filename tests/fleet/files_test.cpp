// Files of boxes, through a front.

#include <pwd.h>
#include <signal.h>
#include <sys/stat.h>

#include <cstdio>

#include "tests/fleet/fake_box.h"
#include "tests/fleet/front.h"

namespace fleet_test {
namespace {

using nas_test::AmRoot;

class FilesTest : public FrontTest {};

TEST_F(FilesTest, AreSentAsTheFrontsOwnAre) {
  const Box box = StartBox("box1");
  std::string large(3 << 20, '\0');
  for (size_t i = 0; i < large.size(); ++i) large[i] = static_cast<char>(i * 7 % 251);
  MakeFile(box, "a b/large.bin", "", large);
  MakeFile(box, "empty.txt");
  MakeFile(box, "odd %?#\x01\xff.txt", "", "odd");
  MakeFile(box, "page.html", "", "<script>");
  MakeFile(box, "lines.txt", "", "one\ntwo Plan\nthree\n");
  const Server front = LoggedIn(StartFront({box}), User());
  const Server at_box = LoggedIn(box.server, User());
  const struct {
    const char* target;  // below the share
    const char* method;
    const char* range;
    int status;
  } rows[] = {
      {"/a%20b/large.bin", "GET", "", 200},
      {"/a%20b/large.bin", "GET", "bytes=0-0", 206},
      {"/a%20b/large.bin", "GET", "bytes=1000000-2000000", 206},
      {"/a%20b/large.bin", "GET", "bytes=-5", 206},
      {"/a%20b/large.bin", "GET", "bytes=3145728-", 416},
      {"/a%20b/large.bin", "GET", "bytes=0-0,5-6", 200},
      {"/a%20b/large.bin", "HEAD", "", 200},
      {"/a%20b/large.bin", "HEAD", "bytes=10-19", 206},
      {"/empty.txt", "GET", "", 200},
      {"/empty.txt", "GET", "bytes=0-", 416},
      {"/empty.txt?preview=1", "GET", "", 200},
      {"/odd%20%25%3F%23%01%FF.txt", "GET", "", 200},
      {"/page.html?preview=1", "GET", "", 200},
      {"/missing.txt", "GET", "", 404},
      {"/a%20b", "GET", "", 404},
      {"/%2e%2e/box1-data/empty.txt", "GET", "", 400},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(std::string(row.method) + " " + row.target + " " + row.range);
    const std::string range = *row.range == '\0' ? "" : std::string("Range: ") + row.range + "\r\n";
    const auto ask = [&](const Server& server, const std::string& share) {
      server_test::Client client(server.port);
      client.Send(server.RequestText(row.method, "/files/" + share + row.target, "",
                                     range + "Cookie: " + server.cookie + "\r\n"));
      return client.Read(std::string_view(row.method) == "HEAD");
    };
    const server_test::Reply there = ask(at_box, "data");
    const server_test::Reply here = ask(front, "box1/data");
    EXPECT_EQ(here.status, row.status) << here.body.substr(0, 200);
    EXPECT_EQ(here.status, there.status);
    EXPECT_TRUE(here.body == there.body) << here.body.size() << " " << there.body.size();
    for (const char* field :
         {"content-type", "content-length", "content-range", "content-disposition", "last-modified",
          "content-security-policy", "accept-ranges"}) {
      const auto value = [&](const server_test::Reply& reply) {
        const auto found = reply.fields.find(field);
        return found == reply.fields.end() ? "(none)" : found->second;
      };
      EXPECT_EQ(value(here), value(there)) << field;
    }
  }
  for (const char* query : {"?pattern=plan", "?pattern=plan&text=1", "?pattern=absent&text=1",
                            "?pattern=%28", "?pattern=size%3A%3E1xb"}) {
    const auto there = at_box.Get(std::string("/lines/data/lines.txt") + query);
    const auto here = front.Get(std::string("/lines/box1/data/lines.txt") + query);
    EXPECT_EQ(here.status, there.status) << query;
    EXPECT_EQ(here.body, there.body) << query;
  }
  EXPECT_EQ(front.Get("/lines/box1/data/missing.txt?pattern=x").status, 404);
  EXPECT_EQ(front.Get("/files/box1/data").status, 404) << "a share is no file";
  EXPECT_EQ(front.Get("/files/box1").status, 404);
  EXPECT_EQ(front.Get("/files/box9/data/empty.txt").status, 404) << "there is no such box";
}

TEST_F(FilesTest, AreWhatTheBoxLetsTheUserRead) {
  SKIP_UNLESS_ROOT();
  const Box box = StartBox("box1");
  MakeFile(box, "hers.txt", kAnn, "secret of hers");
  MakeFile(box, "his.txt", kBob, "secret of his");
  const Server front = StartFront({box});
  for (const auto& [user, own, other] :
       {std::tuple(kAnn, "hers", "his"), std::tuple(kBob, "his", "hers")}) {
    const Server person = LoggedIn(front, user);
    for (const std::string route : {"/files", "/lines"}) {
      const std::string end = ".txt?pattern=secret";
      EXPECT_EQ(person.Get(route + "/box1/data/" + own + end).status, 200) << user << route;
      const auto refused = person.Get(route + "/box1/data/" + other + end);
      EXPECT_EQ(refused.status, 403) << user << route;
      EXPECT_EQ(refused.body.find("secret"), std::string::npos);
    }
  }
  EXPECT_EQ(front.Get("/files/box1/data/hers.txt").status, 401) << "nobody is logged in";
}

TEST_F(FilesTest, OfABoxThatDoesNotAnswerAreToldOfByItsName) {
  std::vector<Box> boxes = {StartBox("box1"), StartBox("box2")};
  for (const Box& box : boxes) MakeFile(box, "a.txt", "", "text");
  const Server front = LoggedIn(StartFront(boxes, "deadline_ms = 700\n"), User());
  EXPECT_EQ(Stop(boxes[0].server), 0);
  kill(boxes[1].server.pid, SIGSTOP);
  for (const std::string box : {"box1", "box2"}) {
    for (const std::string route : {"/files/", "/lines/"}) {
      const auto reply = front.Get(route + box + "/data/a.txt?pattern=text");
      EXPECT_EQ(reply.status, 503) << route << box;
      EXPECT_NE(reply.json()["error"].asString().find(box), std::string::npos) << reply.body;
    }
  }
  kill(boxes[1].server.pid, SIGCONT);
  EXPECT_TRUE(
      nas_test::Eventually([&] { return front.Get("/files/box2/data/a.txt").status == 200; }));
}

TEST_F(FilesTest, OfSeveralBoxesGoIntoOneArchive) {
  std::vector<Box> boxes = {StartBox("box1"), StartBox("box2"), StartBox("box3")};
  std::string large(3 << 20, '\0');
  for (size_t i = 0; i < large.size(); ++i) large[i] = static_cast<char>(i * 7 % 251);
  MakeFile(boxes[0], "plans/plan of 1.bin", "", large);
  MakeFile(boxes[1], "plans/plan of 2.txt", "", "two");
  MakeFile(boxes[2], "plan of 3.txt", "", "three");
  const Server front = LoggedIn(StartFront(boxes), User());
  Json::Value params;
  params["pattern"] = "plan";
  for (const Box& box : boxes) params["folder_path"].append("/" + box.name + "/data");
  Search(front, params);
  MakeFile(boxes[1], "plans/plan of 2.txt", "", "changed");
  EXPECT_EQ(Stop(boxes[2].server), 0);
  nas_test::WriteFile(dir_ + "/list.py",
                      "import http.client, io, sys, zipfile\n"
                      "front = http.client.HTTPConnection('127.0.0.1', int(sys.argv[1]))\n"
                      "front.request('GET', sys.argv[2], headers={'Cookie': sys.argv[3]})\n"
                      "archive = zipfile.ZipFile(io.BytesIO(front.getresponse().read()))\n"
                      "for one in archive.infolist():\n"
                      "    text = archive.read(one)\n"
                      "    print(one.filename, text.decode() if len(text) < 400 else len(text))\n");
  const std::string words = std::to_string(front.port) + " '/searches/" + task_ +
                            "/zip?rows=all' '" + front.cookie + "' 2>&1";
  FILE* const out = popen(("python3 " + dir_ + "/list.py " + words).c_str(), "r");
  std::string told(4096, '\0');
  told.resize(fread(told.data(), 1, told.size(), out));
  EXPECT_EQ(pclose(out), 0) << told;
  EXPECT_EQ(told,
            "box1/data/plans/plan of 1.bin 3145728\n"
            "box2/data/plans/plan of 2.txt changed\n"
            "not included.txt Left out of this archive:\r\n\r\n"
            "box1/data/plans/: it is a folder of another machine; choose its files\r\n"
            "box2/data/plans/: it is a folder of another machine; choose its files\r\n"
            "box3/data/plan of 3.txt: its machine does not answer\r\n\n");
}

TEST_F(FilesTest, ABoxSpeaksOnlyOfItsBytes) {
  FakeBox fake;
  const Server front = LoggedIn(StartFront({fake.AsBox("box1")}, "deadline_ms = 700\n"), User());
  const auto get = [&](const std::string& route = "/files") {
    return front.Get(route + "/box1/data/a.txt?pattern=x&text=1");
  };
  fake.Say(FakeBox::Reply("<script>",
                          "Content-Type: text/html\r\nSet-Cookie: a=b\r\n"
                          "Content-Disposition: inline\r\nX-More: 1\r\n"));
  auto reply = get();
  EXPECT_EQ(reply.status, 200);
  EXPECT_EQ(reply.body, "<script>");
  EXPECT_EQ(reply.fields["content-type"], "application/octet-stream");
  EXPECT_EQ(reply.fields["content-disposition"].find("attachment"), 0U);
  EXPECT_FALSE(reply.fields.contains("set-cookie"));
  EXPECT_FALSE(reply.fields.contains("x-more"));
  const struct {
    const char* what;
    std::string reply;
  } rows[] = {
      {"no length", "HTTP/1.1 200 OK\r\nConnection: close\r\n\r\nabc"},
      {"in chunks", "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3\r\nabc\r\n0\r\n\r\n"},
      {"a part of no size", FakeBox::Reply("abc", "", "206 Partial Content")},
      {"a part of another length",
       FakeBox::Reply("abc", "Content-Range: bytes 0-9/10\r\n", "206 Partial Content")},
      {"a part behind the end",
       FakeBox::Reply("abc", "Content-Range: bytes 8-10/10\r\n", "206 Partial Content")},
      {"a part backwards",
       FakeBox::Reply("abc", "Content-Range: bytes 9-8/10\r\n", "206 Partial Content")},
      {"a part of words",
       FakeBox::Reply("abc", "Content-Range: bytes 0-2/1x\r\n", "206 Partial Content")},
      {"another place", FakeBox::Reply("", "Location: http://127.0.0.1:1/\r\n", "302 Found")},
      {"no HTTP", "hello\r\n\r\n"},
      {"nothing", ""},
  };
  for (const auto& row : rows) {
    fake.Say(row.reply);
    reply = get();
    EXPECT_EQ(reply.status, 503) << row.what << reply.body;
    EXPECT_EQ(reply.fields["content-type"], "application/json") << row.what;
  }
  // One that breaks off is not filled up with anything else.
  fake.Say("HTTP/1.1 200 OK\r\nContent-Length: 10\r\n\r\nabc");
  EXPECT_EQ(get().status, 0) << "the connection must end before the file does";
  fake.Say("HTTP/1.1 200 OK\r\nContent-Length: 3\r\n\r\nabcdef");
  EXPECT_EQ(get().body, "abc");
  for (const char* body : {"[]", "{}", R"({"line":"1","parts":[],"text":null})",
                           R"({"line":1,"parts":[1],"text":null})",
                           R"({"line":1,"parts":[],"text":{"text":1}})", "{"}) {
    fake.Say(FakeBox::Reply(body));
    EXPECT_EQ(get("/lines").status, 503) << body;
  }
  fake.Say(FakeBox::Reply(R"({"line":1,"parts":["a"],"text":null,"more":1})"));
  EXPECT_EQ(get("/lines").body, R"({"line":1,"parts":["a"],"text":null})") << "and no more";
  fake.Say(FakeBox::Reply(std::string(size_t{2} << 20, ' ')));
  EXPECT_EQ(get("/lines").status, 503) << "longer than any answer";
}

}  // namespace
}  // namespace fleet_test
