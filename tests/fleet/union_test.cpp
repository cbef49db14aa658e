// That a fleet's answer is the sorted union of what its boxes tell the same user: random trees and
// rights, queries, columns, users and pages; and that what is missing of it, whatever happens to
// boxes, is said to be.

#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <utility>

#include "tests/fleet/union.h"

namespace fleet_test {
namespace {

using nas_test::AmRoot;

TEST_F(UnionTest, TellsTheSortedUnionOfWhatEachBoxTells) {
  std::vector<Box> boxes;
  for (const int files : {300, 120, 120, 40, 5}) {
    boxes.push_back(StartBox("box" + std::to_string(boxes.size() + 1)));
    MakeTree(boxes.back(), files);
  }
  constexpr int kPatience = 40'000;
  const std::string direct = "deadline_ms = " + std::to_string(kPatience) + "\n";
  const Server front = StartFront(boxes, kInOrder + (HaveProxy() ? Settings(kPatience) : direct));
  if (HaveProxy()) StartProxy();
  std::map<std::string, std::vector<Server>> sessions;  // of each user, at the boxes and the front
  for (const std::string& user : users_) {
    for (const Box& box : boxes) sessions[user].push_back(LoggedIn(box.server, user));
    sessions[user].push_back(LoggedIn(front, user));
  }
  std::set<size_t> seen;  // how many rows different users were told
  for (int round = 0; round < 16; ++round) {
    const std::string& user = users_[static_cast<size_t>(round) % users_.size()];
    const Server& person = sessions[user].back();
    Json::Value params;
    params["pattern"] = RandomPattern();
    const size_t asked = Below(3) == 0 ? 1 : boxes.size();
    for (size_t i = 0; i < asked; ++i) {
      params["folder_path"].append("/" + boxes[i].name + "/data");
    }
    SCOPED_TRACE(user + " " + Text(params));
    std::vector<Listed> wanted;
    for (size_t i = 0; i < asked; ++i) {
      for (const Listed& file : AskBox(sessions[user][i], boxes[i], params)) wanted.push_back(file);
    }
    seen.insert(wanted.size());

    Json::Value listing = RandomListing();
    SCOPED_TRACE(Text(listing));
    CheckPage(Begin(person, params, listing), wanted, listing);

    Search(person, params);
    EXPECT_EQ(status_["progress"], 1);
    EXPECT_EQ(status_["walk"]["fleet"]["total"].asUInt(), asked);
    EXPECT_EQ(status_["walk"]["fleet"]["answered"].asUInt(), asked);
    listing["offset"] = Below(100);
    CheckPage(List(person, listing), wanted, listing);
    EXPECT_EQ(total_, wanted.size());
  }
  EXPECT_GT(seen.size(), 4U) << "the searches hardly differ";
}

// What may happen to a box.
enum class Mishap {
  kNone,
  kFrozen,
  kKilled,
  kKilledMeanwhile,
  kRestarted,
  kClock,
  kClockFar,
  kOld
};
constexpr const char* kMishaps[] = {"none",      "frozen", "killed",    "killed meanwhile",
                                    "restarted", "clock",  "clock far", "old"};
constexpr char kFakeTime[] = "/usr/lib/x86_64-linux-gnu/faketime/libfaketime.so.1";

class MishapTest : public UnionTest {
 protected:
  void SetUp() override {
    UnionTest::SetUp();
    if (!HaveProxy()) GTEST_SKIP() << "haproxy is not installed";
    // Sanitizers do not like what is loaded before them.
    can_shift_ = nas_test::kMemoryIsBounded && access(kFakeTime, R_OK) == 0;
    if (!can_shift_) std::fprintf(stderr, "clocks are not shifted: faketime is not installed\n");
  }

  // One box as it goes through its mishaps.
  struct Member {
    Box box;
    Mishap mishap = Mishap::kNone;
    std::map<std::string, Server> sessions;  // by user
    std::vector<Listed> told;                // of one question, by itself
  };

