#include "tests/index/daemon.h"

#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/syscall.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "nas/base/json_text.h"
#include "nas/index/broker.h"
#include "nas/index/frames.h"

namespace index_test {

namespace fs = std::filesystem;

namespace {

std::string PathOf(const nas::NameTable& table, nas::NameTable::FolderId id) {
  const nas::NameTable::FolderId above = table.parent(id);
  if (above == nas::NameTable::kNoFolder) return "";
  return PathOf(table, above) + std::string(table.folder_name(id)) + "/";
}

Json::Value Describe(const nas::IndexSnapshot& snapshot) {
  Json::Value told;
  told["uid"] = getuid();
  told["gid"] = getgid();
  std::array<gid_t, 64> groups;
  const int count = getgroups(groups.size(), groups.data());
  for (int at = 0; at < count; ++at) told["groups"].append(groups[static_cast<size_t>(at)]);
  told["traceable"] = prctl(PR_GET_DUMPABLE) != 0;
  told["new_rights"] = prctl(PR_GET_NO_NEW_PRIVS, 0, 0, 0, 0) == 0;
  told["descriptors"] = static_cast<int>(nas_test::OpenDescriptors().size());
  told["attributes"] = snapshot.attributes_current;
  told["mappings"] = snapshot.mappings_known;
  told["root_again"] = setuid(0) == 0 || setresuid(-1, 0, -1) == 0 || setgid(0) == 0;
  told["changes"] = Json::arrayValue;
  for (const auto& [id, changed] : snapshot.changes.folders()) {
    const std::string folder = PathOf(snapshot.table, id);
    if (changed.whole) told["changes"].append(folder + "*");
    for (const std::string& name : changed.names) told["changes"].append(folder + name);
  }
  told["inodes"] = Json::arrayValue;
  for (const std::uint64_t inode : snapshot.changes.inodes()) {
    told["inodes"].append(Json::UInt64{inode});
  }
  return told;
}

void Answer(int connection, nas::UniqueFd /*location*/, const nas::IndexSnapshot& snapshot) {
  nas::FrameReader reader(connection, nas::kMaxQuestionBytes);
  nas::Frame frame;
  if (reader.Read(-1, &frame) != nas::FrameReader::State::kFrame) return;
  (void)nas::SendFrame(connection, nas::FrameType::kEnd,
                       nas::JsonText(Describe(snapshot), nas::JsonBytes::kClean));
}

Json::Value Ask(const nas::IndexAnswer& answer) {
  Json::Value told;
  told["state"] = answer.state;
  if (!answer.connection) return told;
  nas::FrameReader reader(answer.connection.get(), nas::kMaxAnswerBytes);
  nas::Frame frame;
  if (!nas::SendFrame(answer.connection.get(), nas::FrameType::kQuestion, "see") ||
      reader.Read(20'000, &frame) != nas::FrameReader::State::kFrame) {
    told["state"] = "broke off";
    return told;
  }
  nas::ParseJson(frame.payload, &told);
  told["state"] = answer.state;
  return told;
}

nas::UniqueFd Open(const std::string& folder) {
  return nas::UniqueFd(open(folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

// On a machine with much else to do an answer may be late, which a search does not wait for.
nas::IndexAnswer Patiently(const std::function<nas::IndexAnswer()>& ask) {
  nas::IndexAnswer answer;
  nas_test::Eventually([&] {
    answer = ask();
    return answer.state != "busy";
  });
  return answer;
}

}  // namespace

Json::Value See(const std::string& folder, bool asks_times) {
  return Ask(Patiently([&] { return nas::AskIndex(Open(folder).get(), asks_times); }));
}

nas::IndexAnswer Hold(const std::string& folder) {
  return nas::AskIndex(Open(folder).get(), false);
}

Json::Value Report() {
  Json::Value report;
  const auto text = nas::AskDaemon(nas::HelloKind::kReport);
  if (text) nas::ParseJson(*text, &report);
  return report;
}

std::vector<std::string> Differences(const std::string& folder) {
  const nas::IndexAnswer answer = Patiently([&] { return nas::AskToCheck(Open(folder).get()); });
  if (!answer.connection) return {"state: " + answer.state};
  std::vector<std::string> told;
  nas::FrameReader reader(answer.connection.get(), nas::kMaxAnswerBytes);
  nas::Frame frame;
  while (reader.Read(20'000, &frame) == nas::FrameReader::State::kFrame) {
    if (frame.type == nas::FrameType::kEnd) return told;
    told.push_back(frame.payload);
  }
  told.emplace_back("broke off");
  return told;
}

std::vector<std::string> Texts(const Json::Value& list) {
  std::vector<std::string> texts;
  for (const Json::Value& item : list) texts.push_back(item.asString());
  std::ranges::sort(texts);
  return texts;
}

bool Tells(const Json::Value& list, const std::string& path) {
  struct stat status = {};
  if (lstat(path.c_str(), &status) != 0) return false;
  return std::ranges::any_of(
      list, [&](const Json::Value& item) { return item.asUInt64() == status.st_ino; });
}

void MakeTree(const std::string& tree) {
  fs::create_directories(tree + "/a/b");
  fs::create_directories(tree + "/c");
  for (const char* file : {"/a/one", "/a/b/two", "/c/three"})
    nas_test::WriteFile(tree + file, "text");
}

void DaemonTest::SetUp() {
  PlatformTest::SetUp();
  tree_ = MakeFolder("tree");
  ConfigureIndex();
}

void DaemonTest::TearDown() {
  if (daemon_ >= 0) StopDaemon();
  for (const std::string& path : mounted_) umount2(path.c_str(), MNT_DETACH);
  PlatformTest::TearDown();
}

void DaemonTest::ConfigureIndex(const nas::IndexSettings& settings) {
  nas::Config config;
  config.state_dir = state_;
  config.volumes = {dir_ + "/volume*"};
  config.shares = {{"tree", tree_}};
  config.index = settings;
  config.index.socket = state_ + "/index.sock";  // and nowhere else
  nas::Configure(config);
}

bool DaemonTest::CanWatchFileSystems() const {
  if (!nas_test::AmRoot()) return false;
  const nas::UniqueFd queue(
      syscall(SYS_fanotify_init, 0x200 | 0x400 | 0x800, O_RDONLY | O_CLOEXEC));
  return static_cast<bool>(queue);
}

void DaemonTest::MountTree(const std::string& type) {
  if (type == "tmpfs") {
    ASSERT_EQ(mount("none", tree_.c_str(), "tmpfs", 0, "mode=755"), 0) << strerror(errno);
    mounted_.push_back(tree_);
    return;
  }
  const std::string image = dir_ + "/image";
  const std::string make = "truncate -s 64M " + image + " && mkfs." + type + " -q " + image;
  ASSERT_EQ(std::system(make.c_str()), 0);
  MountImage(image);
}

void DaemonTest::MountImage(const std::string& image) {
  ASSERT_EQ(std::system(("mount -o loop " + image + " " + tree_).c_str()), 0);
  mounted_.push_back(tree_);
}

void DaemonTest::StartDaemon(const std::function<void()>& begun) {
  std::array<int, 2> ends;
  ASSERT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
  daemon_ = fork();
  if (daemon_ == 0) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    const nas::Status ended = nas::RunIndexDaemon(Answer, [&] {
      begun();
      EXPECT_EQ(write(ends[1], "r", 1), 1);
    });
    _exit(ended ? EXIT_SUCCESS : EXIT_FAILURE);
  }
  close(ends[1]);
  char ready = 0;
  EXPECT_EQ(read(ends[0], &ready, 1), 1) << "the daemon did not start";
  close(ends[0]);
}

bool DaemonTest::StopDaemon(int signal_number) {
  kill(daemon_, signal_number);
  int status = -1;
  waitpid(std::exchange(daemon_, -1), &status, 0);
  return WIFEXITED(status) && WEXITSTATUS(status) == EXIT_SUCCESS;
}

bool DaemonTest::Current() {
  return nas_test::Eventually([] { return Report()["current"].asBool(); });
}

bool DaemonTest::StateIs(const std::string& state) {
  const Json::Value report = Report();
  return report["file_systems"].size() == 1 && report["file_systems"][0]["state"] == state;
}

}  // namespace index_test
