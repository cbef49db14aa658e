// Boxes that lie: each costs its own rows and nothing else. And boxes whose clocks are off.

#include <dirent.h>

#include <fstream>

#include "tests/fleet/fake_box.h"
#include "tests/fleet/front.h"

namespace fleet_test {
namespace {

constexpr char kTask[] = "0123456789abcdef0123456789abcdef";

// A page of /fleet/search. Rows are files 0, 1, ... of the share "data", from `first` on.
struct Page {
  std::uint64_t first = 0;
  std::uint64_t rows = 3;
  std::uint64_t next = 3;
  std::uint64_t total = 3;
  bool finished = true;
  std::string share = "data";
  std::string folder = "f";
  std::string name = "plan ";
  std::uint64_t step = 1;  // of the rows' numbers

  std::string Text() const {
    std::string text = R"({"protocol":2,"version":"9","task":")" + std::string(kTask) +
                       R"(","error":0,"source":"walk","index":"no index","users":["u"],)" +
                       R"("groups":["g"],"folders":[[")" + share + "\",\"" + folder +
                       "\"]],\"finished\":" + (finished ? "true" : "false") +
                       ",\"total\":" + std::to_string(total) + ",\"next\":" + std::to_string(next) +
                       ",\"rows\":[";
    for (std::uint64_t row = 0; row < rows; ++row) {
      text += std::string(row == 0 ? "" : ",") + "[0,\"" + name + std::to_string(first + row) +
              "\",33188,0,0,5,1,1,1,null," + std::to_string(first + row * step) + "]";
    }
    return text + "]}";
  }
};

std::string Repeated(const std::string& text, int times) {
  std::string all;
  for (int i = 0; i < times; ++i) all += text;
  return all;
}

class HostileTest : public FrontTest {
 protected:
  // A front that asks the fake box and an honest one with three files.
  void Prepare(const FakeBox& fake, const std::string& more = "") {
    const Box honest = StartBox("honest");
    for (int i = 0; i < 3; ++i) MakeFile(honest, "plan " + std::to_string(i));
    front_ =
        LoggedIn(StartFront({fake.AsBox("fake"), honest}, "deadline_ms = 5000\n" + more), User());
  }

  // Searches both; the state of the fake one.
  std::string SearchBoth() {
    Json::Value params;
    params["pattern"] = "plan";
    params["folder_path"].append("/fake/data");
    params["folder_path"].append("/honest/data");
    Search(front_, params);
    Json::Value listing;  // the honest one's first
    listing["sort_by"] = "path";
    listing["sort_direction"] = "DESC";
    listing["limit"] = 10;
    size_t honest = 0;
    for (const Listed& file : List(front_, listing)) honest += file.path.starts_with("/honest/");
    EXPECT_EQ(honest, 3U) << "an honest box's rows are missing";
    told_ = total_ - honest;
    const Json::Value& fleet = status_["walk"]["fleet"];
    return fleet["boxes"].empty() ? "answered" : fleet["boxes"][0]["state"].asString();
  }

  size_t told_ = 0;  // rows of the fake box
  Server front_;
};

