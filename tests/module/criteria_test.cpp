// Criteria and the set-up of the walk.

#include <gtest/gtest.h>

#include "search/find_handler.h"
#include "search/owned_list.h"
#include "search/search_state.h"
#include "tests/module/scripted_platform.h"

namespace {

const char kMax[] = "9223372036854775807";

TEST(Criteria, BecomeComparatorsInTheirOrder) {
  const std::string everything =
      R"({"owner":"bob","group":"staff","size_from":1024,"size_to":)" + std::string(kMax) +
      R"(,"mtime_from":1,"crtime_from":2,"atime_from":3,"mtime_to":4294967296,"crtime_to":2147483648,)" +
      R"("atime_to":4,"filetype":"image","pattern":"*.c a","extension":"c,h"})";
  const struct {
    const char* why;
    std::string params;
    const char* refuse;  // a field that the factory refuses
    const char* comps;   // as the walker gets them
    std::string criteria;
    bool ok;
  } rows[] = {
      {"every one; times narrowed, copies not", everything, "",
       "[field 3 null,bob; field 4 null,staff; size greater 1024; size less 9223372036854775807; "
       "mtime after 1; crtime after 2; atime after 3; mtime before 0; crtime before -2147483648; "
       "atime before 4; field 1 image,null; field 0 null,*.c a; field 2 null,c,h]",
       R"({"atime_from":3,"atime_to":4,"crtime_from":2,"crtime_to":2147483648,"extension":"c,h",)"
       R"("filetype":"image","group":"50","mtime_from":1,"mtime_to":4294967296,"owner":"1026",)"
       R"("pattern":"*.c a","size_from":1024,"size_to":)" +
           std::string(kMax) + "}",
       true},
      {"one is enough", R"({"pattern":"x"})", "", "[field 0 null,x]", R"({"pattern":"x"})", true},
      {"none is refused", R"({"recursive":true,"folder_path":"/x"})", "", "[]", "null", false},
      {"an unknown owner alone is none", R"({"owner":"eve"})", "", "[]", "null", false},
      {"an unknown group is dropped", R"({"group":"eve","size_to":5})", "", "[size less 5]",
       R"({"size_to":5})", true},
      {"bounds are not compared", R"({"size_from":9,"size_to":1})", "",
       "[size greater 9; size less 1]", R"({"size_from":9,"size_to":1})", true},
      {"a refusal ends it; what was made stays", everything, "createFindOp 1",
       "[field 3 null,bob; field 4 null,staff; size greater 1024; size less 9223372036854775807; "
       "mtime after 1; crtime after 2; atime after 3; mtime before 0; crtime before -2147483648; "
       "atime before 4]",
       R"({"atime_from":3,"atime_to":4,"crtime_from":2,"crtime_to":2147483648,)"
       R"("filetype":"image","group":"50","mtime_from":1,"mtime_to":4294967296,"owner":"1026",)"
       R"("size_from":1024,"size_to":)" +
           std::string(kMax) + "}",
       false},
      {"a refused owner: the group is not read", everything, "createFindOp 3", "[]",
       R"({"owner":"1026"})", false},
      {"a refused extension", R"({"pattern":"x","extension":"c"})", "createFindOp 2",
       "[field 0 null,x]", R"({"extension":"c","pattern":"x"})", false},
  };
  for (const auto& row : rows) {
    Script play;
    play.params = Parse(row.params);
    play.accounts = {{"bob", 1026}, {"staff", 50}};
    play.fail = {row.refuse};
    const Trace trace = Play(play, [] {
      ArboryFindHandler handler(Request(), Response());
      OwnedList<FileSearch::FindComp> comps;
      Json::Value criteria;
      Note(handler.CreateFindOp(comps.items(), criteria) ? "made" : "refused");
      Note("criteria " + Text(criteria));
      int flag = 0;
      FileSearch::WfmSearchWalker("", "", nullptr, &flag).init({}, comps.items());
    });
    EXPECT_EQ(Keep(trace, {"made", "refused", "criteria", "Walker.init"}),
              (Trace{row.ok ? "made" : "refused", "criteria " + row.criteria,
                     std::string("Walker.init(") + row.comps + ")"}))
        << row.why;
    const bool group_read = Keep(trace, {"NUVAGroupGet(staff)"}).size() == 1;
    EXPECT_EQ(Keep(trace, {"NUVAGroupFree"}).size(), group_read ? 1U : 0U) << row.why;
    EXPECT_EQ(Keep(trace, {"NUVAUserFree"}).size(), Keep(trace, {"NUVAUserGet(bob)"}).size());
  }
}

TEST(Walk, IsSetUpFromTheRequest) {
  const std::string everywhere = "Walker.current(false); ";
  const std::string set_data = R"(Task.set(data,{"kept":1,"sdbid":"db1","sdbvol":"/volume1"}))";
  const std::string walk = R"(; Walk([]{"recursive":true,"search_content":true}))";
  const std::tuple<const char*, const char*, const char*, std::string> rows[] = {
      {"defaults", "{}", "", everywhere + set_data + walk + "; true"},
      {"not recursive, times narrowed, after first",
       R"({"recursive":false,"search_content":false,"atime_to":4294967299,"atime_from":2})", "",
       "Walker.current(true); " + set_data +
           R"(; Walk([atime after 2; atime before 3]{"recursive":false,"search_content":false}); )"
           "true"},
      {"typed names go into the task", R"({"owner":"eve","pattern":5,"extension":"c","group":""})",
       "",
       everywhere +
           R"(Task.set(data,{"extension":"c","group":"","kept":1,"owner":"eve",)"
           R"("pattern":5,"sdbid":"db1","sdbvol":"/volume1"}))" +
           walk + "; true"},
      {"no database", "{}", "Walker.init", "false"},
      {"no record", "{}", "the record", everywhere + "log S:100 Failed to get json data; false"},
      {"record not written", R"({"atime_to":1})", "Task.set",
       everywhere + set_data + "; log S:119 Failed to write progress.; false"},
      {"the walk fails", "{}", "Walk", everywhere + set_data + walk + "; false"},
  };
  for (const auto& [why, params, fail, expected] : rows) {
    Script play;
    play.params = Parse(params);
    play.fail = {fail};
    if (!play.fail.contains("the record")) play.properties["data"]["kept"] = 1;
    const Trace trace = Play(play, [] {
      pTask = new OKT::Task("ann", nullptr);
      Json::Value options;
      ArboryFindHandler handler(Request(), Response());
      Note(handler.Recursive_Find({"/a"}, {}, options) ? "true" : "false");
    });
    EXPECT_EQ(Told(trace, {"Walker.current", "Task.set", "Walk(", "log", "true", "false"}),
              expected)
        << why;
    EXPECT_EQ(Keep(trace, {"~Walker"}).size(), 1U) << why;
  }
}

}  // namespace
