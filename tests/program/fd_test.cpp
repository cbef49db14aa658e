// Command lines of fd and what says the same here, over one tree: both find the same.

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cstdio>
#include <filesystem>
#include <memory>
#include <set>

#include "tests/program/program_test.h"

namespace program_test {
namespace {

namespace fs = std::filesystem;

class Fd : public ProgramTest {
 protected:
  void SetUp() override {
    ProgramTest::SetUp();
    for (const char* name : {"fd", "fdfind"}) {
      if (std::system(("command -v " + std::string(name) + " >/dev/null").c_str()) == 0) fd_ = name;
    }
    if (fd_.empty()) GTEST_SKIP() << "there is no fd";
    MakeTree();
  }

  void MakeTree() {
    const std::string tree = share_ + "/tree/";
    for (const char* folder : {".git/info", ".hidden/deep", "src/lib/deep/deeper", "node_modules/x",
                               "build/tmp", "void", "nested/.git", "docs/build"}) {
      fs::create_directories(tree + folder);
    }
    const std::pair<const char*, const char*> files[] = {
        {".gitignore", "*.o\n!keep.o\n/build/tmp/\nnode_modules/\n*.log\n# remark\n\\#x\n"},
        {".ignore", "by-ignore*\n!b.log\n"},
        {".git/info/exclude", "excluded\n"},
        {"src/.gitignore", "lib/*.c\n!lib/util.c\n"},
        {"src/.fdignore", "*.C\n"},
        {"nested/.gitignore", "only-here\n"},
        {".hidden/in.txt", "text"},
        {".hidden/deep/a.c", "text"},
        {".dot", ""},
        {"Readme.md", "text"},
        {"README.txt", "text"},
        {"src/main.c", "text"},
        {"src/Main.C", "text"},
        {"src/lib/util.c", "text"},
        {"src/lib/other.c", "text"},
        {"src/lib/deep/deeper/end.c", "text"},
        {"node_modules/x/index.js", "text"},
        {"build/out.o", "text"},
        {"build/keep.o", "text"},
        {"build/tmp/t", "text"},
        {"docs/build/page.html", "text"},
        {"a.log", "text"},
        {"b.log", "text"},
        {"by-ignore.txt", "text"},
        {"excluded", "text"},
        {"#x", "text"},
        {"empty.txt", ""},
        {"odd\nname.txt", "text"},
        {"bad\xff.txt", "text"},
        {"-dash.txt", "text"},
        {"\u00fcn\u00ef.txt", "text"},
        {"nested/only-here", "text"},
        {"nested/x.log", "text"},
        {"run.sh", "text"},
        {"large.bin", ""}};
    for (const auto& [name, text] : files) WriteFile(tree + name, text);
    WriteFile(tree + "large.bin", std::string(5000, 'x'));
    fs::permissions(tree + "run.sh", fs::perms(0755));
    fs::create_symlink("src/main.c", tree + "link");
    fs::create_directory_symlink("src", tree + "folder-link");
    fs::create_symlink("nowhere", tree + "broken");
    mkfifo((tree + "pipe").c_str(), 0644);
    const int socket_fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
    (tree + "socket").copy(address.sun_path, sizeof(address.sun_path) - 1);
    bind(socket_fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address));
    close(socket_fd);
  }

  // Paths below the tree, without a sign of what they are.
  static std::multiset<std::string> Paths(const std::string& output, const std::string& tree) {
    std::multiset<std::string> paths;
    for (std::string path : Pieces(output, '\0')) {
      if (path.starts_with(tree + "/")) path.erase(0, tree.size() + 1);
      if (path.starts_with("./")) path.erase(0, 2);
      if (path.ends_with('/')) path.pop_back();
      paths.insert(path);
    }
    return paths;
  }

