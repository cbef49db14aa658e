// One page of a result database as the file manager shows it. A page that met vanished files is
// asked for again after their rows were purged, so that no client sees an entry whose file is gone
// and "total" counts what is left.

#include "search/query.h"

#include <strings.h>
#include <syslog.h>
#include <unistd.h>

#include <cctype>
#include <cstdint>
#include <cstring>
#include <memory>

#include "api/codes.h"
#include "api/log.h"
#include "search/account_record.h"
#include "search/find_handler.h"
#include "search/search_state.h"

namespace {

constexpr size_t kPathChars = 4096;
constexpr char kHomesFolder[] = "/homes/";
constexpr char kHomesShare[] = "homes";
constexpr std::uint32_t kAllRows = 0x7FFFFFFF;  // for a limit of 0: more than any result has
// What the platform reserves them for.
constexpr int kAclNoFd = -1;
constexpr int kAclFlags = 2;

// Paths on this system end there; what is longer is cut.
std::string CutPath(std::string path) {
  if (path.size() > kPathChars) path.resize(kPathChars);
  return path;
}

// A row of a user's own home root already names the user's folder in its relative path, so such
// roots are taken as the "homes" share itself.
std::string RealPath(const FileSearch::__tag_FILE_INFO_DATA& row) {
  const std::string tail = std::string("/") + row.relative_path;
  const char* homes = strstr(row.share_root, kHomesFolder);
  if (homes == nullptr) return CutPath(row.share_root + tail);
  const size_t length = static_cast<size_t>(homes - row.share_root) + strlen("/homes");
  return CutPath(std::string(row.share_root, length) + tail);
}

void PurgeIfVanished(const FileSearch::__tag_FILE_INFO_DATA& row, const std::string& real_path,
                     _tag_SELECTCBDATA_& page) {
  if (access(real_path.c_str(), F_OK) == 0) return;
  page.consistent = false;
  // Rows that cannot be purged would come back for ever: the page is taken as it is.
  if (!dbTask->delRecs(row.share_name, real_path)) page.consistent = true;
}

// The user's folder below "homes". A local account's is named after it; that of a domain account
// must be looked up. False when it cannot be.
bool HomeFolder(_tag_SELECTCBDATA_& page, std::string& folder) {
  if (!page.user.empty() && page.user.find_first_of("\\@") == std::string::npos) {
    folder = page.user;
    return true;
  }
  if (page.home_folder.empty()) {
    char buffer[kPathChars + 1] = {};
    if (NUVAServiceHomePathGet(page.user.c_str(), buffer, sizeof(buffer)) < 0) return false;
    const char* homes = strstr(buffer, kHomesFolder);
    if (homes == nullptr) return false;
    page.home_folder = homes + strlen(kHomesFolder);
  }
  folder = page.home_folder;
  return true;
}

// Shows what lies in the user's own home below "/home". The folder is recognised in any letter
// case but cut off in its own; where that finds nothing the path stays as it is.
void MapToHome(const std::string& folder, const char* relative_path, std::string& share_path) {
  const std::string prefix = folder + "/";
  if (strncasecmp(relative_path, prefix.c_str(), prefix.size()) != 0) return;
  const char* found = strstr(relative_path, folder.c_str());
  if (found != nullptr) share_path = CutPath(std::string("/home") + (found + folder.size()));
}

std::string UpperCase(const char* text) {
  std::string upper = text;
  for (char& c : upper) c = static_cast<char>(toupper(static_cast<unsigned char>(c)));
  return upper;
}

// Permissions are asked of the record's real path, which is there only when it was asked for too.
void FillAttributes(const FileSearch::__tag_FILE_INFO_DATA& row, int additional,
                    DIRENTRY_INFO& file) {
  if ((additional & kSize) != 0) file.size = row.size;
  if ((additional & kType) != 0 && !row.is_dir) file.type = UpperCase(row.extension);
  if ((additional & kOwner) != 0) {
    file.user = row.owner_name;
    file.group = row.group_name;
    file.uid = row.uid;
    file.gid = row.gid;
  }
  if ((additional & kTime) != 0) {
    file.atime = static_cast<std::uint32_t>(row.atime);
    file.mtime = static_cast<std::uint32_t>(row.mtime);
    file.ctime = static_cast<std::uint32_t>(row.ctime);
    file.crtime = static_cast<std::uint32_t>(row.crtime);
  }
  if ((additional & kPerm) != 0) {
    file.mode = row.mode;
    file.acl_privilege = GetACLPrivilege(file.real_path.c_str());
    file.acl_mode = NUVAACLIsSupport(file.real_path.c_str(), kAclNoFd, kAclFlags) != 0;
  }
}

// Empties the list on the way, so that a large page is not held twice.
Json::Value RenderFiles(std::list<DIRENTRY_INFO>& files, int additional) {
  Json::Value rendered(Json::arrayValue);
  for (; !files.empty(); files.pop_front()) {
    Json::Value object;
    object.clear();
    DumpFileInfo(additional, files.front(), object, 0, 0);
    rendered.append(std::move(object));
  }
  return rendered;
}

}  // namespace

