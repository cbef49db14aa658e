#include "tests/program/reference.h"

#include <dirent.h>

#include <fstream>
#include <iterator>
#include <vector>

#include "tests/nas/fixture.h"

namespace program_test {

namespace fs = std::filesystem;

Reference Walk(const std::string& folder, bool recursive,
               const std::function<bool(const Entry&)>& wanted) {
  Reference result;
  DIR* stream = opendir(folder.c_str());
  if (stream == nullptr) {
    result.unreadable = errno == EACCES ? 1 : 0;
    return result;
  }
  while (const dirent* item = readdir(stream)) {
    const std::string name = item->d_name;
    if (name == "." || name == "..") continue;
    Entry entry = {folder + "/" + name, name, {}};
    if (lstat(entry.path.c_str(), &entry.info) != 0) continue;
    if (wanted(entry)) result.paths.insert(entry.path);
    if (!entry.is_dir() || !recursive) continue;
    Reference below = Walk(entry.path, true, wanted);
    result.paths.merge(below.paths);
    result.unreadable += below.unreadable;
  }
  closedir(stream);
  return result;
}

std::string TextOf(const std::string& path) {
  struct stat info;
  if (lstat(path.c_str(), &info) != 0 || !S_ISREG(info.st_mode)) return {};
  const std::string text = nas_test::ReadFile(path);
  return text.find('\0') == std::string::npos ? text : std::string();
}

void MakeHostileTree(const std::string& root) {
  const std::string longest(251, 'x');
  const std::vector<std::string> names = {"plain.txt",
                                          "UPPER.TXT",
                                          "new\nline.txt",
                                          "quo'te\".txt",
                                          "broken\xff\xfe.jpg",
                                          longest + ".txt",
                                          "caf\u00e9.txt",
                                          "cafe\u0301.pdf",
                                          "\u00dcBER.Jpg",
                                          "-dash.txt",
                                          "--help",
                                          "star*.txt",
                                          "[a].txt",
                                          "a",
                                          "back\\slash.txt",
                                          " space .txt",
                                          "tab\t.tar.gz",
                                          "x.tar.gz",
                                          "$(touch pwned);.txt",
                                          "%s%n.txt",
                                          "red\x1b[31m.png",
                                          ".hidden",
                                          "no_extension",
                                          "dot.",
                                          "IMG2.jpg",
                                          "IMG10.jpg",
                                          "'; DROP TABLE files;--.txt",
                                          "comma,name.txt"};
  const std::vector<std::string> folders = {
      "",           "/docs",      "/docs/deep/er", "/comma, folder",
      "/br\xc3ken", "/\u00dcber", "/empty",        "/line\nfeed"};
  const std::vector<size_t> sizes = {0, 1, 1023, 1024, 1025, 70'000};
  fs::create_directories(root + "/docs");
  nas_test::WriteFile(root + "/docs/.ignore", "er/\n*.gz\n!x.tar.*\n");
  long number = 0;
  for (const std::string& folder : folders) {
    fs::create_directories(root + folder);
    if (folder == "/empty") continue;
    for (const std::string& name : names) {
      const std::string path = root + folder + "/" + name;
      std::string text(sizes[static_cast<size_t>(number) % sizes.size()], 'q');
      if (number % 5 == 0) text += " the Needle is here";
      if (number % 10 == 0) text += '\0';
      nas_test::WriteFile(path, text);
      if (name == "no_extension") chmod(path.c_str(), 0755);
      const timespec times[2] = {{kFirstTime - number, 0}, {kFirstTime + number, 0}};
      utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW);
      if (nas_test::AmRoot() && number % 3 == 0) {
        // Accounts of a fixed number on every machine, neither of which is the one in use.
        if (lchown(path.c_str(), 1, 2) != 0) perror("lchown");
      }
      ++number;
    }
    fs::create_directory_symlink("..", root + folder + "/loop.txt");
    fs::create_symlink("missing", root + folder + "/dangling.txt");
    mkfifo((root + folder + "/pipe.txt").c_str(), 0644);
  }
}

}  // namespace program_test
