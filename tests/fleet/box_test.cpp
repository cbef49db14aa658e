// What a box lets a front do.

#include <pwd.h>

#include <set>

#include "nas/base/file_lock.h"
#include "nas/fleet/question.h"
#include "tests/fleet/fleet_test.h"

namespace fleet_test {
namespace {

class BoxTest : public FleetTest {
 protected:
  // The names on pages of `limit` rows, asked for until the search has ended; each name once.
  std::multiset<std::string> AllNames(const Box& box, const std::string& user, unsigned limit) {
    std::multiset<std::string> names;
    Reply reply = Ask(box, user, "POST", "/fleet/search", Question(limit));
    for (pages_ = 1;; ++pages_) {
      const auto page = nas::ReadFleetPage(reply.body);
      EXPECT_EQ(reply.status, 200) << reply.body;
      if (!page) {
        ADD_FAILURE() << reply.body;
        return names;
      }
      EXPECT_LE(page->rows.size(), limit);
      for (const nas::FleetRow& row : page->rows) names.insert(row.name);
      task_ = page->task;
      if (page->finished && page->next == page->total) return names;
      reply = Ask(box, user, "POST", "/fleet/rows",
                  R"({"wait_ms":1000,"limit":)" + std::to_string(limit) +
                      ",\"after\":" + std::to_string(page->next) + ",\"task\":\"" + task_ + "\"}");
    }
  }

  // Who is let in with this request, and who is not.
  void CheckTokens(const Box& box, const std::string& method, const std::string& target,
                   const std::string& body);

