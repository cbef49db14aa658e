#include "arbory/server/service/files.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <climits>

#include "arbory/server/service/fleet_files.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/file_io.h"
#include "nas/base/json_text.h"
#include "nas/base/system_call.h"
#include "nas/match/content_scanner.h"
#include "nas/match/text_window.h"
#include "nas/system/child.h"
#include "nas/system/config.h"
#include "nas/system/identity.h"
#include "nas/system/shares.h"
#include "platform/system.h"

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
nas::Status BecomeForGood(const std::string& user) {
  const auto account = nas::BecomeUser(user);
  if (!account) return account.error();
  nas::GiveUpRoot();
  return {};
}

nas::Result<nas::UniqueFd> OpenFolder(const std::string& path, int more_flags) {
  nas::UniqueFd folder(open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC | more_flags));
  if (!folder) return nas::ErrnoError(path);
  return folder;
}

// The folder that stands for the share.
nas::Result<nas::UniqueFd> OpenRoot(const FileRequest& request) {
  if (request.share == kHome) {
    char home[PATH_MAX];
    if (NUVAServiceHomePathGet(request.user.c_str(), home, sizeof home) != 0) {
      return nas::ErrnoError(kHome);
    }
    // The home must be the user's folder itself, so that no link stands for it.
    return OpenFolder(home, O_NOFOLLOW);
  }
  const auto share = nas::FindShare(request.share);
  if (!share) return nas::ErrnoError(ENOENT, request.share);
  return OpenFolder(share->root.empty() ? "/" : share->root, 0);
}

struct RegularFile {
  nas::UniqueFd fd;
  struct stat info = {};
};

// ENOENT for what is no file.
nas::Result<RegularFile> OpenFile(const FileRequest& request) {
  const auto root = OpenRoot(request);
  if (!root) return root.error();
  std::string below;
  for (const std::string& segment : request.path) below += (below.empty() ? "" : "/") + segment;
  RegularFile file;
  // Without O_NONBLOCK a pipe would be waited for; a terminal must not become this process's.
  file.fd = nas::OpenAt2(root->get(), below.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY,
                         RESOLVE_BENEATH | RESOLVE_NO_MAGICLINKS);
  if (!file.fd) return nas::ErrnoError(below);
  if (fstat(file.fd.get(), &file.info) != 0 || !S_ISREG(file.info.st_mode)) {
    return nas::ErrnoError(ENOENT, below);
  }
  return file;
}

void SendError(int pipe, int status, const char* sentence) {
  nas::SendReply(pipe, AsChildsReply(ErrorReply(status, sentence)));
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

// Whether the child is the user for good now; otherwise it has answered.
bool Enter(const FileRequest& request, int pipe) {
  if (request.admit) {
    if (const auto refusal = request.admit()) {
      nas::SendReply(pipe, *refusal);
      return false;
    }
  }
  if (BecomeForGood(request.user)) return true;
  SendError(pipe, kUnavailable, "The server cannot act as this user.");
  return false;
}

void ServeFile(const FileRequest& request, int pipe) {
  if (!Enter(request, pipe)) return;
  const auto file = OpenFile(request);
  if (!file) return SendOpenError(pipe, file.error().error_number);
  const auto size = static_cast<std::uint64_t>(file->info.st_size);
  const ByteRange range = ParseRange(request.range, size);
  if (!range.satisfiable) {
    nas::SendReply(pipe, NoSuchBytes(size));
    return;
  }
  const nas::ReplyHead head = FileHead(request, size, file->info.st_mtime, range);
  if (!nas::SendHead(pipe, head, range.count) || request.head_only) return;
  SendBytes(pipe, file->fd.get(), range);
}

Json::Value LineJson(const std::optional<nas::MatchingLine>& line) {
  Json::Value body;
  body["line"] = line ? Json::Value(Json::UInt64{line->number}) : Json::Value();
  Json::Value& parts = body["parts"] = Json::Value(Json::arrayValue);
  if (!line) return body;
  size_t at = 0;
  for (const auto& [from, length] : line->marks) {
    parts.append(line->text.substr(at, from - at));
    parts.append(line->text.substr(from, length));
    at = from + length;
  }
  parts.append(line->text.substr(at));
  return body;
}

// What is shown of a text: enough to tell what it is, with the line in sight; more would make the
// page slow, not the reader wiser.
void AddText(int file, std::uint64_t line, Json::Value* body) {
  constexpr size_t kBefore = size_t{16} << 10;
  constexpr size_t kAfter = size_t{112} << 10;
  const auto window = nas::TextAround(file, line, kBefore, kAfter);
  Json::Value& text = (*body)["text"];
  if (!window) return;
  text["first_line"] = Json::UInt64{window->first_line};
  text["before"] = window->before;
  text["after"] = window->after;
  text["text"] = window->text;
}

void ServeFirstLine(const FileRequest& request, const std::string& pattern, bool with_text,
                    int pipe) {
  constexpr size_t kMostLineBytes = 400;  // more than a row of the page can show
  if (!Enter(request, pipe)) return;
  const auto parsed = nas::Query::Parse(pattern);
  if (!parsed) return SendError(pipe, kBadRequest, parsed.error().path.c_str());
  const auto file = OpenFile(request);
  if (!file) return SendOpenError(pipe, file.error().error_number);
  const int never = 0;
  std::optional<nas::MatchingLine> line;
  for (const nas::ContentQuery& query : nas::ContentQuery::ForLines(parsed->root())) {
    if (line || lseek(file->fd.get(), 0, SEEK_SET) != 0) break;
    line = nas::ContentScanner(query, never).FirstLine(file->fd.get(), kMostLineBytes);
  }
  Json::Value body = LineJson(line);
  if (with_text) AddText(file->fd.get(), line ? line->number : 1, &body);
  const std::string text = nas::JsonText(body, nas::JsonBytes::kClean);
  nas::SendReply(pipe, AsChildsReply(JsonReply(kOk, text)));
}

bool ParseNumber(std::string_view text, std::uint64_t* number) {
  const auto parsed = std::from_chars(text.data(), text.data() + text.size(), *number);
  return parsed.ec == std::errc() && parsed.ptr == text.data() + text.size();
}

}  // namespace