BOOL SelectFileInfoCB(FileSearch::__tag_FILE_INFO_DATA* row, void* context) {
  auto& page = *static_cast<_tag_SELECTCBDATA_*>(context);
  DIRENTRY_INFO file;
  const std::string real_path = RealPath(*row);
  if ((page.additional & kRealPath) != 0) file.real_path = real_path;
  PurgeIfVanished(*row, real_path, page);

  file.name = row->name;
  file.is_dir = row->is_dir;
  file.path = CutPath(std::string("/") + row->share_name + "/" + row->relative_path);
  if (page.home_enabled && strcasecmp(row->share_name, kHomesShare) == 0) {
    std::string folder;
    if (!HomeFolder(page, folder)) return 0;
    MapToHome(folder, row->relative_path, file.path);
  }
  FillAttributes(*row, page.additional, file);
  page.files->push_back(std::move(file));
  return StopRequested() ? 0 : 1;
}

// Only the low 32 bits of each count. False, with the error set, when one is no number.
bool ArboryFindHandler::RequestedPage(unsigned long& offset, unsigned long& limit) {
  try {
    offset = static_cast<std::uint32_t>(request()->GetParam("offset", 0).asInt64());
    limit = static_cast<std::uint32_t>(request()->GetParam("limit", 0).asInt64());
  } catch (...) {
    SetError(kCodeBadCall);
    return false;
  }
  if (limit == 0) limit = kAllRows;
  return true;
}

bool ArboryFindHandler::WebFMQueryResult(int additional, const char* volume, const char* id,
                                         Json::Value& response, const Json::Value& /*task_data*/,
                                         const char* sort_by, const bool* ascending,
                                         const _tag_dir_entry_type_* type, const char* pattern) {
  std::list<DIRENTRY_INFO> files;
  _tag_SELECTCBDATA_ page;
  page.additional = additional;
  page.files = &files;
  page.user = request()->GetLoginUserName();
  const UserRecord user = GetUser(page.user.c_str());
  if (!user) return false;
  page.home_enabled = NUVAServiceUserHomeIsEnabled(user->szName, user->nUid) != 0;

  const FileSearch::WfmSearchDBTaskMgr databases(page.user.c_str());
  dbTask = databases.getDBTask(volume, id);
  if (dbTask == nullptr) return false;
  unsigned long offset = 0;
  unsigned long limit = 0;
  if (!RequestedPage(offset, limit)) return false;

  unsigned long long total = 0;
  // Ends: each further pass follows a purge, and the first that purges nothing is the last.
  do {
    page.consistent = true;
    files.clear();
    if (!dbTask->queryResult(offset, limit, sort_by, ascending, type, pattern, SelectFileInfoCB,
                             &page, &total)) {
      syslog(LOG_ERR, "%s:%d Fail to select data from DB by %s", kLogSource,
             log_line::kSelectFailed, page.user.c_str());
      return false;
    }
  } while (!page.consistent);

  response["files"] = RenderFiles(files, additional);
  response["total"] = static_cast<Json::UInt>(total);
  response["offset"] = static_cast<Json::UInt>(offset);
  return true;
}