  int pages_ = 0;
  std::string task_;
};

void BoxTest::CheckTokens(const Box& box, const std::string& method, const std::string& target,
                          const std::string& body) {
  const auto good = [&] { return TokenFor(box, User(), method, target, body); };
  const auto with = [&](auto change) {
    nas::FleetToken token = good();
    change(token);
    return nas::SignedToken(token, secret_key_);
  };
  const std::string used = with([](auto&) {});
  EXPECT_EQ(AskWith(box, used, method, target, body).status, 200);
  std::string flipped = with([](auto&) {});
  flipped.back() = flipped.back() == '0' ? '1' : '0';
  std::string renamed = with([](auto&) {});
  renamed.replace(renamed.find(nas::ToHex(User() + "@OFFICE")), 2, "72");
  const struct {
    const char* what;
    std::string token;
    int status;
    const char* why;
  } rows[] = {
      {"replayed", used, 401, "token"},
      {"none", "", 401, "token"},
      {"no token at all", "1.office", 401, "token"},
      {"one part more", with([](auto&) {}) + ".00", 401, "token"},
      {"another key", nas::SignedToken(good(), other_key_), 401, "token"},
      {"a bit of the signature", flipped, 401, "token"},
      {"another user under the signature", renamed, 401, "token"},
      {"an unknown front", with([](auto& token) { token.front = "shop"; }), 401, "token"},
      {"another box's", with([](auto& token) { token.box = "box2"; }), 401, "token"},
      {"another body's",
       with([&](auto& token) { token.hash = nas::RequestHash(method, target, body + " "); }), 401,
       "token"},
      {"another target's",
       with([&](auto& token) { token.hash = nas::RequestHash(method, "/fleet/rows", body); }), 401,
       "token"},
      {"as old as may be", with([](auto& token) { token.issued -= nas::kTokenSeconds - 2; }), 200,
       ""},
      {"another method's",
       with([&](auto& token) { token.hash = nas::RequestHash("PUT", target, body); }), 401,
       "token"},
      {"expired", with([](auto& token) { token.issued -= nas::kTokenSeconds + 2; }), 401, "clock"},
      {"a little ahead", with([](auto& token) { token.issued += nas::kTokenFutureSeconds - 2; }),
       200, ""},
      {"of the future", with([](auto& token) { token.issued += nas::kTokenFutureSeconds + 3; }),
       401, "clock"},
      {"of another realm", with([&](auto& token) { token.user = User() + "@SHOP"; }), 403, ""},
      {"of no realm", with([&](auto& token) { token.user = User(); }), 403, ""},
      {"of nobody", with([](auto& token) { token.user = "no-such-user@OFFICE"; }), 403, ""},
      {"of no name", with([](auto& token) { token.user = "@OFFICE"; }), 403, ""},
      {"of a path", with([](auto& token) { token.user = "../root@OFFICE"; }), 403, ""},
      {"of root, named or not", with([](auto& token) { token.user = "root@OFFICE"; }), 403, ""},
      {"of somebody it may not speak for", with([](auto& token) { token.user = "bin@OFFICE"; }),
       403, ""},
  };
  for (const auto& row : rows) {
    const Reply reply = AskWith(box, row.token, method, target, body);
    EXPECT_EQ(reply.status, row.status) << row.what << ": " << reply.body;
    if (row.status == 200) continue;
    EXPECT_EQ(reply.json()["why"].asString(), row.why) << row.what;
    if (*row.why != '\0') {
      EXPECT_NEAR(reply.json()["now"].asDouble(), static_cast<double>(time(nullptr)), 5);
    }
    EXPECT_EQ(reply.body.find("task"), std::string::npos) << row.what;
  }
}

TEST_F(BoxTest, BelievesATokenOnceForOneRequest) {
  const Box box = StartBox("box1");
  MakeFile(box, "a.txt", "", "a task of words");
  const struct {
    const char* method;
    std::string target;
    std::string body;
  } requests[] = {{"POST", "/fleet/search", Question(10)},
                  {"GET", "/fleet/files/data/a.txt", ""},
                  {"GET", "/fleet/lines/data/a.txt?pattern=words", ""}};
  for (const auto& request : requests) {
    SCOPED_TRACE(request.target);
    CheckTokens(box, request.method, request.target, request.body);
  }
  EXPECT_NE(Log().find("\"front\":\"office\""), std::string::npos) << "who asked is not logged";
}

TEST_F(BoxTest, NobodyIsAFrontWhereNoneIsNamed) {
  const Box box{"box1", Start(), ""};
  for (const char* target : {"/fleet/search", "/fleet/rows", "/fleet/end"}) {
    EXPECT_EQ(Ask(box, User(), "POST", target, "{}").status, 404) << target;
  }
  for (const char* target : {"/fleet/shares", "/fleet/files/data/a", "/fleet/lines/data/a"}) {
    EXPECT_EQ(Ask(box, User(), "GET", target).status, 404) << target;
  }
}

TEST_F(BoxTest, ATokenOpensNothingElse) {
  const Box box = StartBox("box1");
  for (const char* target :
       {"/shares", "/session", "/searches/x", "/files/data/a", "/lines/data/a"}) {
    EXPECT_EQ(Ask(box, User(), "GET", target).status, 401) << target;
  }
  EXPECT_EQ(Ask(box, User(), "POST", "/api/NUVA.Arbory.Search/2/start", "{}").status, 401);
}

TEST_F(BoxTest, TheSystemsOwnAreNobodyHere) {
  SKIP_UNLESS_ROOT();
  const Box box = StartBox("box1", "");
  EXPECT_EQ(Ask(box, kAnn, "GET", "/fleet/shares").status, 200);
  EXPECT_EQ(Ask(box, kBob, "GET", "/fleet/shares").status, 403) << "though the front may speak";
}

TEST_F(BoxTest, AFrontMaySpeakForAGroup) {
  SKIP_UNLESS_ROOT();
  const Box box = StartBox("box1", "lowest_uid = 1\n", "groups = [\"bin\", \"no-such-group\"]\n");
  EXPECT_EQ(Ask(box, "bin", "GET", "/fleet/shares").status, 200);
  EXPECT_EQ(Ask(box, "games", "GET", "/fleet/shares").status, 403);
}

TEST_F(BoxTest, TellsWhatTheKernelLetsTheUserSee) {
  SKIP_UNLESS_ROOT();
  const Box box = StartBox("box1");
  MakeFile(box, "open/for all.txt");
  MakeFile(box, "ann/hers.txt");
  MakeFile(box, "bob/his.txt");
  for (const char* user : {kAnn, kBob}) {
    const std::string folder = box.share + (user == kAnn ? "/ann" : "/bob");
    ASSERT_EQ(chown(folder.c_str(), getpwnam(user)->pw_uid, 0), 0);
    ASSERT_EQ(chmod(folder.c_str(), 0700), 0);
  }
  const std::multiset<std::string> all = {"open", "for all.txt", "ann", "bob"};
  auto anns = all;
  anns.insert("hers.txt");
  auto bobs = all;
  bobs.insert("his.txt");
  EXPECT_EQ(AllNames(box, kAnn, 100), anns);
  EXPECT_EQ(AllNames(box, kBob, 100), bobs);
  // Nothing tells that there is more: the pages differ by the user's own rows alone.
  const std::string page = Ask(box, kAnn, "POST", "/fleet/search", Question(100)).body;
  EXPECT_EQ(page.find("skipped"), std::string::npos) << page;
  EXPECT_EQ(page.find("permission"), std::string::npos) << page;
}

TEST_F(BoxTest, PagesHoldEachRowOnceAndTheSearchGoesWithTheLast) {
  const Box box = StartBox("box1");
  std::multiset<std::string> wanted;
  for (int i = 0; i < 25; ++i) {
    MakeFile(box, "file " + std::to_string(i) + "\x01\xff.txt");  // no UTF-8, and no bare JSON
    wanted.insert("file " + std::to_string(i) + "\x01\xff.txt");
  }
  EXPECT_EQ(AllNames(box, User(), 100), wanted);
  EXPECT_EQ(pages_, 1) << "the search and its first page are one call";
  EXPECT_EQ(AllNames(box, User(), 7), wanted);
  EXPECT_EQ(pages_, 4);
  const std::string rows = R"({"wait_ms":0,"limit":7,"after":0,"task":")" + task_ + "\"}";
  EXPECT_EQ(Ask(box, User(), "POST", "/fleet/rows", rows).status, 404);
  EXPECT_TRUE(nas_test::Eventually([&] {
    size_t left = 0;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(dir_)) {
      left += entry.path().extension() == ".db" && entry.path().parent_path().filename() == User();
    }
    return left == 0;
  })) << "results were left behind";
}

