#include "arbory/server/service/sample_share.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <filesystem>
#include <stdexcept>

#include "arbory/server/service/installed.h"
#include "nas/base/file_io.h"
#include "nas/base/random_name.h"
#include "nas/system/folders.h"
#include "nas/system/identity.h"

namespace arbory {
namespace {

namespace fs = std::filesystem;

constexpr mode_t kFolderMode = 0755;
constexpr mode_t kFileMode = 0644;
constexpr size_t kMaxFileBytes = size_t{1} << 20;
constexpr char kWelcome[] = "Welcome.txt";  // one that is always among them

void Require(const nas::Status& made) {
  if (!made) throw std::runtime_error("cannot make the sample share: " + made.error().Text());
}

void MakeFolder(const std::string& path) {
  if (!nas::MakeFolders(path, kFolderMode)) Require(nas::ErrnoError(path));
}

void Copy(const std::string& from, const std::string& to) {
  const auto content = nas::ReadWholeFile(AT_FDCWD, from, kMaxFileBytes);
  Require(content ? nas::CreateFile(AT_FDCWD, to, *content, kFileMode) : content.error());
}

}  // namespace

std::optional<std::string> MakeSampleShare(const std::string& state_dir) {
  std::string root = state_dir + "/" + kSampleShare;
  struct stat info;
  if (stat(root.c_str(), &info) == 0) return root;
  const auto sample = FindInstalled("sample", "packaging/sample", kWelcome);
  if (!sample) return std::nullopt;
  const nas::ScopedUmask open_to_all(0);
  // Filled under another name first: one that was cut short is not taken for a whole one.
  const std::string fresh =
      state_dir + "/" + std::string(nas::kTemporaryPrefix) + kSampleShare + nas::RandomName();
  MakeFolder(fresh);
  for (const auto& entry : fs::recursive_directory_iterator(*sample)) {
    const std::string to = fresh + "/" + entry.path().lexically_relative(*sample).string();
    if (entry.is_directory()) {
      MakeFolder(to);
    } else {
      Copy(entry.path(), to);
    }
  }
  if (rename(fresh.c_str(), root.c_str()) != 0) Require(nas::ErrnoError(root));
  return root;
}

}  // namespace arbory
