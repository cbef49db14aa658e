#pragma once
// An index without a daemon: a table, the changes since, and answers from them.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <filesystem>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "nas/index/client.h"
#include "nas/index/frames.h"
#include "nas/index/tree_scan.h"
#include "nas/search/index_answer.h"

namespace program_test {

// The table of a tree, and what has been done to the tree since, noted as a watcher notes it.
class WatchedTree {
 public:
  WatchedTree(std::string root, const std::string& folder) : root_(std::move(root)) {
    const nas::UniqueFd top(open(root_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    const nas::TablePlace place{AT_FDCWD, folder + "/table", "a test's"};
    const nas::Status made = nas::ScanTree({{top.get(), "tree"}}, place);
    EXPECT_TRUE(made) << made.error().Text();
    auto table = nas::NameTable::Open(place.dir_fd, place.name, place.file_system);
    EXPECT_TRUE(table) << table.error().Text();
    table_.emplace(std::move(*table));
  }

  nas::IndexSnapshot snapshot() const { return {*table_, changes_, true}; }
  const nas::NameTable& table() const { return *table_; }

  void NoteName(const std::string& path) {
    const std::filesystem::path at(path);
    const auto folder = FolderOf(at.parent_path());
    if (folder != nas::NameTable::kNoFolder) changes_.AddName(folder, at.filename().native());
  }
  void NoteFolder(const std::string& path) {
    const auto folder = FolderOf(path);
    if (folder != nas::NameTable::kNoFolder) changes_.AddFolder(folder);
  }
  void NoteInode(const std::string& path) {
    struct stat status;
    if (lstat(path.c_str(), &status) == 0) changes_.AddInode(status.st_ino);
  }

 private:
  nas::NameTable::FolderId FolderOf(const std::string& path) const {
    const nas::UniqueFd fd(open(path.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    const auto key = nas::KeyOf(fd.get());
    return key ? table_->Find(*key) : nas::NameTable::kNoFolder;
  }

  const std::string root_;
  std::optional<nas::NameTable> table_;
  nas::Changes changes_;
};

// The worker's end and the child's, with a connection between them that may break.
class Answers {
 public:
  // Passes on so many frames of each answer; all where it is negative.
  Answers(const WatchedTree& index, int frames) : index_(index), frames_(frames) {}

  nas::IndexAnswer Ask(int location) {
    int ends[2];
    int inner[2];
    EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, inner), 0);
    nas::UniqueFd folder(fcntl(location, F_DUPFD_CLOEXEC, 0));
    threads_.emplace_back([this, end = ends[1], asker = inner[0]] { Pass(end, asker); });
    threads_.emplace_back([this, end = inner[1], at = std::move(folder)]() mutable {
      const nas::UniqueFd connection(end);
      nas::AnswerQuestion(connection.get(), std::move(at), index_.snapshot());
    });
    return {nas::UniqueFd(ends[0]), std::string(nas::kIndexCurrent)};
  }

 private:
  void Pass(int to, int from) const {
    const nas::UniqueFd worker(to);
    const nas::UniqueFd child(from);
    nas::Frame frame;
    nas::FrameReader questions(to, nas::kMaxQuestionBytes);
    if (questions.Read(-1, &frame) != nas::FrameReader::State::kFrame) return;
    EXPECT_TRUE(nas::SendFrame(from, frame.type, frame.payload));
    nas::FrameReader answers(from, nas::kMaxAnswerBytes);
    for (int i = 0; i != frames_; ++i) {
      if (answers.Read(-1, &frame) != nas::FrameReader::State::kFrame) return;
      if (!nas::SendFrame(to, frame.type, frame.payload)) return;
    }
  }

  const WatchedTree& index_;
  const int frames_;
  std::vector<std::jthread> threads_;
};

}  // namespace program_test
