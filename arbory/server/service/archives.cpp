#include "arbory/server/service/archives.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>

#include <algorithm>
#include <charconv>
#include <exception>
#include <map>
#include <memory>
#include <optional>
#include <unordered_set>

#include "arbory/running_search.h"
#include "arbory/server/service/fleet_files.h"
#include "arbory/server/service/library.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/paths.h"
#include "nas/files/directory_reader.h"
#include "nas/fleet/asker.h"
#include "nas/fleet/signer.h"
#include "nas/match/query.h"
#include "nas/system/config.h"
#include "nas/system/identity.h"
#include "nas/system/shares.h"

namespace arbory {
namespace {

// Each is held in memory for the archive's list of contents, some 300 bytes of it.
constexpr size_t kMostFiles = 400'000;
constexpr size_t kMostTold = 1000;  // of what was left out; nobody reads more
constexpr int kDeepest = 200;       // folders in folders, each of which holds a descriptor
constexpr size_t kMostRanges = 5000;
constexpr char kLeftOut[] = "not included.txt";
constexpr char kWholeResult[] = "all";

// A row's file, as it is known to the person: "SHARE/below"; of a box's folder, with a "/" behind.
using Paths = std::vector<std::string>;

std::vector<std::uint32_t> NumbersOf(nas::ResultReader& reader, const ArchiveRequest& request,
                                     const nas::Selection& selection) {
  std::vector<std::uint32_t> numbers;
  const std::uint64_t all = reader.rows();
  for (const auto& [first, last] : request.rows) {
    if (first >= all || numbers.size() > kMostFiles) break;
    const auto page = reader.Select(selection, first, std::min(last, all) - first + 1);
    numbers.insert(numbers.end(), page.numbers.begin(), page.numbers.end());
  }
  std::ranges::sort(numbers);  // as they are stored
  return numbers;
}

Paths ReadPaths(const std::string& file, const ArchiveRequest& request,
                const nas::Selection& selection) {
  nas::ResultReader reader(file);
  reader.Begin();
  Paths paths;
  for (const std::uint32_t number : NumbersOf(reader, request, selection)) {
    const nas::ResultRow row = reader.Row(number);
    std::string path(row.share_name);
    for (const std::string_view part : {row.folder, row.name}) {
      if (!part.empty()) path.append(part.starts_with('/') ? "" : "/").append(part);
    }
    const bool elsewhere = nas::FindFleetBox(path.substr(0, path.find('/'))) != nullptr;
    if (elsewhere && S_ISDIR(row.attributes->mode)) path += '/';
    paths.push_back(std::move(path));
  }
  reader.End();
  return paths;
}

// How much of every path is the folder that all lie in, its final "/" included.
size_t CommonBytes(const Paths& paths) {
  std::string_view common = paths.front();
  for (const std::string& path : paths) {
    const auto ends = std::ranges::mismatch(common, path);
    common = common.substr(0, static_cast<size_t>(ends.in1 - common.begin()));
  }
  return common.rfind('/') + 1;  // 0 for none
}

class Archiver {
 public:
  Archiver(int pipe, size_t common_bytes)
      : zip_(LoadServerLibrary().new_zip(pipe)), common_bytes_(common_bytes) {}

  void Add(const std::string& path) {
    if (IsInFolderAdded(path)) return;
    const size_t slash = path.find('/');
    if (nas::FindFleetBox(path.substr(0, slash)) != nullptr) return AddFromBox(path);
    const nas::UniqueFd& root = RootOf(path.substr(0, slash));
    if (!root) return LeaveOut(path, ENOENT);
    const std::string below = slash == std::string::npos ? "." : path.substr(slash + 1);
    AddAt(root.get(), below, path, 0,
          RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS);
  }

  void Finish() {
    if (left_out_ > 0) {
      std::string text = "Left out of this archive:\r\n\r\n" + told_;
      if (left_out_ > kMostTold) {
        text += "... and " + std::to_string(left_out_ - kMostTold) + " more\r\n";
      }
      zip_->AddText(kLeftOut, text);
    }
    zip_->Finish();
  }
  bool broken() const { return zip_->broken(); }