TEST_F(HostileTest, ALieCostsTheBoxsOwnRows) {
  const auto with = [](auto change) {
    Page page;
    change(page);
    return FakeBox::Reply(page.Text());
  };
  const std::string plain = Page().Text();
  std::string older = plain;
  for (const char* word : {R"("version":"9",)", R"("source":"walk","index":"no index",)"}) {
    older.erase(older.find(word), std::string_view(word).size());
  }
  const std::string without_news = FakeBox::Reply(older);
  const std::string with_more = FakeBox::Reply("{\"colour\":[1]," + plain.substr(1));
  const struct {
    const char* what;
    std::string reply;
    const char* state;
    size_t rows;
  } rows[] = {
      {"the truth", with([](auto&) {}), "answered", 3},
      {"more rows than it counts", with([](auto& page) { page.next = page.total = 2; }), "down", 0},
      {"more told than there are", with([](auto& page) { page.total = 2; }), "down", 0},
      {"another share", with([](auto& page) { page.share = "secret"; }), "down", 0},
      {"a share that is a path", with([](auto& page) { page.share = "../data"; }), "down", 0},
      {"a folder above", with([](auto& page) { page.folder = "../f"; }), "down", 0},
      {"a name that is a path", with([](auto& page) { page.name = "a/b"; }), "down", 0},
      {"a name longer than any", with([](auto& page) { page.name.assign(300, 'n'); }), "down", 0},
      {"a row twice", with([](auto& page) { page.step = 0; }), "down", 0},
      {"a number out of the page", with([](auto& page) { page.first = 7; }), "down", 0},
      {"numbers backwards", with([](auto& page) {
         page.first = 2;
         page.step = ~std::uint64_t{0};
       }),
       "down", 0},
      {"a page of millions", with([](auto& page) { page.rows = page.next = page.total = 100'000; }),
       "down", 0},
      {"many small values", FakeBox::Reply("[0" + Repeated(",0", 250'000) + "]"), "down", 0},
      {"longer than any page", FakeBox::Reply(std::string(size_t{3} << 20, ' ')), "down", 0},
      {"deep in itself", FakeBox::Reply(std::string(100'000, '[')), "down", 0},
      {"no JSON", FakeBox::Reply("rows"), "down", 0},
      {"an error's page", FakeBox::Reply("<html>", "", "500 Internal Server Error"), "down", 0},
      {"an older box's words", FakeBox::Reply("{}", "", "404 Not Found"), "old", 0},
      {"a question not understood", FakeBox::Reply("{}", "", "400 Bad Request"), "old", 0},
      {"another version's page", FakeBox::Reply(R"({"rows":{},"protocol":3})"), "old", 0},
      {"less than boxes tell now", without_news, "answered", 3},
      {"more than boxes tell now", with_more, "answered", 3},
  };
  FakeBox fake;
  Prepare(fake);
  for (const auto& row : rows) {
    SCOPED_TRACE(row.what);
    fake.Say(row.reply);
    EXPECT_EQ(SearchBoth(), row.state);
    EXPECT_LE(told_, row.rows);
    if (std::string_view(row.state) == "answered") {
      EXPECT_EQ(told_, row.rows);
    }
  }
}

// The most memory that a process of the front's has had, in kilobytes.
size_t MostMemoryOfChildren(pid_t front) {
  size_t most = 0;
  DIR* const proc = opendir("/proc");
  while (const dirent* entry = readdir(proc)) {
    std::ifstream status("/proc/" + std::string(entry->d_name) + "/status");
    pid_t parent = 0;
    size_t peak = 0;
    for (std::string word; status >> word;) {
      if (word == "PPid:") status >> parent;
      if (word == "VmHWM:") status >> peak;
    }
    if (parent == front) most = std::max(most, peak);
  }
  closedir(proc);
  return most;
}

TEST_F(HostileTest, EndlessRowsEndAtTheBoundAndTakeLittleMemory) {
  constexpr std::uint64_t kBound = 20'000;
  std::uint64_t told = 0;
  size_t memory = 0;
  bool ended = false;
  // Each row in a name as long as it may be.
  FakeBox fake([&](const std::string& request, const auto& send) {
    if (request.starts_with("POST /fleet/end")) {
      ended = true;
      send(FakeBox::Reply("{}"));
      return;
    }
    Page page;
    page.name.assign(240, 'n');
    page.first = told;
    page.rows = 1000;
    told = page.next = told + page.rows;
    page.total = told + 1;
    page.finished = false;
    send(FakeBox::Reply(page.Text()));
    memory = std::max(memory, MostMemoryOfChildren(front_.pid));
  });
  Prepare(fake, "rows_per_box = " + std::to_string(kBound) + "\n");
  EXPECT_EQ(SearchBoth(), "refused");
  const auto paused = fake.Paused();
  EXPECT_EQ(told, kBound);
  EXPECT_TRUE(ended) << "the box goes on for nobody";
  constexpr size_t kMostKilobytes = 64 << 10;
  EXPECT_GT(memory, 0U);
  // Sanitizers map more than they use.
  if (nas_test::kMemoryIsBounded) {
    EXPECT_LT(memory, kMostKilobytes);
  }
}

TEST_F(HostileTest, AClockThatIsOffIsFollowedOnceAndNotFar) {
  int off = 0;
  std::vector<std::int64_t> issued;
  FakeBox fake([&](const std::string& request, const auto& send) {
    const size_t token = request.find("Arbory-Fleet ");
    if (token == std::string::npos) return;
    const auto read =
        nas::ReadToken(request.substr(token + 13, request.find('\r', token) - token - 13));
    const std::time_t now = std::time(nullptr) + off;
    issued.push_back(read ? read->said.issued : 0);
    const bool good = std::abs(issued.back() - now) < 5;
    send(good ? FakeBox::Reply(Page().Text())
              : FakeBox::Reply(R"({"code":401,"why":"clock","now":)" + std::to_string(now) + "}",
                               "", "401 Unauthorized"));
  });
  Prepare(fake);
  for (const int seconds : {200, -200, 900}) {
    SCOPED_TRACE(seconds);
    {
      const auto paused = fake.Paused();
      off = seconds;
      issued.clear();
    }
    const bool near = std::abs(seconds) <= nas::kMostClockOff;
    EXPECT_EQ(SearchBoth(), near ? "answered" : "refused");
    const auto paused = fake.Paused();
    EXPECT_EQ(issued.size(), near ? 2U : 1U);
    EXPECT_EQ(told_, near ? 3U : 0U);
  }
}

}  // namespace
}  // namespace fleet_test
