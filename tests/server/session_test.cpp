// Who is let in, for how long, and as whom.

#include "arbory/server/service/sessions.h"

#include <grp.h>
#include <pwd.h>
#include <sched.h>
#include <sys/mount.h>

#include <algorithm>
#include <iterator>
#include <sstream>

#include "tests/server/server_test.h"

namespace server_test {
namespace {

using nas_test::ReadFile;
using nas_test::WriteFile;
using std::chrono::milliseconds;
using std::chrono::seconds;
using std::chrono::steady_clock;

class SessionTest : public ServerTest {};

TEST_F(SessionTest, ATokenOpensOneSessionOnce) {
  Server server = Start();
  EXPECT_EQ(server.Get("/session").status, 401);
  EXPECT_EQ(server.Get("/session").json()["mode"], "single");
  for (const char* bad :
       {"/open", "/open?token=", "/open?token=00000000000000000000000000000000"}) {
    EXPECT_EQ(server.Get(bad).status, 403) << bad;
  }
  EXPECT_EQ(server.Ask("HEAD", server.open_path).status, 405) << "looking does not use it up";
  const Reply opened = server.Get(server.open_path);
  EXPECT_EQ(opened.status, 303);
  EXPECT_EQ(opened.fields.at("location"), "/");
  const std::string cookie = opened.fields.at("set-cookie");
  for (const char* part : {"; HttpOnly", "; SameSite=Strict", "; Path=/", "; Max-Age=43200"}) {
    EXPECT_NE(cookie.find(part), std::string::npos) << cookie;
  }
  EXPECT_EQ(cookie.find("; Secure"), std::string::npos) << "no TLS here";
  EXPECT_EQ(server.Get(server.open_path).status, 403) << "the second time";

  server.cookie = cookie.substr(0, cookie.find(';'));
  // A person who opens it again is led to the page, which says what to do.
  Server stranger_by_browser = server;
  stranger_by_browser.cookie.clear();
  for (const auto& [who, page] : {std::pair(&server, "/"), {&stranger_by_browser, "/?used"}}) {
    const Reply led =
        who->Ask("GET", server.open_path, "", "Accept: text/html,application/xhtml+xml\r\n");
    EXPECT_EQ(led.status, 303);
    EXPECT_EQ(led.fields.at("location"), page);
    EXPECT_FALSE(led.fields.contains("set-cookie"));
  }
  const Json::Value session = server.Get("/session").json();
  EXPECT_EQ(session["user"], User());
  EXPECT_EQ(session["mode"], "single");
  EXPECT_NEAR(session["expires"].asDouble(), static_cast<double>(time(nullptr)) + 12 * 3600, 60);
  EXPECT_EQ(server.Post("/login", R"({"user":"root","password":""})").status, 403);

  const Server stranger = [&] {
    Server other = server;
    other.cookie = server.cookie.substr(0, server.cookie.size() - 1) + "x";
    return other;
  }();
  for (const char* target : {"/session", "/shares", "/searches/x", "/files/photo/x"}) {
    EXPECT_EQ(stranger.Get(target).status, 401) << target;
  }
  EXPECT_EQ(stranger.Call("list", "{}").status, 401);
  EXPECT_EQ(stranger.Post("/logout", "{}").status, 401);

  const Reply left = server.Post("/logout", "");
  EXPECT_EQ(left.status, 200);
  EXPECT_NE(left.fields.at("set-cookie").find("Max-Age=0"), std::string::npos);
  EXPECT_EQ(server.Get("/session").status, 401) << "the cookie was kept";
  EXPECT_EQ(Log().find(server.open_path.substr(12)), std::string::npos) << "the token was logged";
}

TEST_F(SessionTest, BehindTlsTheCookieIsBoundToTheHost) {
  Server server = Start("behind_tls = true\nsession_minutes = 5\n");
  const std::string cookie = server.Get(server.open_path).fields.at("set-cookie");
  EXPECT_TRUE(cookie.starts_with("__Host-arbory=")) << cookie;
  EXPECT_NE(cookie.find("; Max-Age=300; Secure"), std::string::npos) << cookie;
}

TEST(SessionsTest, EndWithTheirTime) {
  arbory::Sessions sessions(seconds(100));
  const std::string id = sessions.Begin("ann", 1000);
  EXPECT_EQ(id.size(), 32U);
  EXPECT_NE(sessions.Begin("ann", 1000), id);
  EXPECT_EQ(sessions.Find(id, 1099)->user, "ann");
  EXPECT_FALSE(sessions.Find(id, 1100)) << "its time has come";
  EXPECT_FALSE(sessions.Find(id, 1050)) << "what ended stays ended";
  EXPECT_FALSE(sessions.Find("", 1000));
  const std::string oldest = sessions.Begin("bob", 1001);
  for (int at = 1; at < arbory::Sessions::kMaxPerUser; ++at) sessions.Begin("bob", 1002);
  EXPECT_TRUE(sessions.Find(oldest, 1003));
  sessions.Begin("bob", 1003);
  EXPECT_FALSE(sessions.Find(oldest, 1003)) << "one too many";
  EXPECT_EQ(sessions.Count(1103), 0U);
}

TEST(LoginLimitTest, CountsRefusedOnesByAddressAndByAccount) {
  arbory::LoginLimit limit(2);
  const auto begin = [&](const std::string& address, const char* user, int second) {
    return limit.Begin(address, user, arbory::LoginLimit::Time(seconds(second)));
  };
  EXPECT_EQ(begin("1.1.1.1", "ann", 100), 0);
  EXPECT_EQ(begin("1.1.1.1", "bob", 110), 0);
  EXPECT_EQ(begin("1.1.1.1", "cid", 120), 40) << "the address has had two";
  EXPECT_EQ(begin("2.2.2.2", "ann", 120), 0) << "no stranger locks an account";
  for (int at = 2; at < 2 * arbory::LoginLimit::kAccountTimes; ++at) {
    EXPECT_EQ(begin("9.9.9." + std::to_string(at), "ann", 120), 0);
  }
  EXPECT_EQ(begin("3.3.3.3", "ann", 120), 40) << "unless from many places";
  EXPECT_EQ(begin("1.1.1.1", "cid", 160), 0) << "the first is a minute old";
  limit.Succeeded("1.1.1.1", "cid");
  EXPECT_EQ(begin("1.1.1.1", "cid", 160), 0) << "one that succeeded does not count";
}

// Logins against a private PAM service, whose password is "right" for everybody.
class LoginTest : public ServerTest {
 protected:
  static constexpr char kAnn[] = "nobody";
  static constexpr char kBob[] = "daemon";

