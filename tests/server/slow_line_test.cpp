// What makes answers short and few: compressed replies, and searches begun and listed in one
// request.

#include <zlib.h>

#include "tests/server/server_test.h"

namespace server_test {
namespace {

using nas_test::WriteFile;

std::string Unpacked(const std::string& packed) {
  constexpr int kGzipWindow = 15 + 16;
  std::string text(size_t{4} << 20, '\0');
  z_stream stream = {};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(packed.data()));
  stream.avail_in = static_cast<uInt>(packed.size());
  stream.next_out = reinterpret_cast<Bytef*>(text.data());
  stream.avail_out = static_cast<uInt>(text.size());
  if (inflateInit2(&stream, kGzipWindow) != Z_OK) return "not begun";
  const bool whole = inflate(&stream, Z_FINISH) == Z_STREAM_END;
  text.resize(whole ? stream.total_out : 0);
  inflateEnd(&stream);
  return text;
}

bool IsPacked(const Reply& reply) { return reply.fields.contains("content-encoding"); }

class SlowLineTest : public ServerTest {
 protected:
  void MakeFiles(int count) {
    for (int i = 0; i < count; ++i) {
      WriteFile(share_ + "/plan " + std::to_string(i) + ".txt", "x");
    }
  }
};

TEST_F(SlowLineTest, LongTextsAreCompressedForThoseWhoTakeThem) {
  MakeFiles(100);
  Server server = Start();
  server.Open();
  const std::string task = server.Call("start", R"({"folder_path":"/photo","pattern":"plan"})")
                               .json()["data"]["taskid"]
                               .asString();
  const auto list = [&](int limit, const std::string& fields) {
    const std::string body =
        R"({"taskid":")" + task + R"(","sort_by":"name","limit":)" + std::to_string(limit) + "}";
    return server.Ask("POST", "/api/NUVA.Arbory.Search/2/list", body,
                      "Content-Type: application/json\r\n" + fields);
  };
  EXPECT_TRUE(Eventually([&] { return list(100, "").json()["data"]["finished"].asBool(); }));
  const std::string whole = list(100, "").body;
  const struct {
    const char* fields;
    bool packed;
  } rows[] = {
      {"Accept-Encoding: gzip, deflate, br\r\n", true},
      {"Accept-Encoding: br;q=1.0, GZIP ; q=0.5\r\n", true},
      {"Accept-Encoding: br, gzip;q=0\r\n", false},
      {"Accept-Encoding: xgzip\r\n", false},
      {"Accept-Encoding: \r\n", false},
  };
  for (const auto& row : rows) {
    const Reply reply = list(100, row.fields);
    EXPECT_EQ(IsPacked(reply), row.packed) << row.fields;
    EXPECT_TRUE((row.packed ? Unpacked(reply.body) : reply.body) == whole) << row.fields;
    if (row.packed) {
      EXPECT_LT(reply.body.size() * 8, whole.size());
    }
    EXPECT_EQ(reply.fields.at("content-type"), "application/json") << row.fields;
  }
  EXPECT_FALSE(IsPacked(list(1, rows[0].fields))) << "nothing is gained";
  // What tells of the session, and files, are never compressed.
  WriteFile(share_ + "/long.txt", std::string(100'000, 'a'));
  for (const char* target : {"/session", "/files/photo/long.txt", "/api/openapi.json"}) {
    EXPECT_FALSE(IsPacked(server.Ask("GET", target, "", rows[0].fields))) << target;
  }
}

TEST_F(SlowLineTest, ThePageIsSentAsItsBuildCompressedIt) {
  const std::string web = MakeFolder("web");
  WriteFile(web + "/index.html", "plain");
  WriteFile(web + "/index.html.gz", "packed");
  WriteFile(web + "/robots.txt", "plain");
  WriteFile(web + "/robots.txt.gz", "packed");
  Server server = Start("web_dir = \"" + web + "\"\n");
  const std::string gzip = "Accept-Encoding: gzip\r\n";
  const Reply packed = server.Ask("GET", "/", "", gzip);
  EXPECT_EQ(packed.body, "packed");
  EXPECT_EQ(packed.fields.at("content-encoding"), "gzip");
  EXPECT_EQ(packed.fields.at("content-type"), "text/html; charset=utf-8");
  const Reply plain = server.Get("/");
  EXPECT_EQ(plain.body, "plain");
  EXPECT_FALSE(IsPacked(plain));
  // A cache between must not give the one to who asked for the other.
  EXPECT_EQ(plain.fields.at("vary"), "Accept-Encoding");
  EXPECT_EQ(server.Ask("GET", "/robots.txt", "", gzip).body, "plain");
}

TEST_F(SlowLineTest, ASearchIsBegunAndListedInOneRequest) {
  MakeFiles(3);
  Server server = Start();
  server.Open();
  const Json::Value begun =
      server
          .Post("/searches", R"({"pattern":"plan","size_from":"1","folder_path":["/photo"],
              "search_type":"advance","list":{"limit":2,"sort_by":"name","additional":"size"}})")
          .json();
  const Json::Value& page = begun["page"];
  EXPECT_EQ(page["files"].size(), 2U);
  EXPECT_EQ(page["files"][0]["name"], "plan 0.txt");
  EXPECT_EQ(page["files"][1]["size"], 1);
  EXPECT_EQ(begun["params"], Parsed(R"({"folder_path":["/photo"],"pattern":"plan","recursive":true,
                "search_content":false,"search_type":"advance","size_from":1})"));
  const std::string task = begun["taskid"].asString();
  EXPECT_EQ(server.Get("/searches/" + task).status, 200);
  EXPECT_EQ(server.Call("clean", R"({"taskid":")" + task + R"("})").code(), 0);

  // What begins no search.
  const struct {
    const char* body;
    const char* reply;
  } rows[] = {
      {R"({"pattern":"regex:(","folder_path":"/photo"})", "'regex:('"},
      {R"({"pattern":"plan"})", R"({"code":400})"},
      {R"({"pattern":{}})", R"("code":400)"},
      {"[]", R"("code":400)"},
  };
  for (const auto& row : rows) {
    const Reply reply = server.Post("/searches", row.body);
    EXPECT_NE(reply.body.find(row.reply), std::string::npos) << row.body << reply.body;
    EXPECT_FALSE(reply.json().isMember("taskid")) << row.body;
  }
  // One that cannot be walked is begun, and told of as ever.
  const Json::Value failed =
      server.Post("/searches", R"({"pattern":"x","folder_path":"/nowhere"})").json();
  EXPECT_TRUE(Eventually([&] {
    return server.Get("/searches/" + failed["taskid"].asString()).json()["progress"] == -1;
  }));
}

}  // namespace
}  // namespace server_test
