#include "arbory/server/service/sample_share.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <stdexcept>
#include <string_view>

#include "arbory/server/service/sample_picture.h"
#include "nas/base/file_io.h"
#include "nas/base/random_name.h"
#include "nas/system/folders.h"
#include "nas/system/identity.h"

namespace arbory {
namespace {

constexpr mode_t kFolderMode = 0755;
constexpr mode_t kFileMode = 0644;

struct SampleFile {
  const char* path;
  std::string_view content;
};

const SampleFile kFiles[] = {
    {"Welcome.txt",
     "This is a sample share. Type a word above, such as report, *.jpg or sunrise.\n"
     "Share your own folders with --share NAME=DIR or in the configuration file.\n"},
    {"Documents/Report 2025.md", "# Report 2025\n\nRevenue rose by a tenth; see the budget.\n"},
    {"Documents/Report 2026 (draft).md", "# Report 2026\n\nTo be written.\n"},
    {"Documents/Budget.csv", "item,amount\nrent,1200\ntea,35\nnetwork storage,410\n"},
    {"Documents/Letters/Letter to the landlord.txt", "Dear landlord, the roof leaks again.\n"},
    {"Documents/Letters/R\xC3\xA9sum\xC3\xA9.txt", "Worked with files, mostly other people's.\n"},
    {"Pictures/Holiday/Sunrise.png",
     {reinterpret_cast<const char*>(kSamplePicture), sizeof kSamplePicture}},
    {"Pictures/Holiday/IMG_2.txt", "Natural order puts this one before IMG_10.\n"},
    {"Pictures/Holiday/IMG_10.txt", "Natural order puts this one after IMG_2.\n"},
    {"Music/Playlist.m3u", "#EXTM3U\nMorning song.flac\nEvening song.flac\n"},
    {"Code/hello.py", "print(\"hello, search\")\n"},
    {"Code/notes.json", "{\"todo\": [\"index the attic\", \"find the tea budget\"]}\n"},
};

[[noreturn]] void Fail(const nas::Error& error) {
  throw std::runtime_error("cannot make the sample share: " + error.Text());
}

void Put(const std::string& root, const SampleFile& file) {
  const std::string path = root + "/" + file.path;
  const std::string folder = path.substr(0, path.rfind('/'));
  if (!nas::MakeFolders(folder, kFolderMode)) Fail(nas::ErrnoError(folder));
  if (const auto made = nas::CreateFile(AT_FDCWD, path, file.content, kFileMode); !made) {
    Fail(made.error());
  }
}

}  // namespace

std::string MakeSampleShare(const std::string& state_dir) {
  std::string root = state_dir + "/" + kSampleShare;
  struct stat info;
  if (stat(root.c_str(), &info) == 0) return root;
  const nas::ScopedUmask open_to_all(0);
  // Filled under another name first: one that was cut short is not taken for a whole one.
  const std::string fresh =
      state_dir + "/" + std::string(nas::kTemporaryPrefix) + kSampleShare + nas::RandomName();
  for (const SampleFile& file : kFiles) Put(fresh, file);
  if (rename(fresh.c_str(), root.c_str()) != 0) Fail(nas::ErrnoError(root));
  return root;
}

}  // namespace arbory