  void Start(Member& member, int clock_offset = 0) {
    if (clock_offset != 0) {
      setenv("LD_PRELOAD", kFakeTime, 1);
      const std::string sign = clock_offset > 0 ? "+" : "";
      setenv("FAKETIME", (sign + std::to_string(clock_offset) + "s").c_str(), 1);
      setenv("FAKETIME_DONT_FAKE_MONOTONIC", "1", 1);
    }
    member.box = StartBox(member.box.name);
    for (const char* name : {"LD_PRELOAD", "FAKETIME", "FAKETIME_DONT_FAKE_MONOTONIC"}) {
      unsetenv(name);
    }
    member.sessions.clear();
    for (const std::string& user : users_)
      member.sessions[user] = LoggedIn(member.box.server, user);
  }
  // Without the settings of a fleet.
  void StartOld(Member& member) {
    root_state_ = dir_ + "/" + member.box.name + "-root-state";
    state_ = dir_ + "/" + member.box.name + "-state";
    share_lines_ = "[shares]\ndata = \"" + member.box.share + "\"\n";
    member.box.server =
        ServerTest::Start("", "", AmRoot() ? As::kRootWithLogins : As::kOrdinaryUser);
  }
  void Kill(Member& member) {
    kill(member.box.server.pid, SIGKILL);
    Stop(member.box.server);
  }
  // Tells the proxy where the boxes are now, and waits until it has seen them.
  void Announce() {
    std::vector<Box> boxes;
    for (const Member& member : members_) boxes.push_back(member.box);
    WriteFleetFile(boxes, kInOrder + Settings());
    ReloadProxy();
    for (const Member& member : members_) {
      if (member.mishap == Mishap::kFrozen || member.mishap == Mishap::kKilled) continue;
      const std::string ask = "curl -sf --unix-socket " + dir_ + "/proxy.sock http://" +
                              member.box.name + "/health >/dev/null";
      EXPECT_TRUE(nas_test::Eventually([&] { return std::system(ask.c_str()) == 0; })) << ask;
    }
  }

  Mishap RandomMishap() {
    const auto mishap = static_cast<Mishap>(Below(std::size(kMishaps)));
    const bool shifts = mishap == Mishap::kClock || mishap == Mishap::kClockFar;
    return shifts && !can_shift_ ? Mishap::kOld : mishap;
  }
  // Before the search. True where the box has to be announced.
  bool Begins(Member& member) {
    switch (member.mishap) {
      case Mishap::kFrozen:
        kill(member.box.server.pid, SIGSTOP);
        return false;
      case Mishap::kKilled:
        Kill(member);
        return false;
      case Mishap::kRestarted:
      case Mishap::kClock:
      case Mishap::kClockFar:
      case Mishap::kOld:
        Kill(member);
        if (member.mishap == Mishap::kOld) {
          StartOld(member);
        } else {
          constexpr int kNear = 200;
          constexpr int kFar = 900;
          Start(member, member.mishap == Mishap::kClock      ? kNear
                        : member.mishap == Mishap::kClockFar ? -kFar
                                                             : 0);
        }
        return true;
      default:
        return false;
    }
  }
  // As it was. True where the box has to be announced.
  bool Ends(Member& member) {
    switch (std::exchange(member.mishap, Mishap::kNone)) {
      case Mishap::kNone:
      case Mishap::kRestarted:
        return false;
      case Mishap::kFrozen:
        kill(member.box.server.pid, SIGCONT);
        return false;
      case Mishap::kKilled:
      case Mishap::kKilledMeanwhile:
        Start(member);
        return true;
      default:
        Kill(member);
        Start(member);
        return true;
    }
  }

  // What a search through the front has told of all boxes.
  void CheckAnswer(const std::vector<Listed>& listed);

