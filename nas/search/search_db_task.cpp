// Result databases as listings see them.

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <new>
#include <optional>
#include <utility>

#include "nas/base/accounts.h"
#include "nas/base/error.h"
#include "nas/match/file_kinds.h"
#include "nas/match/query_match.h"
#include "nas/results/foreign_accounts.h"
#include "nas/results/result_file.h"
#include "nas/results/result_reader.h"
#include "nas/system/identity.h"
#include "nas/system/memory.h"
#include "nas/system/volumes.h"
#include "platform/filesearch.h"

namespace FileSearch {
namespace {

// Some kilobytes of memory a row, as the caller shapes it: from here on a page needs a permit ...
constexpr std::uint64_t kLargePage = 20'000;
// ... and so does any page of results that may have to be sorted first, at 100 bytes a row.
constexpr std::uint64_t kManyRows = 500'000;

std::string RelativePath(const nas::ResultRow& row) {
  std::string path(row.folder);
  if (!path.empty()) path.push_back('/');
  return path.append(row.name);
}

std::string RealPath(const nas::ResultRow& row) {
  return std::string(row.share_root) + "/" + RelativePath(row);
}

// Listings take a file for vanished when it cannot be reached, but a dangling symbolic link and a
// file in a folder that was closed meanwhile are still there, and one on another machine is not
// here.
bool HasVanished(const std::string& path) {
  if (path.starts_with(nas::kFleetRoot)) return false;
  struct stat info;
  return lstat(path.c_str(), &info) != 0 && (errno == ENOENT || errno == ENOTDIR);
}

// What is written of a file holds neither its contents nor how deep it lies in what was searched.
bool AsksMoreThanRows(const nas::QueryNode& leaf) {
  using Kind = nas::QueryNode::Kind;
  return leaf.kind == Kind::kContent || leaf.kind == Kind::kDepth || leaf.kind == Kind::kEmpty ||
         nas::IsOfWalk(leaf);
}

// Lends rows to a callback in the platform's form, row after row from the same memory.
class Lender {
 public:
  Lender(nas::ForeignAccounts foreign, SelectCallback callback, void* context)
      : foreign_(std::move(foreign)), callback_(callback), context_(context) {}

  BOOL Lend(const nas::ResultRow& row) {
    const nas::FileAttributes& file = *row.attributes;
    relative_path_.assign(row.folder);
    if (!relative_path_.empty()) relative_path_.push_back('/');
    relative_path_.append(row.name);
    __tag_FILE_INFO_DATA data{};
    data.share_root = Keep(share_root_, row.share_root);
    data.share_name = Keep(share_name_, row.share_name);
    data.name = Keep(name_, row.name);
    data.relative_path = relative_path_.data();
    data.extension = Keep(extension_, nas::ExtensionOf(row.name));
    data.mode = file.mode;
    const std::string* user = foreign_.Foreign(file.uid);
    const std::string* group = foreign_.Foreign(file.gid);
    data.owner_name = Keep(owner_, user != nullptr ? *user : owners_.User(file.uid));
    data.group_name = Keep(group_, group != nullptr ? *group : owners_.Group(file.gid));
    data.uid = file.uid;
    data.gid = file.gid;
    data.is_dir = S_ISDIR(file.mode);
    data.size = file.size;
    data.atime = file.atime;
    data.mtime = file.mtime;
    data.ctime = file.ctime;
    data.crtime = file.crtime == nas::FileAttributes::kNoTime ? 0 : file.crtime;
    return callback_(&data, context_);
  }

 private:
  static char* Keep(std::string& kept, std::string_view text) {
    kept.assign(text);
    return kept.data();
  }

  const nas::ForeignAccounts foreign_;
  nas::AccountTexts owners_;
  const SelectCallback callback_;
  void* const context_;
  std::string share_root_;
  std::string share_name_;
  std::string name_;
  std::string relative_path_;
  std::string extension_;
  std::string owner_;
  std::string group_;
};

}  // namespace

class WfmSearchDBTask::Impl {
 public:
  Impl(const std::string& path, const std::string& user) : path_(path), user_(user) {}

  bool Query(unsigned long offset, unsigned long limit, const nas::Selection& selection,
             SelectCallback callback, void* context, unsigned long long* total);
  bool Delete(const std::string& share_name, const std::string& real_path);
  bool Remove() { return nas::RemoveResultFile(path_); }

 private:
  // For a page of so many rows of all.
  nas::Status Permit(std::uint64_t page, std::uint64_t rows) const;
  bool FlushPurges();

  // Opened when it is first read: what cannot be read can still be removed.
  nas::ResultReader& Reader() {
    if (!reader_) reader_.emplace(path_);
    return *reader_;
  }

