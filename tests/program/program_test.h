#pragma once
// Searches from end to end: the built program and the built module over real folders, each test
// with volumes and a state directory of its own.

#include <gmock/gmock.h>
#include <json/value.h>
#include <pwd.h>

#include <string>
#include <vector>

#include "nas/webapi/runner.h"
#include "tests/nas/fixture.h"

namespace program_test {

using nas_test::Eventually;
using nas_test::InOrdinaryChild;
using nas_test::WriteFile;

struct Output {
  int exit_code = -1;
  std::string out;
  std::string err;
};

// One API call's reply.
struct Reply {
  int code = -1;
  Json::Value data;
};

class ProgramTest : public nas_test::PlatformTest {
 protected:
  void SetUp() override;

  // Runs the program to its end, at most a minute, in the folder share_.
  Output Run(const std::vector<std::string>& arguments);
  // The same in two steps.
  pid_t Launch(const std::vector<std::string>& arguments);
  Output Finish(pid_t program);

  Reply Call(const std::string& method, const Json::Value& params,
             const std::string& user = nas_test::Me());
  Reply CallHistory(const std::string& method, const Json::Value& params);

  // A search through the API; its id.
  std::string Start(const Json::Value& params, const std::string& user = nas_test::Me());
  // Everything it found, once it says that it has finished; at most half a minute.
  Reply ListToEnd(const std::string& id, const std::string& user = nas_test::Me());
  // The search's record as it is now.
  Json::Value TaskProperty(const std::string& id, const char* name,
                           const std::string& user = nas_test::Me());

  // What was written to the system log by the calls above, the program's own left out.
  std::string Logged() const;

  // Where everything that a user's searches leave behind would be.
  std::vector<std::string> Remains(const std::string& user = nas_test::Me());
  std::vector<std::string> Databases(const std::string& volume, const std::string& user);

  // A search over this text file never comes to its end: its contents are read for hours.
  void MakeEndlessFile(const std::string& path);

  std::string share_;    // dir_/volume1/share
  std::string program_;  // a copy that every user can run

 private:
  void PrepareFor(const std::string& user, const std::string& state);
  std::string OwnFolder() const;
};

Json::Value Json_(const std::string& text);
// The pieces of `text` that each end with `end`.
std::vector<std::string> Pieces(const std::string& text, char end);

}  // namespace program_test