nas::Child StartFile(const FileRequest& request) {
  const bool elsewhere = IsOnBox(request);
  return nas::StartChild(
      [&](int pipe) { elsewhere ? PassFileOn(request, pipe) : ServeFile(request, pipe); });
}

nas::Child StartFirstLine(const FileRequest& request, const std::string& pattern, bool with_text) {
  const bool elsewhere = IsOnBox(request);
  return nas::StartChild(
      [&](int pipe) {
        elsewhere ? PassFirstLineOn(request, pattern, with_text, pipe)
                  : ServeFirstLine(request, pattern, with_text, pipe);
      },
      nas::CurrentConfig().call_memory_bytes());
}

nas::ReplyHead FileHead(const FileRequest& request, std::uint64_t size, std::time_t modified,
                        const ByteRange& range) {
  const std::string& name = request.path.back();
  const auto type = request.preview ? PreviewType(name) : std::nullopt;
  nas::ReplyHead head{range.partial ? kPartial : kOk, 0, {}};
  head.fields = {{"Content-Type", type.value_or("application/octet-stream")},
                 {"Content-Disposition", ContentDisposition(type.has_value(), name)},
                 {"Content-Security-Policy", type == kPdf ? kPdfPolicy : kPreviewPolicy},
                 {"Last-Modified", HttpDate(modified)},
                 {"Accept-Ranges", "bytes"},
                 {"Cache-Control", "private, no-cache"}};
  if (range.partial) {
    head.fields.emplace_back("Content-Range", "bytes " + std::to_string(range.first) + "-" +
                                                  std::to_string(range.first + range.count - 1) +
                                                  "/" + std::to_string(size));
  }
  return head;
}

nas::Reply NoSuchBytes(std::uint64_t size) {
  const HttpReply reply = ErrorReply(kNotSatisfiable, "The file has none of these bytes.");
  nas::ReplyHead head{kNotSatisfiable, kNotSatisfiable, reply.fields};
  head.fields.emplace_back("Content-Range", "bytes */" + std::to_string(size));
  return {head, reply.body};
}

ByteRange ParseRange(const std::optional<std::string>& field, std::uint64_t size) {
  constexpr std::string_view kUnit = "bytes=";
  const ByteRange whole{0, size, false, true};
  if (!field || !field->starts_with(kUnit)) return whole;
  const std::string_view range = std::string_view(*field).substr(kUnit.size());
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

std::optional<std::string> PreviewType(const std::string& name) {
  static constexpr std::pair<std::string_view, std::string_view> kTypes[] = {
      {"png", "image/png"},   {"jpg", "image/jpeg"},  {"jpeg", "image/jpeg"}, {"gif", "image/gif"},
      {"webp", "image/webp"}, {"avif", "image/avif"}, {"pdf", kPdf},
  };
  // Shown as plain text whatever language they are in.
  static constexpr std::string_view kTexts[] = {
      "txt", "md", "log", "csv", "tsv", "json", "xml", "yaml", "yml", "ini", "conf", "cfg", "toml",
      "c",   "h",  "cpp", "hpp", "cc",  "py",   "js",  "ts",   "go",  "rs",  "java", "sh",  "sql"};
  const size_t dot = name.rfind('.');
  if (dot == std::string::npos) return std::nullopt;
  const std::string extension = LowerCase(std::string_view(name).substr(dot + 1));
  for (const auto& [known, type] : kTypes) {
    if (extension == known) return std::string(type);
  }
  if (std::find(std::begin(kTexts), std::end(kTexts), extension) == std::end(kTexts)) {
    return std::nullopt;
  }
  return "text/plain; charset=utf-8";
}

}  // namespace arbory