  const std::string path_;
  const std::string user_;
  std::optional<nas::ResultReader> reader_;
  // Purges asked for by a running selection wait for its end: it reads one state of the file.
  std::optional<std::uint32_t> current_;  // the row lent to the callback
  std::vector<std::uint32_t> purges_;
};

bool WfmSearchDBTask::Impl::Query(unsigned long offset, unsigned long limit,
                                  const nas::Selection& selection, SelectCallback callback,
                                  void* context, unsigned long long* total) {
  nas::ResultReader& reader = Reader();
  reader.Begin();
  const nas::Status permitted =
      Permit(std::min<std::uint64_t>(limit, reader.rows()), reader.rows());
  if (!permitted) {
    nas::Report(permitted.error());
    return false;
  }
  const nas::ResultReader::Page page = reader.Select(selection, offset, limit);
  *total = page.total;
  Lender lender(reader.Accounts(), callback, context);
  purges_.clear();
  const struct Selecting {
    std::optional<std::uint32_t>& current;
    ~Selecting() { current.reset(); }
  } selecting{current_};
  for (const std::uint32_t number : page.numbers) {
    current_ = number;
    if (lender.Lend(reader.Row(number)) == 0) break;
  }
  reader.End();
  FlushPurges();
  return true;
}

nas::Status WfmSearchDBTask::Impl::Permit(std::uint64_t page, std::uint64_t rows) const {
  if (page < kLargePage && rows < kManyRows) return {};
  return nas::TakeLargePermit(user_);
}

// False where they could not be stored (a full disk).
bool WfmSearchDBTask::Impl::FlushPurges() {
  const std::vector<std::uint32_t> purges = std::exchange(purges_, {});
  if (purges.empty()) return true;
  try {
    Reader().Purge(purges);
    return true;
  } catch (const nas::SqliteError& error) {
    syslog(LOG_ERR, "search results: %s", error.what());
    return false;
  }
}

bool WfmSearchDBTask::Impl::Delete(const std::string& share_name, const std::string& real_path) {
  nas::ResultReader& reader = Reader();
  const auto is_the_file = [&](const nas::ResultRow& row) {
    return row.share_name == share_name && RealPath(row) == real_path;
  };
  if (current_) {
    if (is_the_file(reader.Row(*current_)) && HasVanished(real_path)) purges_.push_back(*current_);
    // Who lists takes the answer about the last row for one about the page: a link that stays must
    // not make a page good that holds a file which is gone.
    return !purges_.empty();
  }
  reader.Begin();
  for (std::uint32_t row = 0; row < reader.rows(); ++row) {
    if (!reader.purged(row) && is_the_file(reader.Row(row))) purges_.push_back(row);
  }
  reader.End();
  const bool found = !purges_.empty();
  return FlushPurges() && found;
}

WfmSearchDBTask::WfmSearchDBTask(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}

WfmSearchDBTask::~WfmSearchDBTask() = default;

bool WfmSearchDBTask::queryResult(unsigned long offset, unsigned long limit, const char* sort_by,
                                  const bool* ascending, const _tag_dir_entry_type_* type,
                                  const char* pattern, SelectCallback callback, void* context,
                                  unsigned long long* total) const try {
  nas::Selection selection;
  if (sort_by != nullptr) {
    const std::optional<nas::SortColumn> column = nas::ParseSortColumn(sort_by);
    if (!column) return false;
    selection.column = *column;
  }
  selection.ascending = ascending == nullptr || *ascending;
  if (type != nullptr && *type != DIR_ENTRY_ALL) selection.directories = *type == DIR_ENTRY_DIR;
  if (pattern != nullptr) {
    auto parsed = nas::Query::Parse(pattern);
    if (!parsed || nas::AnyLeaf(parsed->root(), AsksMoreThanRows)) return false;
    if (parsed->restricts()) selection.pattern = std::move(*parsed);
  }
  return impl_->Query(offset, limit, selection, callback, context, total);
} catch (const std::bad_alloc&) {
  throw;  // the page is too large for the call, which says so
} catch (const std::exception& error) {
  syslog(LOG_ERR, "search results: %s", error.what());
  return false;
}

bool WfmSearchDBTask::delRecs(std::string share_name, std::string real_path) try {
  return impl_->Delete(share_name, real_path);
} catch (const std::exception& error) {
  syslog(LOG_ERR, "search results: %s", error.what());
  return false;
}

bool WfmSearchDBTask::remove() { return impl_->Remove(); }

WfmSearchDBTaskMgr::WfmSearchDBTaskMgr(const char* user) : user_(user) {}

WfmSearchDBTask* WfmSearchDBTaskMgr::getDBTask(const char* volume, const char* id) const try {
  if (!nas::IsResultId(id)) return nullptr;
  const auto folder = nas::ResultFolder(volume, user_);
  if (!folder) {
    nas::Report(folder.error());
    return nullptr;
  }
  // SQLite is not to read a user's file in a process that could be root again.
  nas::GiveUpRoot();
  const std::string path = nas::ResultPath(*folder, id);
  if (!nas::IsResultFileThere(path)) return nullptr;
  return new WfmSearchDBTask(std::make_unique<WfmSearchDBTask::Impl>(path, user_));
} catch (const std::exception& error) {
  syslog(LOG_ERR, "search results: %s", error.what());
  return nullptr;
}

}  // namespace FileSearch