TEST_F(BoxTest, AQuestionInOtherWordsIsRefusedWhole) {
  const Box box = StartBox("box1");
  MakeFile(box, "a.txt");
  const std::string good = Question(10);
  const auto with = [&](const std::string& old, const std::string& other) {
    std::string text = good;
    return text.replace(text.find(old), old.size(), other);
  };
  for (const std::string& bad :
       {with("\"protocol\":2", "\"protocol\":1"), with("\"protocol\":2", "\"protocol\":3"),
        with("[\"all\"]", "[\"colour\",\"red\"]"), with("[\"all\"]", "[\"all\",[\"colour\"]]"),
        with("[\"all\"]", "[]"), with("\"limit\":10", "\"limit\":100000"),
        with("\"wait_ms\":1000", "\"wait_ms\":-1"), with("[\"/data\"]", "[]"),
        with("[\"/data\"]", "\"/data\""), with("[\"all\"]", "[\"owner\",7]"), std::string("[]"),
        std::string("{")}) {
    EXPECT_EQ(Ask(box, User(), "POST", "/fleet/search", bad).status, 400) << bad;
  }
  const Json::Value nowhere =
      Ask(box, User(), "POST", "/fleet/search", Question(10, R"(["/elsewhere"])")).json();
  EXPECT_EQ(nowhere["error"].asInt(), 0x0600) << "no such folder";
  EXPECT_EQ(nowhere["finished"], true);
  const Json::Value owned = Ask(box, User(), "POST", "/fleet/search",
                                Question(10, R"(["/data"])", R"(["owner","no-such-user"])"))
                                .json();
  EXPECT_EQ(owned["total"], 0) << "what nobody here owns";
}

TEST_F(BoxTest, AFrontHasSoManySearchesAndEndsThem) {
  const Box box = StartBox("box1", "lowest_uid = 1\n", "searches = 1\n");
  for (int i = 0; i < 20; ++i) MakeFile(box, std::to_string(i));
  const std::string question = Question(1);
  const Reply first = Ask(box, User(), "POST", "/fleet/search", question);
  const std::string task = first.json()["task"].asString();
  EXPECT_EQ(first.status, 200) << first.body;
  const Reply ended = Ask(box, User(), "POST", "/fleet/end", R"({"taskid":")" + task + "\"}");
  EXPECT_EQ(ended.json()["code"], 0) << ended.body;
  const std::string rows = R"({"wait_ms":0,"limit":7,"after":0,"task":")" + task + "\"}";
  EXPECT_TRUE(nas_test::Eventually(
      [&] { return Ask(box, User(), "POST", "/fleet/rows", rows).status == 404; }));

  // Another search has the only place.
  const std::string places = (nas_test::AmRoot() ? root_state_ : state_) + "/fleet/office";
  nas::UniqueFd held(open(places.c_str(), O_RDWR | O_CLOEXEC));
  struct flock lock = nas::WriteLockOn(0);
  ASSERT_TRUE(nas_test::Eventually([&] { return fcntl(held.get(), F_OFD_SETLK, &lock) == 0; }))
      << "the place was not given back";
  EXPECT_EQ(Ask(box, User(), "POST", "/fleet/search", question).status, 503);
  EXPECT_EQ(Ask(box, User(), "GET", "/fleet/shares").status, 200) << "that is no search";
  held.Reset();
  EXPECT_EQ(Ask(box, User(), "POST", "/fleet/search", question).status, 200);
}

}  // namespace
}  // namespace fleet_test
