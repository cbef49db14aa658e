#include "tests/fleet/fleet_test.h"

#include <pwd.h>

#include <cstdlib>

#include "nas/base/random_name.h"
#include "nas/fleet/library.h"

namespace fleet_test {

using nas_test::AmRoot;

void FleetTest::SetUp() {
  ServerTest::SetUp();
  std::string unused;
  nas::LoadFleetLibrary().make_key(&secret_key_, &public_key_);
  nas::LoadFleetLibrary().make_key(&other_key_, &unused);
}

Box FleetTest::StartBox(const std::string& name, const std::string& more,
                        const std::string& of_front) {
  Box box;
  box.name = name;
  box.share = MakeFolder(name + "-data");
  root_state_ = dir_ + "/" + name + "-root-state";
  state_ = MakeFolder(name + "-state");
  share_lines_ = "[shares]\ndata = \"" + box.share + "\"\n";
  const std::string lines = PamLines() + "[fleet]\nname = \"" + name + "\"\n" + more +
                            "[fleet.fronts.office]\nkey = \"" + nas::ToHex(public_key_) +
                            "\"\nrealm = \"OFFICE\"\nusers = [\"" + User() + "\", \"" + kBob +
                            "\", \"root\"]\n" + of_front;
  const bool odd = (name.back() - '0') % 2 != 0;
  box.server = StartOf(odd ? std::getenv(kOtherBoxes) : nullptr, lines);
  return box;
}

Server FleetTest::StartOf(const char* other_bin_dir, const std::string& lines) {
  if (other_bin_dir != nullptr) program_ = std::string(other_bin_dir) + "/arbory";
  Server server = Start(lines, "", AmRoot() ? As::kRootWithLogins : As::kOrdinaryUser);
  program_ = ARBORY_BIN_DIR "/arbory";
  return server;
}

std::string FleetTest::PamLines() {
  const std::string check = dir_ + "/check";
  nas_test::WriteFile(check, "#!/bin/sh\nread -r given || :\n[ \"$given\" = right ]\n");
  chmod(check.c_str(), 0755);
  nas_test::WriteFile(MakeFolder("pam") + "/arbory",
                      "auth required pam_exec.so quiet expose_authtok " + check +
                          "\naccount required pam_permit.so\n");
  return "pam_dir = \"" + dir_ + "/pam\"\n";
}

void FleetTest::MakeFile(const Box& box, const std::string& path, const std::string& user,
                         const std::string& text) {
  const std::string file = box.share + "/" + path;
  std::filesystem::create_directories(std::filesystem::path(file).parent_path());
  nas_test::WriteFile(file, text);
  if (user.empty()) return;
  const passwd* account = getpwnam(user.c_str());
  ASSERT_EQ(chown(file.c_str(), account->pw_uid, account->pw_gid), 0);
  ASSERT_EQ(chmod(file.c_str(), 0600), 0);
}

nas::FleetToken FleetTest::TokenFor(const Box& box, const std::string& user,
                                    const std::string& method, const std::string& target,
                                    const std::string& body) const {
  return {"office",      user + "@OFFICE", box.name, nas::RequestHash(method, target, body),
          time(nullptr), nas::RandomName()};
}

Reply FleetTest::AskWith(const Box& box, const std::string& token, const std::string& method,
                         const std::string& target, const std::string& body) {
  std::string fields = "Content-Type: application/json\r\n";
  if (!token.empty()) fields += "Authorization: Arbory-Fleet " + token + "\r\n";
  return box.server.Ask(method, target, body, fields);
}

Reply FleetTest::Ask(const Box& box, const std::string& user, const std::string& method,
                     const std::string& target, const std::string& body) const {
  const auto token = TokenFor(box, user, method, target, body);
  return AskWith(box, nas::SignedToken(token, secret_key_), method, target, body);
}

std::string FleetTest::Question(unsigned limit, const std::string& locations,
                                const std::string& query) {
  return R"({"protocol":2,"contents":false,"recursive":true,"after":0,"wait_ms":1000,"limit":)" +
         std::to_string(limit) + ",\"locations\":" + locations + ",\"query\":" + query + "}";
}

}  // namespace fleet_test
