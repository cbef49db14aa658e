// Downloads, previews and the page's own files.

#include "arbory/server/service/files.h"

#include <cstdlib>
#include <set>

#include "arbory/server/transport/http_text.h"
#include "tests/server/server_test.h"

namespace server_test {
namespace {

using nas_test::ReadFile;
using nas_test::WriteFile;

class FilesTest : public ServerTest {};

TEST_F(FilesTest, NothingButReadableFilesOfTheShareComesOut) {
  WriteFile(dir_ + "/secret.txt", "secret");
  std::filesystem::create_directories(share_ + "/folder/below");
  WriteFile(share_ + "/folder/below/file.txt", "inside");
  WriteFile(share_ + "/closed.txt", "closed");
  chmod((share_ + "/closed.txt").c_str(), 0);
  ASSERT_EQ(symlink("folder/below/file.txt", (share_ + "/near").c_str()), 0);
  ASSERT_EQ(symlink("../secret.txt", (share_ + "/far").c_str()), 0);
  ASSERT_EQ(symlink((dir_ + "/secret.txt").c_str(), (share_ + "/absolute").c_str()), 0);
  ASSERT_EQ(symlink("..", (share_ + "/up").c_str()), 0);
  ASSERT_EQ(symlink("loop", (share_ + "/loop").c_str()), 0);
  ASSERT_EQ(symlink("/proc/self/root", (share_ + "/magic").c_str()), 0);
  ASSERT_EQ(mkfifo((share_ + "/pipe").c_str(), 0666), 0);
  WriteFile(share_ + "/%2e%2e", "literal");
  Server server = Start();
  server.Open();
  // As a whole, and a line of it.
  const auto get = [&](const std::string& path, int status) {
    const Reply file = server.Get("/files/" + path);
    for (const Reply& reply : {file, server.Get("/lines/" + path + "?pattern=e")}) {
      EXPECT_EQ(reply.status, status) << path << reply.body;
      EXPECT_EQ(reply.body.find("secret"), std::string::npos) << path;
      EXPECT_EQ(reply.body.find(dir_), std::string::npos) << path;
    }
    return file.body;
  };
  EXPECT_EQ(get("photo/folder/below/file.txt", 200), "inside");
  EXPECT_EQ(get("photo/near", 200), "inside");
  EXPECT_EQ(get("photo/%252e%252e", 200), "literal");
  get("photo/folder/", 400);
  get("photo/closed.txt", 403);
  for (const char* path : {"photo/far", "photo/absolute", "photo/up/secret.txt", "photo/loop",
                           "photo/magic/etc/passwd", "photo/pipe", "photo/folder", "photo",
                           "photo/none", "photo/folder/below/file.txt/x", "none/x", "home/x"}) {
    get(path, 404);
  }
}

// Every row can be fetched, whatever bytes its name has, and what is text is told once.
TEST_F(FilesTest, EveryListedFileIsReachedByTheAddressOfItsRow) {
  const std::string names[] = {"plain name.txt",  "line\nbreak",     "\x01\x1b[31m\x7f",
                               "broken \xff\xfe", "100% & # ? + \\", "caf\xe9/un\xc3\xa9t\xe9"};
  MakeFolder("photo/caf\xe9");
  for (const std::string& name : names) WriteFile(share_ + "/" + name, "in " + name);
  Server server = Start();
  server.Open();
  const Json::Value begun =
      server.Post("/searches", R"({"pattern":"type:file","folder_path":"/photo"})").json();
  const std::string task = R"({"taskid":")" + begun["taskid"].asString() + R"("})";
  Json::Value files;
  EXPECT_TRUE(Eventually([&] {
    files = server.Call("list", task).json()["data"]["files"];
    return files.size() == std::size(names);
  }));
  std::set<std::string> read;
  int encoded = 0;
  for (const Json::Value& row : files) {
    std::string address = row["path_encoded"].asString();
    encoded += address.empty() ? 0 : 1;
    if (address.empty()) {
      address = "/photo/" + arbory::PercentEncoded(row["path"].asString().substr(7));
    }
    const Reply file = server.Get("/files" + address);
    EXPECT_EQ(file.status, 200) << address;
    read.insert(file.body);
  }
  EXPECT_EQ(encoded, 2) << "those that are no text";
  for (const std::string& name : names) EXPECT_TRUE(read.contains("in " + name)) << name;
}

TEST_F(FilesTest, FirstLineOfWhatContentsHold) {
  WriteFile(share_ + "/notes.txt", "one\nA \xff<b>Two</b> two\n");
  Server server = Start();
  server.Open();
  const struct {
    const char* pattern;
    int status;
    const char* body;
  } rows[] = {
      {"two", 200, R"({"line":2,"parts":["A \ufffd<b>","Two","</b> ","two",""]})"},
      {"three", 200, R"({"line":null,"parts":[]})"},
      {"regex:%5EA", 200, R"({"line":2,"parts":["","A"," \ufffd<b>Two</b> two"]})"},
      {"*.txt", 200, R"({"line":null,"parts":[]})"},
      {"content:two%20notes", 200, R"({"line":2,"parts":["A \ufffd<b>","Two","</b> ","two",""]})"},
      {"content:one%20two", 200, R"({"line":1,"parts":["","one",""]})"},
      {"two%20notes", 200, R"({"line":null,"parts":[]})"},
      {"regex:(", 400, nullptr},
  };
  for (const auto& row : rows) {
    const Reply reply = server.Get(std::string("/lines/photo/notes.txt?pattern=") + row.pattern);
    EXPECT_EQ(reply.status, row.status) << row.pattern;
    if (row.body != nullptr) {
      EXPECT_EQ(reply.json(), Parsed(row.body)) << row.pattern << reply.body;
    }
  }
}

// Everything that comes until the connection ends.
std::string Raw(const Server& server, const std::string& target, const char* version = "1.1") {
  Client client(server.port);
  client.Send("GET " + target + " HTTP/" + version + "\r\nHost: " + server.Host() +
              "\r\nCookie: " + server.cookie + "\r\nConnection: close\r\n\r\n");
  std::string bytes;
  char buffer[4096];
  for (ssize_t count; (count = read(client.fd(), buffer, sizeof buffer)) > 0;) {
    bytes.append(buffer, static_cast<size_t>(count));
  }
  return bytes;
}

TEST_F(FilesTest, RowsOfASearchComeAsOneArchiveThatTellsItsEnd) {
  std::filesystem::create_directories(share_ + "/found/below");
  for (const char* name : {"found/kept.jpg", "found/below/inside.jpg", "found/swapped.jpg"}) {
    WriteFile(share_ + "/" + name, "open to all");
  }
  WriteFile(dir_ + "/outside.jpg", "secret");
  Server server = Start();
  server.Open();
  const Json::Value begun =
      server.Call("start", R"({"folder_path":"/photo","pattern":"found|kept|swapped"})").json();
  const std::string zip = "/searches/" + begun["data"]["taskid"].asString() + "/zip?";
  const std::string list = R"({"taskid":")" + begun["data"]["taskid"].asString() + "\"}";
  ASSERT_TRUE(Eventually([&] {
    const Json::Value page = server.Call("list", list).json();
    return page["data"]["finished"].asBool() && page["data"]["total"] == 3;
  }));
  // What has become a link since it was found leads nowhere.
  std::filesystem::remove(share_ + "/found/swapped.jpg");
  ASSERT_EQ(symlink((dir_ + "/outside.jpg").c_str(), (share_ + "/found/swapped.jpg").c_str()), 0);
  const std::string whole = Raw(server, zip);
  EXPECT_TRUE(whole.ends_with("\r\n0\r\n\r\n"));
  EXPECT_EQ(whole.find("secret"), std::string::npos);
  for (const char* text : {"open to all", "found/kept.jpg", "found/below/inside.jpg"}) {
    EXPECT_NE(whole.find(text), std::string::npos) << text;
  }
  const struct {
    std::string target;
    const char* version;
    const char* status;
  } rows[] = {
      {zip + "rows=0", "1.1", "200"},
      {zip + "rows=0-1,2&sort_by=name&sort_direction=desc", "1.1", "200"},
      {zip + "rows=0&pattern=kept", "1.1", "200"},
      {zip + "rows=1&pattern=kept", "1.1", "400"},
      {zip + "rows=0&pattern=regex:(", "1.1", "400"},
      {zip + "rows=3", "1.1", "400"},
      {zip + "rows=", "1.1", "400"},
      {zip + "rows=1-0", "1.1", "400"},
      {zip + "rows=1,0", "1.1", "400"},
      {zip + "rows=0-1,1", "1.1", "400"},
      {zip + "rows=0,", "1.1", "400"},
      {zip + "rows=-1", "1.1", "400"},
      {zip + "rows=0-99999999999", "1.1", "400"},
      {zip + "rows=0", "1.0", "505"},
      {"/searches/0123456789abcdef0123456789abcdef/zip?rows=0", "1.1", "404"},
      {"/searches/..%00/zip?rows=0", "1.1", "400"},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(Raw(server, row.target, row.version).substr(9, 3), row.status) << row.target;
  }
}

TEST_F(FilesTest, TheTextAroundALineIsReadInAnyEncoding) {
  std::string lines;
  for (int i = 1; lines.size() < 400'000; ++i) lines += "line " + std::to_string(i) + "\n";
  WriteFile(share_ + "/late.txt", lines + "the needle\n" + lines);
  WriteFile(share_ + "/latin.txt",
            "Stra\xdf"
            "e und \xc4pfel, sch\xf6ne Gr\xfc\xdf"
            "e aus K\xf6ln\nzwei\n");
  WriteFile(share_ + "/wide.txt", std::string("\xff\xfe"
                                              "a\0b\0\n\0n\0\xe9\0",
                                              12));
  WriteFile(share_ + "/one.txt", std::string(300'000, 'x') + "\nneedle");
  WriteFile(share_ + "/data.bin", std::string("a\0b", 3));
  Server server = Start();
  server.Open();
  const struct {
    const char* file;
    const char* pattern;
    int first_line;  // at least
    const char* holds;
    bool before, after;
  } rows[] = {
      {"late.txt", "needle", 30'000, "the needle\nline 1\n", true, true},
      {"late.txt", "nowhere", 1, "line 1\nline 2\n", false, true},
      {"latin.txt", "zwei", 1, "Straße und Äpfel", false, false},
      {"wide.txt", "", 1, "ab\nné", false, false},
      {"one.txt", "needle", 1, "xxx\nneedle", true, false},
  };
  for (const auto& row : rows) {
    const Json::Value text =
        server.Get(std::string("/lines/photo/") + row.file + "?text=1&pattern=" + row.pattern)
            .json()["text"];
    EXPECT_GE(text["first_line"].asInt(), row.first_line) << row.file;
    EXPECT_NE(text["text"].asString().find(row.holds), std::string::npos) << row.file;
    EXPECT_LE(text["text"].asString().size(), 128U << 10) << row.file;
    EXPECT_EQ(text["before"].asBool(), row.before) << row.file;
    EXPECT_EQ(text["after"].asBool(), row.after) << row.file;
  }
  EXPECT_TRUE(server.Get("/lines/photo/data.bin?text=1&pattern=a").json()["text"].isNull());
  EXPECT_FALSE(server.Get("/lines/photo/late.txt?pattern=needle").json().isMember("text"));
}

TEST_F(FilesTest, OnlySafeTypesAreShown) {
  const char* const text = "text/plain; charset=utf-8";
  // Null for an attachment.
  const std::pair<const char*, const char*> rows[] = {{"a.png", "image/png"},
                                                      {"a.JPG", "image/jpeg"},
                                                      {"a.txt", text},
                                                      {"a.html.txt", text},
                                                      {"a.pdf", "application/pdf"},
                                                      {".png", "image/png"},
                                                      {"a.svg", nullptr},
                                                      {"a.html", nullptr},
                                                      {"a.xhtml", nullptr},
                                                      {"a.txt.html", nullptr},
                                                      {"a", nullptr},
                                                      {"png", nullptr}};
  for (const auto& [name, type] : rows) WriteFile(share_ + "/" + name, "<script>alert(1)</script>");
  Server server = Start();
  server.Open();
  for (const auto& [name, type] : rows) {
    const std::string target = std::string("/files/photo/") + name;
    for (const bool preview : {false, true}) {
      const Reply reply = server.Get(target + (preview ? "?preview=1" : ""));
      ASSERT_EQ(reply.status, 200) << name;
      const bool shown = preview && type != nullptr;
      EXPECT_EQ(reply.fields.at("content-type"), shown ? type : "application/octet-stream");
      EXPECT_TRUE(reply.fields.at("content-disposition").starts_with(shown ? "inline;" : "attach"))
          << name;
      EXPECT_EQ(reply.fields.at("x-content-type-options"), "nosniff");
      const std::string policy = reply.fields.at("content-security-policy");
      EXPECT_TRUE(policy.starts_with("default-src 'none'")) << policy;
      const bool pdf = shown && type == std::string("application/pdf");
      EXPECT_EQ(policy.ends_with("sandbox"), !pdf) << name;
    }
  }
}

TEST_F(FilesTest, NamesAndRangesFollowTheirTables) {
  const struct {
    const char* name;
    const char* header;
  } names[] = {
      {"a b.txt", "attachment; filename=\"a b.txt\"; filename*=UTF-8''a%20b.txt"},
      {"\"q\"\\.txt", "attachment; filename=\"_q__.txt\"; filename*=UTF-8''%22q%22%5C.txt"},
      {"\xC3\xA9%41", "attachment; filename=\"___41\"; filename*=UTF-8''%C3%A9%2541"},
      {"a\u202Efdp.exe", "attachment; filename=\"a___fdp.exe\"; filename*=UTF-8''a_fdp.exe"},
      {"a\r\nX: y", "attachment; filename=\"a__X: y\"; filename*=UTF-8''a%0D%0AX%3A%20y"},
  };
  for (const auto& row : names) {
    EXPECT_EQ(arbory::ContentDisposition(false, row.name), row.header);
  }
  const struct {
    const char* field;
    std::uint64_t size, first, count;
    bool partial, satisfiable;
  } ranges[] = {{"bytes=0-0", 10, 0, 1, true, true},  {"bytes=9-", 10, 9, 1, true, true},
                {"bytes=2-99", 10, 2, 8, true, true}, {"bytes=-3", 10, 7, 3, true, true},
                {"bytes=-99", 10, 0, 10, true, true}, {"bytes=10-", 10, 0, 0, false, false},
                {"bytes=-0", 10, 0, 0, false, false}, {"bytes=0-", 0, 0, 0, false, false}};
  const auto check = [](const char* field, std::uint64_t size, const arbory::ByteRange& expected) {
    const arbory::ByteRange range = arbory::ParseRange(field, size);
    EXPECT_EQ(range.first, expected.first) << field;
    EXPECT_EQ(range.count, expected.count) << field;
    EXPECT_EQ(range.partial, expected.partial) << field;
    EXPECT_EQ(range.satisfiable, expected.satisfiable) << field;
  };
  for (const auto& row : ranges) {
    check(row.field, row.size, {row.first, row.count, row.partial, row.satisfiable});
  }
  // What is no range, or several, is the whole.
  for (const char* none : {"", "bytes=5-2", "bytes=a-b", "bytes=0-1,3-4", "lines=0-1",
                           "bytes=99999999999999999999-", "bytes=-"}) {
    check(none, 10, {0, 10, false, true});
  }
}

TEST_F(FilesTest, LargeFilesAndPartsOfThemArriveWhole) {
  std::string content;
  for (int at = 0; content.size() < 5'000'000; ++at) content += std::to_string(at) + " ";
  WriteFile(share_ + "/large.bin", content);
  WriteFile(share_ + "/empty.bin", "");
  Server server = Start();
  server.Open();
  const Reply whole = server.Get("/files/photo/large.bin");
  EXPECT_EQ(whole.status, 200);
  EXPECT_TRUE(whole.body == content);
  const Reply part =
      server.Ask("GET", "/files/photo/large.bin", "", "Range: bytes=1000000-3999999\r\n");
  EXPECT_EQ(part.status, 206);
  EXPECT_EQ(part.fields.at("content-range"),
            "bytes 1000000-3999999/" + std::to_string(content.size()));
  EXPECT_TRUE(part.body == content.substr(1'000'000, 3'000'000));
  EXPECT_EQ(server.Get("/files/photo/empty.bin").body, "");
  const Reply none = server.Ask("GET", "/files/photo/empty.bin", "", "Range: bytes=0-\r\n");
  EXPECT_EQ(none.status, 416);
  EXPECT_EQ(none.fields.at("content-range"), "bytes */0");
  const Reply head = server.Ask("HEAD", "/files/photo/large.bin");
  EXPECT_EQ(head.fields.at("content-length"), std::to_string(content.size()));
}

TEST_F(FilesTest, ThePageComesWithItsPolicy) {
  const std::string web = MakeFolder("web");
  Server unbuilt = Start("web_dir = \"" + web + "\"\n");
  EXPECT_NE(unbuilt.Get("/").body.find("build-page"), std::string::npos);
  WriteFile(web + "/index.html", "<!doctype html>");
  WriteFile(MakeFolder("web/assets") + "/app-1.js", "1");
  WriteFile(web + "/.hidden", "hidden");
  const Reply page = unbuilt.Get("/?q=a");
  EXPECT_EQ(page.body, "<!doctype html>");
  const std::string policy = page.fields.at("content-security-policy");
  for (const char* rule : {"default-src 'none'", "script-src 'self';", "frame-ancestors 'none'"}) {
    EXPECT_NE(policy.find(rule), std::string::npos) << policy;
  }
  EXPECT_EQ(policy.find("unsafe"), std::string::npos) << policy;
  const Reply script = unbuilt.Get("/assets/app-1.js");
  EXPECT_EQ(script.fields.at("content-type"), "text/javascript; charset=utf-8");
  EXPECT_NE(script.fields.at("cache-control").find("immutable"), std::string::npos);
  for (const char* none : {"/.hidden", "/assets", "/assets/none.js", "/assets/a/b", "/none"}) {
    EXPECT_EQ(unbuilt.Get(none).status, 404) << none;
  }
}

// Runs what the documents show to do, as it stands, against the sample share.
TEST_F(FilesTest, TheExamplesOfTheDocumentsWork) {
  std::string document = ReadFile(ARBORY_SOURCE_DIR "/docs/http.md");
  // Its first example logs in and its last one logs out; those of the API stand between.
  document.insert(document.find("\n## What can be searched"),
                  ReadFile(ARBORY_SOURCE_DIR "/docs/api.md"));
  std::string script = "set -eu -o pipefail\n";
  constexpr std::string_view kBegin = "\n```sh\n";
  for (size_t at = 0; (at = document.find(kBegin, at)) != std::string::npos;) {
    at += kBegin.size();
    const size_t end = document.find("```", at);
    script += document.substr(at, end - at) + "echo\n";
    at = end;
  }
  WriteFile(dir_ + "/examples.sh", script);
  share_lines_.clear();  // so that the sample is offered
  const Server server = Start();
  const std::string command = "ARBORY=http://" + server.Host() + " JAR=" + dir_ +
                              "/jar ARBORY_OPEN=http://" + server.Host() + server.open_path +
                              " bash " + dir_ + "/examples.sh > " + dir_ + "/said 2>&1";
  const int status = std::system(command.c_str());
  const std::string said = ReadFile(dir_ + "/said");
  EXPECT_EQ(WEXITSTATUS(status), 0) << said;
  for (const char* part :
       {"\"mode\":\"single\"", "\"name\":\"sample\"", "\"total\":2", "\"phase\":\"done\"",
        "# Report 2025", "This is", "arbory_calls_total{", "\"pattern\":\"report\""}) {
    EXPECT_NE(said.find(part), std::string::npos) << part << "\n" << said;
  }
}

}  // namespace
}  // namespace server_test
