#include "nas/search/ignore_files.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>

#include <utility>

#include "nas/base/file_io.h"
#include "nas/base/unique_fd.h"

namespace nas {
namespace {

constexpr char kRepository[] = ".git";

IgnoreLines Read(int folder, const char* name) {
  const auto text = ReadWholeFile(folder, name, IgnoreFiles::kMostBytes);
  return text ? IgnoreLines(*text) : IgnoreLines();
}

}  // namespace

IgnoreFiles::Ptr IgnoreFiles::Of(int fd, std::string_view path, const Ptr& above) {
  struct stat status;
  const bool repository = fstatat(fd, kRepository, &status, 0) == 0;
  auto files = std::make_shared<IgnoreFiles>();
  bool any = repository;
  for (const auto& [kind, name] :
       {std::pair(kFd, ".fdignore"), {kPlain, ".ignore"}, {kGit, ".gitignore"}}) {
    files->lines_[kind] = Read(fd, name);
    any |= !files->lines_[kind].empty();
  }
  if (!any) return above;
  files->above_ = above;
  files->path_ = path;
  files->is_repository_ = repository;
  if (repository) files->exclude_ = Read(fd, ".git/info/exclude");
  return files;
}

IgnoreFiles::Ptr IgnoreFiles::Above(const Location& location) {
  Ptr files;
  if (location.path.empty()) return files;
  const std::string root = location.share.root.empty() ? "/" : location.share.root;
  const UniqueFd share(open(root.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!share) return files;
  files = Of(share.get(), "", files);
  const std::string_view path = location.path;
  for (size_t end = path.find('/'); end != std::string_view::npos; end = path.find('/', end + 1)) {
    const std::string folder(path.substr(0, end));
    const UniqueFd fd = OpenAt2(share.get(), folder.c_str(), O_PATH | O_DIRECTORY,
                                RESOLVE_BENEATH | RESOLVE_NO_MAGICLINKS);
    if (fd) files = Of(fd.get(), folder, files);
  }
  return files;
}

IgnoreFiles::Verdict IgnoreFiles::OfKind(Kind kind, std::string_view path, bool is_folder) const {
  for (const IgnoreFiles* files = this; files != nullptr; files = files->above_.get()) {
    const Verdict verdict = files->lines_[kind].Of(files->Below(path), is_folder);
    if (verdict != Verdict::kNothing) return verdict;
  }
  return Verdict::kNothing;
}

// Those of the innermost repository alone, and only within one.
IgnoreFiles::Verdict IgnoreFiles::OfGit(std::string_view path, bool is_folder) const {
  Verdict verdict = Verdict::kNothing;
  for (const IgnoreFiles* files = this; files != nullptr; files = files->above_.get()) {
    if (verdict == Verdict::kNothing) {
      verdict = files->lines_[kGit].Of(files->Below(path), is_folder);
    }
    if (!files->is_repository_) continue;
    return verdict != Verdict::kNothing ? verdict
                                        : files->exclude_.Of(files->Below(path), is_folder);
  }
  return Verdict::kNothing;
}

bool IgnoreFiles::LeaveOut(std::string_view folder, std::string_view name, bool is_folder) const {
  const std::string path = std::string(folder) + (folder.empty() ? "" : "/") + std::string(name);
  for (const Kind kind : {kFd, kPlain}) {
    const Verdict verdict = OfKind(kind, path, is_folder);
    if (verdict != Verdict::kNothing) return verdict == Verdict::kIgnored;
  }
  return OfGit(path, is_folder) == Verdict::kIgnored;
}

}  // namespace nas