  Server StartWithLogins(const std::string& more = "", const std::string& top_lines = "") {
    const std::string check = dir_ + "/check";
    WriteFile(check, "#!/bin/sh\nread -r given || :\n[ \"$given\" = right ]\n");
    chmod(check.c_str(), 0755);
    WriteFile(MakeFolder("pam") + "/arbory", "auth required pam_exec.so quiet expose_authtok " +
                                                 check + "\naccount required pam_permit.so\n");
    WriteFile(dir_ + "/pam/closed", "auth required pam_permit.so\naccount required pam_deny.so\n");
    return Start("pam_dir = \"" + dir_ + "/pam\"\n" + more, top_lines, As::kRootWithLogins);
  }

  // In a shadow file of this process and its servers alone, which is written in place: nothing can
  // be renamed to where it is mounted.
  void SetShadow(const std::string& text) const {
    const nas::UniqueFd fd(open((dir_ + "/shadow").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    EXPECT_EQ(write(fd.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
  }
  bool UseShadow() const {
    return unshare(CLONE_NEWNS) == 0 &&
           mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
           mount((dir_ + "/shadow").c_str(), "/etc/shadow", nullptr, MS_BIND, nullptr) == 0;
  }

  void GiveTo(const std::string& path, const char* user, mode_t mode) {
    const passwd* account = getpwnam(user);
    ASSERT_EQ(chown(path.c_str(), account->pw_uid, account->pw_gid), 0);
    ASSERT_EQ(chmod(path.c_str(), mode), 0);
  }
};

TEST_F(LoginTest, RefusalsTellNothingOfTheUser) {
  SKIP_UNLESS_ROOT();
  Server server = StartWithLogins("logins_per_minute = 5\n");
  EXPECT_TRUE(server.open_path.empty());
  EXPECT_EQ(server.Get("/session").json()["mode"], "login");
  EXPECT_EQ(server.Get("/open?token=").status, 403);
  EXPECT_TRUE(server.LogIn(kAnn, "right"));
  EXPECT_EQ(server.Get("/session").json()["user"], kAnn);
  EXPECT_EQ(server.Get("/session").json()["mode"], "login");

  std::string body;
  const struct {
    const char* user;
    const char* password;
  } rows[] = {{kAnn, "wrong"}, {"no-such-user", "right"}, {"no-such-user", "wrong"}, {"../x", ""}};
  for (const auto& row : rows) {
    const auto begun = steady_clock::now();
    const Reply reply = server.Post("/login", std::string("{\"user\":\"") + row.user +
                                                  "\",\"password\":\"" + row.password + "\"}");
    EXPECT_EQ(reply.status, 401) << row.user;
    EXPECT_TRUE(body.empty() || reply.body == body) << reply.body;
    body = reply.body;
    EXPECT_GE(steady_clock::now() - begun, milliseconds(1990)) << row.user;
  }
  // A body that is held back must not use the time up before the password is looked at.
  const std::string slow = server.RequestText("POST", "/login", R"({"user":"x","password":""})",
                                              "Content-Type: application/json\r\n");
  Client client(server.port);
  client.Send(slow.substr(0, slow.size() - 1));
  std::this_thread::sleep_for(milliseconds(2100));
  const auto begun = steady_clock::now();
  client.Send(slow.substr(slow.size() - 1));
  EXPECT_EQ(client.Read().status, 401);
  EXPECT_GE(steady_clock::now() - begun, milliseconds(1990));
  const Reply limited = server.Post("/login", R"({"user":"nobody","password":"right"})");
  EXPECT_EQ(limited.status, 429) << "even the right one, after five refusals";
  EXPECT_GT(std::stoi(limited.fields.at("retry-after")), 0);
  for (const char* bad : {"{}", R"({"user":7,"password":"a"})", R"({"user":"a"})",
                          R"({"user":"","password":""})", R"({"user":"a\u0000b","password":""})"}) {
    EXPECT_EQ(server.Post("/login", bad).status, 400) << bad;
  }
  const std::string large = "{\"user\":[" + std::string(100'000, ' ') + "]}";
  EXPECT_EQ(server.Post("/login", large).status, 413) << "not even read as JSON";
  EXPECT_TRUE(server.Counts("arbory_logins_refused_total 6"));
  EXPECT_NE(
      server.Get("/metrics").body.find("arbory_call_seconds_bucket{method=\"login\",le=\"1\"} 0\n"),
      std::string::npos)
      << "the counts show how long a check took";
  EXPECT_EQ(Log().find("right"), std::string::npos) << "a password was logged";
}

TEST_F(LoginTest, BehindAProxyEachClientIsCountedByItself) {
  SKIP_UNLESS_ROOT();
  const auto log_in = [](const Server& server, const char* from, const char* password) {
    return server
        .Ask("POST", "/login", std::string(R"({"user":"nobody","password":")") + password + "\"}",
             std::string("Content-Type: application/json\r\nX-Forwarded-For: ") + from + "\r\n")
        .status;
  };
  const Server behind = StartWithLogins("logins_per_minute = 1\nproxies = [\"127.0.0.1\"]\n");
  EXPECT_EQ(log_in(behind, "203.0.113.1", "wrong"), 401);
  EXPECT_EQ(log_in(behind, "203.0.113.9, 203.0.113.1", "right"), 429) << "it made up the first";
  EXPECT_EQ(log_in(behind, "203.0.113.2", "right"), 200) << "locked out by another";
  EXPECT_TRUE(
      Eventually([&] { return Log().find("\"peer\":\"203.0.113.2\"") != std::string::npos; }));
  EXPECT_EQ(behind.Ask("GET", "/metrics", "", "X-Forwarded-For: 203.0.113.2\r\n").status, 403);
  const Server alone = StartWithLogins("logins_per_minute = 1\n");
  EXPECT_EQ(log_in(alone, "203.0.113.1", "wrong"), 401);
  EXPECT_EQ(log_in(alone, "203.0.113.2", "right"), 429) << "anybody can send the field";
}

TEST_F(LoginTest, AClosedAccountIsRefused) {
  SKIP_UNLESS_ROOT();
  Server server = StartWithLogins("pam_service = \"closed\"\n");
  EXPECT_FALSE(server.LogIn(kAnn, "right"));
  Server missing = StartWithLogins("pam_service = \"missing\"\n");
  EXPECT_FALSE(missing.LogIn(kAnn, "right")) << "no service file: nobody is let in";
}

// Whatever the service file allows.
TEST_F(LoginTest, NoPasswordIsNoWayIn) {
  SKIP_UNLESS_ROOT();
  SetShadow(
      "nobody::20000::::::\n"
      "daemon:$6$salt$vBy9sDCxqmqmfqBK5nmzr1kUIMkq7zYdlIyWD/n41gv0wdATFYfB4I23B0JdtdxxxIQE3SB7pygx"
      "UpkBZeF7a/:20000::::::\n");
  if (!UseShadow()) GTEST_SKIP() << "no accounts of its own: " << strerror(errno);
  WriteFile(MakeFolder("pam") + "/machine",
            "auth required pam_unix.so nullok\naccount required pam_unix.so\n");
  Server server = StartWithLogins("pam_service = \"machine\"\n");
  EXPECT_FALSE(server.LogIn(kAnn, ""));
  EXPECT_FALSE(server.LogIn(kBob, ""));
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
  // Theirs is no crypt() where the library comes with a PAM module.
  EXPECT_TRUE(server.LogIn(kBob, "right"));
#endif
}

TEST_F(LoginTest, ASessionEndsWithWhatItWasGivenFor) {
  SKIP_UNLESS_ROOT();
  // Written in one step each: a look may fall between any two.
  const auto set_password = [&](const std::string& eight_letters) {
    SetShadow("nobody:" + eight_letters + ":20000::::::\ndaemon:whatever:20000::::::\n");
  };
  set_password("as it is");
  if (!UseShadow()) GTEST_SKIP() << "no accounts of its own: " << strerror(errno);
  const std::string looks = dir_ + "/looks";
  WriteFile(dir_ + "/look", "#!/bin/sh\necho \"$PAM_USER\" >> " + looks + "\n");
  chmod((dir_ + "/look").c_str(), 0755);
  const auto set_account_phase = [&](const std::string& line) {
    WriteFile(dir_ + "/next", "auth required pam_permit.so\naccount required pam_exec.so " + dir_ +
                                  "/look\naccount required " + line + "\n");
    ASSERT_EQ(rename((dir_ + "/next").c_str(), (dir_ + "/pam/watched").c_str()), 0);
  };
  MakeFolder("pam");
  set_account_phase("pam_permit.so");
  Server ann = StartWithLogins("pam_service = \"watched\"\naccount_check_seconds = 1\n");
  Server bob = ann;
  ASSERT_TRUE(bob.LogIn(kBob, ""));
  const auto looked_again_at = [&](const std::string& user) {
    const auto count = [&] {
      std::istringstream lines(ReadFile(looks));
      return std::count(std::istream_iterator<std::string>(lines), {}, user);
    };
    // Of two looks the second begins after the first was acted on.
    const auto before = count();
    return Eventually([&] { return count() >= before + 2; });
  };
  const struct {
    const char* account_phase;
    const char* password;
    int status;
    const char* why;
  } rows[] = {
      {"pam_debug.so acct=authinfo_unavail", "as it is", 200, "a directory that does not answer"},
      {"pam_permit.so", "another.", 401, "another password"},
      {"pam_permit.so", "!another", 401, "locked"},
      {"pam_succeed_if.so quiet user != nobody", "!another", 401, "closed for her alone"},
  };
  for (const auto& row : rows) {
    set_account_phase("pam_permit.so");
    ASSERT_TRUE(ann.LogIn(kAnn, "")) << row.why;
    set_password(row.password);
    set_account_phase(row.account_phase);
    if (row.status == 401) {
      EXPECT_TRUE(Eventually([&] { return ann.Get("/session").status == 401; })) << row.why;
    } else {
      EXPECT_TRUE(looked_again_at(kAnn));
      EXPECT_EQ(ann.Get("/session").status, 200) << row.why;
    }
  }
  EXPECT_TRUE(looked_again_at(kBob));
  EXPECT_EQ(bob.Get("/session").status, 200) << "nothing of his has changed";
  EXPECT_NE(bob.Get("/metrics").body.find("\narbory_sessions_ended_total 4\n"), std::string::npos);
  EXPECT_NE(Log().find("\"sessions_ended\":1,"), std::string::npos) << Log();
}

TEST_F(LoginTest, NobodyTakesAllCallsFromTheOthers) {
  SKIP_UNLESS_ROOT();
  Server ann = StartWithLogins("max_calls = 3\n", kMisbehaving);
  Server bob = ann;
  ASSERT_TRUE(ann.LogIn(kAnn, "right"));
  ASSERT_TRUE(bob.LogIn(kBob, "right"));
  const auto sleep = [](const Server& user) {
    auto client = std::make_unique<Client>(user.port);
    client->Send(user.RequestText("POST", "/api/Test/1/sleep", R"({"ms":4000})",
                                  "Content-Type: application/json\r\n"));
    return client;
  };
  const auto running = [&](int count) {
    return Eventually([&] { return ann.Counts("arbory_running_calls " + std::to_string(count)); });
  };
  const auto first = sleep(ann);
  const auto second = sleep(ann);
  ASSERT_TRUE(running(2));
  EXPECT_EQ(ann.Get("/shares").status, 503) << "ann has her half";
  EXPECT_EQ(bob.Get("/shares").status, 200);
  ASSERT_TRUE(running(2));
  const auto third = sleep(bob);
  ASSERT_TRUE(running(3));
  EXPECT_EQ(bob.Get("/shares").status, 503) << "bob has less than his, but that is all there is";
}

// What a user may have written, a child reads in which nothing leads back to root.
TEST_F(LoginTest, ADownloadsChildIsItsUserForGood) {
  SKIP_UNLESS_ROOT();
  WriteFile(share_ + "/large", std::string(8 << 20, 'x'));
  Server ann = StartWithLogins();
  ASSERT_TRUE(ann.LogIn(kAnn, "right"));
  Client client(ann.port);
  ASSERT_TRUE(client.Send(ann.RequestText("GET", "/files/photo/large", "", "")));
  const std::string server = std::to_string(ann.pid);
  const passwd* account = getpwnam(kAnn);
  const std::string uid = "\t" + std::to_string(account->pw_uid);
  EXPECT_TRUE(Eventually([&] {
    const std::string child = ReadFile("/proc/" + server + "/task/" + server + "/children");
    const std::string status = ReadFile("/proc/" + child.substr(0, child.find(' ')) + "/status");
    return status.find("Uid:" + uid + uid + uid + uid + "\n") != std::string::npos;
  }));
}

TEST_F(LoginTest, EachUserSeesTheirOwn) {
  SKIP_UNLESS_ROOT();
  WriteFile(share_ + "/ann.txt", "ann's");
  GiveTo(share_ + "/ann.txt", kAnn, 0600);
  WriteFile(share_ + "/all.txt", "all's");
  GiveTo(MakeFolder("volume1/bobs"), kBob, 0700);
  WriteFile(MakeFolder("volume1/homes/nobody") + "/diary.txt", "secret");
  GiveTo(dir_ + "/volume1/homes/nobody", kAnn, 0700);
  chmod((dir_ + "/volume1/homes").c_str(), 0711);
  Server ann = StartWithLogins();
  Server bob = ann;
  ASSERT_TRUE(ann.LogIn(kAnn, "right"));
  ASSERT_TRUE(bob.LogIn(kBob, "right"));

  const auto names = [](const Json::Value& shares) {
    std::string text;
    for (const Json::Value& share : shares["shares"]) text += share["name"].asString() + " ";
    return text + (shares["homes"].asBool() ? "+home" : "");
  };
  EXPECT_EQ(names(ann.Get("/shares").json()), "photo +home");
  EXPECT_EQ(names(bob.Get("/shares").json()), "bobs photo ");

  EXPECT_EQ(ann.Get("/files/photo/ann.txt").body, "ann's");
  EXPECT_EQ(bob.Get("/files/photo/ann.txt").status, 403);
  EXPECT_EQ(bob.Get("/files/photo/all.txt").body, "all's");
  EXPECT_EQ(ann.Get("/files/home/diary.txt").body, "secret");
  EXPECT_EQ(bob.Get("/files/home/diary.txt").status, 404);
  EXPECT_EQ(bob.Get("/files/homes/nobody/diary.txt").status, 403);

  const Reply started = ann.Call("start", R"({"folder_path":"/photo","pattern":"ann"})");
  const std::string task = started.json()["data"]["taskid"].asString();
  EXPECT_TRUE(Eventually([&] { return ann.Get("/searches/" + task).json()["finished"] == true; }));
  EXPECT_EQ(bob.Get("/searches/" + task).status, 404);
  const std::string list = "{\"taskid\":\"" + task + "\"}";
  EXPECT_EQ(ann.Call("list", list).json()["data"]["total"], 1);
  EXPECT_FALSE(bob.Call("list", list).json()["data"].isMember("total"));
  bob.Call("clean", list);
  EXPECT_EQ(ann.Call("list", list).json()["data"]["total"], 1) << "bob cleaned ann's search";
  EXPECT_EQ(Stop(ann), 0);
}

}  // namespace
}  // namespace server_test
