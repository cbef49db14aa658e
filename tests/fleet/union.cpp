#include "tests/fleet/union.h"

#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>

namespace fleet_test {
namespace {

using nas_test::AmRoot;

constexpr const char* kPatterns[] = {"invoice",  "*.pdf",   "1",          "photo ext:txt",
                                     "size:>20", "nothing", "owner:root", ""};
constexpr const char* kColumns[] = {"name", "size", "path", "type", "user"};
constexpr int kFolders = 6;

std::string FolderName(int number) { return "folder " + std::to_string(number); }

}  // namespace

void UnionTest::SetUp() {
  ProxiedTest::SetUp();
  users_ = AmRoot() ? std::vector<std::string>{kAnn, kBob} : std::vector<std::string>{User()};
}

void UnionTest::MakeTree(const Box& box, int files) {
  for (int i = 0; i < files; ++i) {
    const std::string name = std::string(Below(2) == 0 ? "Invoice " : "photo ") +
                             std::to_string(Below(400)) + (Below(2) == 0 ? ".txt" : ".PDF");
    MakeFile(box, FolderName(Below(kFolders)) + "/" + name, "",
             std::string(static_cast<size_t>(Below(50)), 'x'));
  }
  if (!AmRoot()) return;
  for (int i = 0; i < kFolders; ++i) {
    const std::string folder = box.share + "/" + FolderName(i);
    const passwd* owner = getpwnam(users_[static_cast<size_t>(Below(2))].c_str());
    if (chown(folder.c_str(), owner->pw_uid, 0) == 0) {
      EXPECT_EQ(chmod(folder.c_str(), Below(2) == 0 ? 0700 : 0755), 0);
    }
  }
}

void UnionTest::ChangeTree(const Box& box) {
  namespace fs = std::filesystem;
  std::vector<fs::path> files;
  for (const auto& entry : fs::recursive_directory_iterator(box.share)) {
    if (entry.is_regular_file()) files.push_back(entry.path());
  }
  std::ranges::sort(files);
  for (int i = 0; i < 3 && files.size() > 3; ++i) {
    const auto one = files.begin() + Below(static_cast<int>(files.size()));
    const fs::path moved = fs::path(box.share) / FolderName(Below(kFolders)) / one->filename();
    if (Below(2) == 0) {
      fs::remove(*one);
    } else if (fs::exists(moved.parent_path())) {
      fs::rename(*one, moved);
    }
    files.erase(one);
  }
  MakeFile(box, FolderName(Below(kFolders)) + "/photo " + std::to_string(Below(400)) + ".txt");
  const std::string folder = box.share + "/" + FolderName(Below(kFolders));
  if (!AmRoot() || !fs::exists(folder)) return;
  EXPECT_EQ(chmod(folder.c_str(), Below(2) == 0 ? 0700 : 0755), 0);
}

std::string UnionTest::RandomPattern() { return kPatterns[Below(std::size(kPatterns))]; }

Json::Value UnionTest::RandomListing() {
  Json::Value listing;
  listing["sort_by"] = kColumns[Below(std::size(kColumns))];
  listing["sort_direction"] = Below(2) == 0 ? "ASC" : "DESC";
  listing["limit"] = Below(2) == 0 ? 100 : 7;
  listing["additional"] = "size,owner";
  return listing;
}

std::vector<Listed> UnionTest::AskBox(const Server& session, const Box& box, Json::Value params) {
  params["folder_path"] = Json::Value(Json::arrayValue);
  params["folder_path"].append("/data");
  Search(session, params);
  std::vector<Listed> told = List(session, Json::Value(Json::objectValue));
  for (Listed& file : told) file.path = "/" + box.name + file.path;
  return told;
}

std::set<std::string> UnionTest::Visible(const Box& box, const std::string& user) {
  int ends[2];
  EXPECT_EQ(pipe(ends), 0);
  const pid_t pid = fork();
  if (pid == 0) {
    namespace fs = std::filesystem;
    const passwd* account = getpwnam(user.c_str());
    const bool is = !AmRoot() || (initgroups(user.c_str(), account->pw_gid) == 0 &&
                                  setgid(account->pw_gid) == 0 && setuid(account->pw_uid) == 0);
    std::string text;
    const auto options = fs::directory_options::skip_permission_denied;
    for (const auto& entry : fs::recursive_directory_iterator(box.share, options)) {
      text += "/" + box.name + "/data" + entry.path().string().substr(box.share.size()) + "\n";
    }
    for (size_t done = 0; is && done < text.size();) {
      const ssize_t count = write(ends[1], text.data() + done, text.size() - done);
      if (count <= 0) break;
      done += static_cast<size_t>(count);
    }
    _exit(0);
  }
  close(ends[1]);
  std::set<std::string> paths;
  FILE* const out = fdopen(ends[0], "r");
  for (char line[4096]; fgets(line, sizeof line, out) != nullptr;) {
    paths.insert(std::string(line, strcspn(line, "\n")));
  }
  fclose(out);
  waitpid(pid, nullptr, 0);
  return paths;
}

void UnionTest::CheckPage(const std::vector<Listed>& page, const std::vector<Listed>& all,
                          const Json::Value& listing) {
  const std::string column = listing["sort_by"].asString();
  std::vector<std::string> keys = KeysOf(all, column);
  std::ranges::sort(keys);
  if (listing["sort_direction"] == "DESC") std::ranges::reverse(keys);
  const size_t from = std::min<size_t>(keys.size(), listing["offset"].asUInt());
  const size_t count = std::min<size_t>(keys.size() - from, listing["limit"].asUInt());
  const auto begin = keys.begin() + static_cast<std::ptrdiff_t>(from);
  keys = {begin, begin + static_cast<std::ptrdiff_t>(count)};
  EXPECT_EQ(KeysOf(page, column), keys);
  const std::set<Listed> known(all.begin(), all.end());
  const std::set<Listed> told(page.begin(), page.end());
  EXPECT_EQ(told.size(), page.size()) << "a row came twice";
  EXPECT_TRUE(std::ranges::includes(known, told)) << "a row that no box tells";
}

std::vector<Listed> UnionTest::Begin(const Server& front, Json::Value params,
                                     const Json::Value& listing) {
  params["list"] = listing;
  const Json::Value begun = front.Post("/searches", Text(params)).json();
  task_ = begun["taskid"].asString();
  EXPECT_TRUE(begun["page"].isObject()) << Text(begun);
  Json::Value page = begun["page"];
  EXPECT_TRUE(nas_test::Eventually([&] {
    if (page["finished"].asBool() || !page["files"].empty()) return true;
    Json::Value again = listing;
    again["taskid"] = task_;
    page = front.Call("list", Text(again)).json()["data"];
    return false;
  }));
  return FilesOf(page["files"]);
}

}  // namespace fleet_test
