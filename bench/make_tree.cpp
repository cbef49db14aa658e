// Makes the trees that the benchmarks run on. The same arguments always make the same tree.
//
//   make_tree names DIR FILES   FILES empty files, fifteen to a folder, with names as people give
//                               them: several scripts, composed and decomposed letters, camera and
//                               invoice numbers. 7 % of the names hold "invoice", 6 in 100,000 hold
//                               "xylophone".
//   make_tree huge DIR FILES    one folder of FILES empty files
//   make_tree chain DIR DEPTH   DEPTH folders, each inside the one before, with a file in each
//   make_tree photos DIR FILES  FILES of 300 KB that begin as JPEG does, a hundred to a folder
//   make_tree sparse DIR FILES  FILES of 1 MiB that take no room, a hundred to a folder

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <random>
#include <string>
#include <string_view>

namespace {

constexpr int kFilesInFolder = 15;
constexpr int kFoldersInFolder = 12;

constexpr std::array kWords = {
    "report",  "holiday", "budget", "meeting", "photo",   "draft",  "final",  "copy",
    "notes",   "summer",  "family", "project", "backup",  "music",  "scan",   "letter",
    "garden",  "kitchen", "tax",    "school",  "concert", "recipe", "plan",   "archive",
    "version", "client",  "order",  "receipt", "manual",  "travel", "berlin", "winter"};
constexpr std::array kOtherScripts = {
    "Übersicht",  "U\u0308bersicht", "résumé", "re\u0301sume\u0301",
    "Straße",     "日本語の資料",    "写真",   "отчёт",
    "фото",       "ελληνικά",        "한국어", "العربية",
    "naïve",      "cafe\u0301",      "Łódź",   "señor",
    "smörgåsbord"};
constexpr std::array kExtensions = {".jpg", ".pdf", ".txt", ".docx", ".mp3", ".xlsx",
                                    ".png", ".mov", ".zip", ".md",   "",     ".tar.gz"};

[[noreturn]] void Fail(const std::string& what) {
  std::fprintf(stderr, "make_tree: %s: %s\n", what.c_str(), std::strerror(errno));
  std::exit(1);
}

class Maker {
 public:
  std::string FileName(std::uint64_t number) {
    const std::uint64_t dice = random_() % 100'000;
    std::string name;
    if (dice < 6) {
      name = "xylophone-" + std::to_string(number);
    } else if (dice < 7'000) {
      name = (dice % 3 == 0   ? "Invoice_"
              : dice % 3 == 1 ? "invoice "
                              : "2024-INVOICE-") +
             std::to_string(number);
    } else if (dice < 30'000) {
      name = "IMG_" + std::to_string(number % 10'000) + "_" + std::to_string(number / 10'000);
    } else {
      name = Word() + (dice % 2 == 0 ? " " : "_") + Word() + "-" + std::to_string(number);
    }
    return name + kExtensions[random_() % kExtensions.size()];
  }

  std::string FolderName(std::uint64_t number) { return Word() + " " + std::to_string(number); }

 private:
  // One word in eight is not ASCII.
  std::string Word() {
    const auto dice = random_();
    if (dice % 8 == 0) return kOtherScripts[(dice / 8) % kOtherScripts.size()];
    return kWords[(dice / 8) % kWords.size()];
  }

  std::mt19937_64 random_{20'260'101};
};

int MakeFolder(int parent, const std::string& name) {
  if (mkdirat(parent, name.c_str(), 0755) != 0 && errno != EEXIST) Fail(name);
  const int fd = openat(parent, name.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) Fail(name);
  return fd;
}

void MakeFile(int folder, const std::string& name) {
  const int fd = openat(folder, name.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
  if (fd < 0) Fail(name);
  close(fd);
}

// Fills `folder` and then its sub-folders, level by level within the budget of this sub-tree.
void Fill(Maker& maker, int folder, std::uint64_t files, std::uint64_t& number) {
  for (int i = 0; i < kFilesInFolder && files > 0; ++i, --files) {
    MakeFile(folder, maker.FileName(++number));
  }
  for (int i = 0; i < kFoldersInFolder && files > 0; ++i) {
    // Whole folders, so that every one but the last is full.
    const std::uint64_t folders = files / kFilesInFolder / (kFoldersInFolder - i);
    const std::uint64_t share =
        std::min<std::uint64_t>(files, std::max<std::uint64_t>(folders, 1) * kFilesInFolder);
    const int below = MakeFolder(folder, maker.FolderName(number));
    Fill(maker, below, share, number);
    close(below);
    files -= share;
  }
}

void MakeChain(int root, std::uint64_t depth) {
  int folder = root;
  for (std::uint64_t i = 0; i < depth; ++i) {
    MakeFile(folder, "link " + std::to_string(i) + ".txt");
    const int below = MakeFolder(folder, "folder " + std::to_string(i));
    if (folder != root) close(folder);
    folder = below;
  }
}

constexpr size_t kPhotoBytes = 300'000;
constexpr off_t kSparseBytes = off_t{1} << 20;

// As a camera writes them: a head, then what looks like chance.
void WritePhoto(int file, std::mt19937_64& random) {
  constexpr std::string_view kHead("\xff\xd8\xff\xe0\0\x10JFIF\0\1\1", 13);
  std::string bytes(kHead);
  while (bytes.size() < kPhotoBytes) {
    const std::uint64_t next = random();
    bytes.append(reinterpret_cast<const char*>(&next), sizeof next);
  }
  if (write(file, bytes.data(), kPhotoBytes) != static_cast<ssize_t>(kPhotoBytes)) Fail("photo");
}

void MakeBinaries(int root, std::uint64_t count, bool sparse) {
  constexpr std::uint64_t kInFolder = 100;
  std::mt19937_64 random{20'260'102};
  int folder = -1;
  for (std::uint64_t i = 0; i < count; ++i) {
    if (i % kInFolder == 0) {
      if (folder >= 0) close(folder);
      folder = MakeFolder(root, "album " + std::to_string(i / kInFolder));
    }
    const std::string name = "IMG_" + std::to_string(i) + (sparse ? ".img" : ".jpg");
    const int fd = openat(folder, name.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
    if (fd < 0) Fail(name);
    if (!sparse) WritePhoto(fd, random);
    if (sparse && ftruncate(fd, kSparseBytes) != 0) Fail(name);
    close(fd);
  }
  if (folder >= 0) close(folder);
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 4) {
    std::fprintf(stderr, "usage: make_tree names|huge|chain|photos|sparse DIR COUNT\n");
    return 2;
  }
  const std::string_view kind = argv[1];
  const std::uint64_t count = std::strtoull(argv[3], nullptr, 10);
  const int root = MakeFolder(AT_FDCWD, argv[2]);
  Maker maker;
  std::uint64_t number = 0;
  if (kind == "names") {
    Fill(maker, root, count, number);
  } else if (kind == "huge") {
    while (number < count) {
      ++number;
      MakeFile(root, maker.FileName(number));
    }
  } else if (kind == "chain") {
    MakeChain(root, count);
  } else if (kind == "photos" || kind == "sparse") {
    MakeBinaries(root, count, kind == "sparse");
  } else {
    std::fprintf(stderr, "make_tree: unknown kind of tree\n");
    return 2;
  }
  return 0;
}