  bool can_shift_ = false;
  std::vector<Member> members_;
  int unanswered_ = 0;
};

void MishapTest::CheckAnswer(const std::vector<Listed>& listed) {
  std::map<std::string, std::string> states;
  const Json::Value& fleet = status_["walk"]["fleet"];
  for (const Json::Value& box : fleet["boxes"]) {
    states[box["name"].asString()] = box["state"].asString();
  }
  EXPECT_EQ(fleet["total"].asUInt(), members_.size());
  EXPECT_EQ(fleet["answered"].asUInt() + states.size(), members_.size()) << Text(fleet);
  const std::set<Listed> told(listed.begin(), listed.end());
  EXPECT_EQ(told.size(), listed.size()) << "a row came twice";
  std::set<Listed> known;
  for (const Member& member : members_) {
    SCOPED_TRACE(member.box.name + " " + kMishaps[static_cast<int>(member.mishap)]);
    known.insert(member.told.begin(), member.told.end());
    const auto state = states.find(member.box.name);
    if (state == states.end()) {
      for (const Listed& file : member.told) {
        EXPECT_TRUE(told.contains(file)) << file.path << " is missing without a word";
      }
      continue;
    }
    ++unanswered_;
    switch (member.mishap) {
      case Mishap::kNone:
      case Mishap::kClock:
        ADD_FAILURE() << state->second << ": " << Text(fleet);
        break;
      case Mishap::kOld:
        EXPECT_EQ(state->second, "old");
        break;
      case Mishap::kClockFar:
        EXPECT_EQ(state->second, "refused");
        break;
      default:
        break;
    }
  }
  for (const Listed& file : told) {
    EXPECT_TRUE(known.contains(file)) << file.path << " was told by no box";
  }
}

TEST_F(MishapTest, WhatABoxDoesNotTellIsSaidToBeMissing) {
  for (const int files : {120, 60, 60, 20, 5}) {
    members_.emplace_back().box.name = "box" + std::to_string(members_.size());
    Start(members_.back());
    MakeTree(members_.back().box, files);
  }
  for (const size_t indexed : {0, 3}) StartIndex(members_[indexed].box);
  std::vector<Box> boxes;
  for (const Member& member : members_) boxes.push_back(member.box);
  const Server front = StartFront(boxes, kInOrder + Settings());
  std::map<std::string, Server> sessions;
  for (const std::string& user : users_) sessions[user] = LoggedIn(front, user);
  StartProxy();
  constexpr int kRounds = 10;
  for (int round = 0; round < kRounds; ++round) {
    const std::string& user = users_[static_cast<size_t>(round) % users_.size()];
    Json::Value params;
    params["pattern"] = RandomPattern();
    for (const Member& member : members_) {
      params["folder_path"].append("/" + member.box.name + "/data");
    }
    SCOPED_TRACE("round " + std::to_string(round) + ", " + user + " " + Text(params));
    bool announce = false;
    for (Member& member : members_) {
      ChangeTree(member.box);
      member.told = AskBox(member.sessions.at(user), member.box, params);
      const std::set<std::string> visible = Visible(member.box, user);
      for (const Listed& file : member.told) {
        EXPECT_TRUE(visible.contains(file.path)) << file.path << " is out of the user's reach";
      }
    }
    for (int i = 0; i < 2; ++i) members_[static_cast<size_t>(Below(5))].mishap = RandomMishap();
    for (Member& member : members_) announce = Begins(member) || announce;
    if (announce) Announce();
    const Json::Value started = sessions[user].Call("start", Text(params)).json();
    task_ = started["data"]["taskid"].asString();
    for (Member& member : members_) {
      if (member.mishap == Mishap::kKilledMeanwhile) Kill(member);
    }
    ASSERT_TRUE(nas_test::Eventually([&] {
      status_ = sessions[user].Get("/searches/" + task_).json();
      return status_["finished"].asBool();
    })) << Text(status_);
    Json::Value listing = RandomListing();
    listing["limit"] = 100'000;
    const std::vector<Listed> listed = List(sessions[user], listing);
    CheckPage(listed, listed, listing);  // is sorted
    CheckAnswer(listed);
    announce = false;
    for (Member& member : members_) announce = Ends(member) || announce;
    if (announce) Announce();
  }
  EXPECT_GT(unanswered_, kRounds / 4) << "hardly anything went wrong";
}

}  // namespace
}  // namespace fleet_test
