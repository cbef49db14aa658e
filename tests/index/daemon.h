#pragma once
// An index daemon of a test's own, and what the child that answers a question sees: the daemon's
// answer here is not a search's but a description of the process and of the snapshot it was given.

#include <json/value.h>

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "nas/index/client.h"
#include "tests/nas/fixture.h"

namespace index_test {

// Asks about `folder` as this process and returns what the child tells; {"state": WORDS} where
// there is no child.
Json::Value See(const std::string& folder, bool asks_times = false);
// Begins a question that is not answered before the connection goes.
nas::IndexAnswer Hold(const std::string& folder);
// The daemon's report; null where there is no daemon.
Json::Value Report();
// Every difference that the daemon finds of the folder's file system, or why it cannot tell.
std::vector<std::string> Differences(const std::string& folder);

// Of what See tells: the texts of a list, sorted, and whether a list of inodes has that of a path.
std::vector<std::string> Texts(const Json::Value& list);
bool Tells(const Json::Value& list, const std::string& path);
// Two folders, one in them, and a file in each.
void MakeTree(const std::string& tree);

class DaemonTest : public nas_test::PlatformTest {
 protected:
  void SetUp() override;
  void TearDown() override;

  // Where the trees are: a file system of its own, of that type, where root can mount one.
  void MountTree(const std::string& type);
  void MountImage(const std::string& image);
  // With fewer rights it would watch single folders, which other tests are about.
  bool CanWatchFileSystems() const;
  void ConfigureIndex(const nas::IndexSettings& settings = {});
  // `begun` is called in its process.
  void StartDaemon(const std::function<void()>& begun = [] {});
  // Returns whether it ended by itself and well.
  bool StopDaemon(int signal_number = SIGTERM);
  // Waits until everything is current.
  bool Current();
  // Whether the watcher of the tree says so in the report.
  bool StateIs(const std::string& state);

  std::string tree_;  // indexed as the share "tree"
  pid_t daemon_ = -1;

 private:
  std::vector<std::string> mounted_;
};

}  // namespace index_test
