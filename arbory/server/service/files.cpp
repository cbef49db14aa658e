#include "arbory/server/service/files.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <climits>

#include "arbory/server/transport/http_text.h"
#include "nas/base/file_io.h"
#include "nas/base/system_call.h"
#include "nas/system/child.h"
#include "nas/system/shares.h"
#include "platform/system.h"
#include "platform/webfm.h"

namespace arbory {
namespace {

constexpr char kHome[] = "home";
constexpr size_t kReadBytes = size_t{256} << 10;

// The browser draws what it shows of a preview with scripts, forms, and everything from elsewhere
// off. A PDF's own viewer does not start in a sandbox; it runs no scripts of the page.
constexpr char kPreviewPolicy[] =
    "default-src 'none'; img-src 'self'; style-src 'unsafe-inline'; frame-ancestors 'self'; "
    "sandbox";
constexpr char kPdfPolicy[] =
    "default-src 'none'; object-src 'self'; style-src 'unsafe-inline'; frame-ancestors 'self'";
constexpr char kPdf[] = "application/pdf";

// The identity for good: nothing in this child needs to be root again.
bool BecomeForGood(const std::string& user) {
  if (WfmLibUGIDSet(nullptr, user.c_str()) < 0) return false;
  const uid_t uid = geteuid();
  return setresuid(uid, uid, uid) == 0;
}

// The folder that stands for the share; invalid with errno set.
nas::UniqueFd OpenRoot(const FileRequest& request) {
  constexpr int kFlags = O_PATH | O_DIRECTORY | O_CLOEXEC;
  if (request.share == kHome) {
    char home[PATH_MAX];
    if (NUVAServiceHomePathGet(request.user.c_str(), home, sizeof home) != 0) {
      return nas::UniqueFd();
    }
    // The home must be the user's folder itself, so that no link stands for it.
    return nas::UniqueFd(open(home, kFlags | O_NOFOLLOW));
  }
  const auto share = nas::FindShare(request.share);
  if (!share) {
    errno = ENOENT;
    return nas::UniqueFd();
  }
  return nas::UniqueFd(open(share->root.empty() ? "/" : share->root.c_str(), kFlags));
}

nas::UniqueFd OpenBeneath(int root, const std::vector<std::string>& path) {
  std::string below;
  for (const std::string& segment : path) below += (below.empty() ? "" : "/") + segment;
  // Without O_NONBLOCK a pipe would be waited for; a terminal must not become this process's.
  return nas::OpenAt2(root, below.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY,
                      RESOLVE_BENEATH | RESOLVE_NO_MAGICLINKS);
}

void SendError(int pipe, int status, const char* sentence) {
  const HttpReply reply = ErrorReply(status, sentence);
  nas::SendReply(pipe, {{status, status, reply.fields}, reply.body});
}

// What is no file and what lies outside the share is as if it were not there.
void SendOpenError(int pipe, int error) {
  if (error == EACCES || error == EPERM) {
    SendError(pipe, kForbidden, "You may not read this file; ask its owner.");
  } else if (error == EIO || error == EMFILE || error == ENFILE || error == ENOMEM) {
    SendError(pipe, kUnavailable, "The file cannot be read now; try again later.");
  } else {
    SendError(pipe, kNotFound, "There is no such file; it may have been moved or deleted.");
  }
}

std::string HttpDate(time_t time) {
  constexpr size_t kRoom = 64;
  char text[kRoom];
  tm parts;
  gmtime_r(&time, &parts);
  return {text, strftime(text, sizeof text, "%a, %d %b %Y %H:%M:%S GMT", &parts)};
}

nas::ReplyHead HeadOf(const FileRequest& request, const struct stat& info, const ByteRange& range) {
  const std::string& name = request.path.back();
  const std::string type = request.preview ? PreviewType(name) : std::string();
  nas::ReplyHead head{range.partial ? kPartial : kOk, 0, {}};
  head.fields = {{"Content-Type", type.empty() ? "application/octet-stream" : type},
                 {"Content-Disposition", ContentDisposition(!type.empty(), name)},
                 {"Content-Security-Policy", type == kPdf ? kPdfPolicy : kPreviewPolicy},
                 {"Last-Modified", HttpDate(info.st_mtime)},
                 {"Accept-Ranges", "bytes"},
                 {"Cache-Control", "private, no-cache"}};
  if (range.partial) {
    head.fields.emplace_back("Content-Range", "bytes " + std::to_string(range.first) + "-" +
                                                  std::to_string(range.first + range.count - 1) +
                                                  "/" + std::to_string(info.st_size));
  }
  return head;
}

// Ends early when the file has become shorter: the server then ends the connection, which tells
// the client that it has not got all.
void SendBytes(int pipe, int file, const ByteRange& range) {
  std::string buffer(kReadBytes, '\0');
  for (std::uint64_t done = 0; done < range.count;) {
    const size_t wanted = std::min<std::uint64_t>(range.count - done, buffer.size());
    const ssize_t count = nas::Uninterrupted(
        [&] { return pread(file, buffer.data(), wanted, static_cast<off_t>(range.first + done)); });
    if (count <= 0) return;
    if (!nas::WriteAll(pipe, std::string_view(buffer.data(), static_cast<size_t>(count)))) return;
    done += static_cast<std::uint64_t>(count);
  }
}

void ServeFile(const FileRequest& request, int pipe) {
  if (!BecomeForGood(request.user)) {
    return SendError(pipe, kUnavailable, "The server cannot act as this user.");
  }
  const nas::UniqueFd root = OpenRoot(request);
  if (!root) return SendOpenError(pipe, errno);
  const nas::UniqueFd file = OpenBeneath(root.get(), request.path);
  if (!file) return SendOpenError(pipe, errno);
  struct stat info;
  if (fstat(file.get(), &info) != 0 || !S_ISREG(info.st_mode)) return SendOpenError(pipe, ENOENT);
  const auto size = static_cast<std::uint64_t>(info.st_size);
  const ByteRange range = ParseRange(request.range, size);
  if (!range.satisfiable) {
    const HttpReply reply = ErrorReply(kNotSatisfiable, "The file has none of these bytes.");
    nas::ReplyHead head{kNotSatisfiable, kNotSatisfiable, reply.fields};
    head.fields.emplace_back("Content-Range", "bytes */" + std::to_string(size));
    nas::SendReply(pipe, {head, reply.body});
    return;
  }
  if (!nas::SendHead(pipe, HeadOf(request, info, range), range.count) || request.head_only) return;
  SendBytes(pipe, file.get(), range);
}

bool ParseNumber(std::string_view text, std::uint64_t* number) {
  const auto parsed = std::from_chars(text.data(), text.data() + text.size(), *number);
  return parsed.ec == std::errc() && parsed.ptr == text.data() + text.size();
}

}  // namespace

nas::Child StartFile(const FileRequest& request) {
  return nas::StartChild([&](int pipe) { ServeFile(request, pipe); });
}

ByteRange ParseRange(const std::string& field, std::uint64_t size) {
  constexpr std::string_view kUnit = "bytes=";
  const ByteRange whole{0, size, false, true};
  if (!field.starts_with(kUnit)) return whole;
  const std::string_view range = std::string_view(field).substr(kUnit.size());
  const size_t dash = range.find('-');
  if (dash == std::string_view::npos) return whole;
  const std::string_view from = range.substr(0, dash);
  const std::string_view to = range.substr(dash + 1);
  std::uint64_t first = 0;
  std::uint64_t last = size == 0 ? 0 : size - 1;
  if (from.empty()) {  // the last so many bytes
    std::uint64_t count = 0;
    if (!ParseNumber(to, &count)) return whole;
    if (count == 0 || size == 0) return {0, 0, false, false};
    first = size - std::min(count, size);
  } else {
    if (!ParseNumber(from, &first)) return whole;
    if (!to.empty() && (!ParseNumber(to, &last) || last < first)) return whole;
    if (first >= size) return {0, 0, false, false};
    last = std::min(last, size - 1);
  }
  return {first, last - first + 1, true, true};
}

std::string PreviewType(const std::string& name) {
  static constexpr std::pair<std::string_view, std::string_view> kTypes[] = {
      {"png", "image/png"},   {"jpg", "image/jpeg"},  {"jpeg", "image/jpeg"}, {"gif", "image/gif"},
      {"webp", "image/webp"}, {"avif", "image/avif"}, {"pdf", kPdf},
  };
  // Shown as plain text whatever language they are in.
  static constexpr std::string_view kTexts[] = {
      "txt", "md", "log", "csv", "tsv", "json", "xml", "yaml", "yml", "ini", "conf", "cfg", "toml",
      "c",   "h",  "cpp", "hpp", "cc",  "py",   "js",  "ts",   "go",  "rs",  "java", "sh",  "sql"};
  const size_t dot = name.rfind('.');
  if (dot == std::string::npos) return {};
  const std::string extension = LowerCase(std::string_view(name).substr(dot + 1));
  for (const auto& [known, type] : kTypes) {
    if (extension == known) return std::string(type);
  }
  const bool text = std::find(std::begin(kTexts), std::end(kTexts), extension) != std::end(kTexts);
  return text ? "text/plain; charset=utf-8" : std::string();
}

}  // namespace arbory