 private:
  const nas::UniqueFd& RootOf(const std::string& share_name) {
    const auto [found, is_new] = roots_.try_emplace(share_name);
    if (!is_new) return found->second;
    const auto share = nas::FindShare(share_name);
    if (share) {
      const std::string root = share->root.empty() ? "/" : share->root;
      found->second = nas::UniqueFd(open(root.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    }
    return found->second;
  }

  // Results hold a folder and what lies in it side by side.
  bool IsInFolderAdded(const std::string& path) const {
    if (folders_.empty()) return false;
    for (size_t cut = path.size(); cut != std::string::npos && cut > 0;
         cut = path.rfind('/', cut - 1)) {
      if (folders_.contains(path.substr(0, cut))) return true;
    }
    return false;
  }

  void AddAt(int dir, const std::string& name, const std::string& path, int depth,
             unsigned long long resolve) {
    if (zip_->broken()) return;
    if (++files_ > kMostFiles) return LeaveOut(path, E2BIG);
    // Without O_NONBLOCK a pipe would be waited for; a terminal must not become this process's.
    const nas::UniqueFd file =
        nas::OpenAt2(dir, name.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_NOFOLLOW, resolve);
    struct stat info;
    if (!file || fstat(file.get(), &info) != 0) return LeaveOut(path, errno);
    if (S_ISREG(info.st_mode)) {
      if (!zip_->AddFile(NameOf(path), file.get(), info)) LeaveOut(path, EIO);
    } else if (S_ISDIR(info.st_mode)) {
      if (depth == 0) folders_.insert(path);
      if (depth > kDeepest) return LeaveOut(path, ELOOP);
      if (path.size() > common_bytes_) zip_->AddFolder(NameOf(path), info);
      AddBelow(file.get(), path, depth);
    } else {
      LeaveOut(path, EINVAL);
    }
  }

  void AddBelow(int folder, const std::string& path, int depth) {
    std::vector<std::string> names;
    nas::DirectoryReader reader;
    reader.Start(folder);
    for (nas::DirectoryReader::Entry entry; reader.Next(entry);) names.emplace_back(entry.name);
    if (reader.failed() != 0) LeaveOut(path, reader.failed());
    std::ranges::sort(names);
    for (const std::string& name : names) {
      AddAt(folder, name, path + "/" + name, depth + 1, RESOLVE_NO_SYMLINKS | RESOLVE_BENEATH);
    }
  }

  void AddFromBox(const std::string& path) {
    if (path.ends_with('/')) return LeaveOut(path, EISDIR);
    if (++files_ > kMostFiles) return LeaveOut(path, E2BIG);
    if (!boxes_) boxes_.emplace();
    bool begun = false;
    const int trouble = boxes_->Fetch(
        path,
        [&](std::uint64_t bytes, std::time_t modified) {
          struct stat info = {};
          info.st_mode = S_IFREG | S_IRUSR | S_IWUSR | S_IRGRP | S_IROTH;
          info.st_size = static_cast<off_t>(bytes);
          info.st_mtime = modified;
          return begun = zip_->BeginFile(NameOf(path), info);
        },
        [&](std::string_view piece) {
          zip_->AddBytes(piece);
          return !zip_->broken();
        });
    const bool whole = begun && zip_->EndFile();
    if (trouble != 0 || !whole) LeaveOut(path, trouble != 0 ? trouble : EIO);
  }

  std::string NameOf(const std::string& path) const { return path.substr(common_bytes_); }

  void LeaveOut(const std::string& path, int error) {
    if (++left_out_ > kMostTold) return;
    const char* why = "it could not be read";
    if (error == EACCES || error == EPERM) why = "you may not read it";
    if (error == ENOENT) why = "it is no longer there";
    if (error == ELOOP) why = "it is a link, or lies too deep";
    if (error == EINVAL || error == ENXIO) why = "it is neither a file nor a folder";
    if (error == EHOSTDOWN) why = "its machine does not answer";
    if (error == EISDIR) why = "it is a folder of another machine; choose its files";
    if (error == E2BIG) why = "there are too many files for one archive";
    told_ += path + ": " + why + "\r\n";
  }

  const std::unique_ptr<ZipStream> zip_;
  const size_t common_bytes_;
  std::optional<BoxFiles> boxes_;
  std::map<std::string, nas::UniqueFd> roots_;  // of shares; invalid where there is none
  std::unordered_set<std::string> folders_;     // chosen ones
  size_t files_ = 0;
  size_t left_out_ = 0;
  std::string told_;
};

void Refuse(int pipe, int status, const char* sentence) {
  nas::SendReply(pipe, AsChildsReply(ErrorReply(status, sentence)));
}

void Serve(const ArchiveRequest& request, int pipe) {
  LoadServerLibrary();
  nas::StartFleetSigner(request.user);
  if (!nas::BecomeUser(request.user)) {
    return Refuse(pipe, kUnavailable, "The server cannot act as this user.");
  }
  nas::GiveUpRoot();
  const RunningSearch search = ReadSearch(request.user, request.task_id);
  if (!search.exists || search.results.empty()) {
    return Refuse(pipe, kNotFound, "There is no such search; start a new one.");
  }
  nas::Selection selection;
  selection.column = nas::ParseSortColumn(request.sort_by).value_or(nas::SortColumn::kFound);
  selection.ascending = !request.descending;
  if (!request.pattern.empty()) {
    auto parsed = nas::Query::Parse(request.pattern);
    if (!parsed) return Refuse(pipe, kBadRequest, parsed.error().path.c_str());
    selection.pattern = std::move(*parsed);
  }
  Paths paths;
  try {
    paths = ReadPaths(search.results, request, selection);
  } catch (const std::exception&) {
    return Refuse(pipe, kUnavailable, "The results cannot be read; search again.");
  }
  if (paths.empty()) return Refuse(pipe, kBadRequest, "The search has none of these rows.");
  // Folders before what lies in them.
  std::ranges::sort(paths);
  const nas::ReplyHead head{kOk,
                            0,
                            {{"Content-Type", "application/zip"},
                             {"Content-Disposition", ContentDisposition(false, "arbory.zip")},
                             {"Cache-Control", "no-store"}}};
  if (!nas::SendHead(pipe, head, nas::kUntilEnd) || request.head_only) return;
  Archiver archive(pipe, CommonBytes(paths));
  for (const std::string& path : paths) {
    if (archive.broken()) return;
    archive.Add(path);
  }
  archive.Finish();
}

}  // namespace

std::optional<RowRanges> ParseRowRanges(const std::string& text) {
  if (text == kWholeResult) return RowRanges{{0, UINT32_MAX}};
  RowRanges ranges;
  const char* at = text.data();
  const char* const end = at + text.size();
  while (ranges.size() < kMostRanges) {
    std::uint64_t first = 0;
    auto read = std::from_chars(at, end, first);
    if (read.ec != std::errc()) return std::nullopt;
    std::uint64_t last = first;
    if (read.ptr != end && *read.ptr == '-') {
      read = std::from_chars(read.ptr + 1, end, last);
      if (read.ec != std::errc()) return std::nullopt;
    }
    const bool apart = ranges.empty() || first > ranges.back().second;
    if (!apart || last < first || last > UINT32_MAX) return std::nullopt;
    ranges.emplace_back(first, last);
    if (read.ptr == end) return ranges;
    if (*read.ptr != ',') return std::nullopt;
    at = read.ptr + 1;
  }
  return std::nullopt;
}

nas::Child StartArchive(const ArchiveRequest& request) {
  return nas::StartChild([&](int pipe) { Serve(request, pipe); },
                         nas::CurrentConfig().call_memory_bytes());
}

}  // namespace arbory