  std::multiset<std::string> ByFd(const std::string& arguments, const std::string& folder) const {
    // Without what a user's own settings say.
    const std::string line = "cd '" + folder +
                             "' && HOME=/nonexistent XDG_CONFIG_HOME=/nonexistent " + fd_ +
                             " --color never -0 " + arguments + " 2>&1";
    const std::unique_ptr<FILE, int (*)(FILE*)> pipe(popen(line.c_str(), "r"), pclose);
    std::string output;
    for (int c = 0; (c = std::getc(pipe.get())) != EOF;) output.push_back(static_cast<char>(c));
    return Paths(output, folder);
  }

  std::string fd_;
};

TEST_F(Fd, FindsTheSame) {
  const struct {
    const char* fd;
    std::vector<std::string> arbory;
    const char* folder = "/tree";
  } rows[] = {
      {"-HI ''", {"--no-hidden", "--ignore-files", "-HI", ""}},
      {"-I ''", {"-H", "--no-hidden", ""}},
      {"-HI -d 1 ''", {"-d", "1", ""}},
      {"-HI -d 3 --min-depth 2 ''", {"-d", "3", "--min-depth", "2", ""}},
      {"-HI -t f ''", {"-t", "f", ""}},
      {"-HI -t d ''", {"-t", "d", ""}},
      {"-HI -t l -t p -t s ''", {"-t", "l,p", "-t", "socket", ""}},
      {"-HI -t x ''", {"-t", "x", ""}},
      {"-HI -t f -t x ''", {"-t", "f", "-t", "x", ""}},
      {"-HI -t e ''", {"-t", "e", ""}},
      {"-HI -t e -t d ''", {"-t", "e,d", ""}},
      {"-HI -E '*.c' ''", {"-s", "-E", "*.c", ""}},
      {"-HI -E '[!s]*' ''", {"-s", "-E", "[!s]*", ""}},
      {"-HI -E node_modules -E build ''", {"-E", "node_modules", "-E", "build", ""}},
      {"-HI -E /build -E src/lib ''", {"-E", "/build", "-E", "src/lib", ""}},
      {"-HI -E 'src/**/*.{c,C}' -E 'build/' ''", {"-E", "src/**/*.{c,C}", "-E", "build/", ""}},
      {"-H ''", {"--ignore-files", ""}},
      {"''", {"--ignore-files", "--no-hidden", ""}},
      {"''", {"--ignore-files", "--no-hidden", ""}, "/tree/src"},
      {"-H ''", {"--ignore-files", ""}, "/tree/nested"},
      {"-H -t f -E '*.txt' -d 2 c", {"--ignore-files", "-t", "f", "-E", "*.txt", "-d", "2", "c"}},
      {"-HI -e c -e o ''", {"-e", "c", "-e", "o", ""}},
      {"-HI -i main", {"main"}},
      {"-HI -s Main", {"-s", "Main"}},
      {"-HI Main", {"--smart-case", "Main"}},
      {"-HI main", {"--smart-case", "main"}},
      {"-HI '^[A-Z]\\w+\\.(md|c)$'", {"--smart-case", "regex:^[A-Z]\\w+\\.(md|c)$"}},
      {"-HI '\\Wname'", {"--smart-case", "regex:\\Wname"}},
      {"-HI -g -i '*.TXT'", {"*.TXT"}},
      {"-HI --one-file-system ''", {"--one-file-system", ""}},
      {"-HI -S +4k -t f ''", {"-t", "f", "--size-from", "4000", ""}},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(std::string("fd ") + row.fd + " in " + row.folder);
    const std::string folder = share_ + row.folder;
    const auto expected = ByFd(row.fd, folder);
    EXPECT_FALSE(expected.empty());
    std::vector<std::string> words = {"search", "-0"};
    words.insert(words.end(), row.arbory.begin(), row.arbory.end());
    words.push_back(folder);
    const Output found = Run(words);
    EXPECT_EQ(Paths(found.out, folder), expected) << found.err;
  }
}

}  // namespace
}  // namespace program_test
