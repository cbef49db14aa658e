#include "arbory/server/service/pages.h"

#include <fcntl.h>

#include <algorithm>

#include "arbory/server/service/installed.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/file_io.h"

namespace arbory {
namespace {

constexpr size_t kMaxFileBytes = size_t{16} << 20;
const std::string kBuiltWeb = "web/dist";
constexpr char kIndex[] = "index.html";
constexpr char kPacked[] = ".gz";     // behind a file's name: the same, as the build compressed it
constexpr char kAssets[] = "assets";  // files whose names tell their content
constexpr char kPolicy[] =
    "default-src 'none'; script-src 'self'; style-src 'self'; img-src 'self' blob: data:; "
    "connect-src 'self'; frame-src 'self'; form-action 'self'; base-uri 'none'; "
    "frame-ancestors 'none'";

std::string TypeOf(const std::string& name) {
  static constexpr std::pair<std::string_view, const char*> kTypes[] = {
      {".html", "text/html; charset=utf-8"},
      {".js", "text/javascript; charset=utf-8"},
      {".css", "text/css; charset=utf-8"},
      {".svg", "image/svg+xml"},
      {".png", "image/png"},
      {".ico", "image/x-icon"},
      {".json", "application/json"},
      {".webmanifest", "application/manifest+json"},
      {".txt", "text/plain; charset=utf-8"},
      {".woff2", "font/woff2"},
  };
  for (const auto& [end, type] : kTypes) {
    if (name.ends_with(end)) return type;
  }
  return "application/octet-stream";
}

// What the build compresses.
bool IsText(const std::string& name) {
  return name.ends_with(".html") || name.ends_with(".js") || name.ends_with(".css") ||
         name.ends_with(".svg");
}

bool IsPageFile(const std::string& name) {
  return !name.starts_with('.') && std::all_of(name.begin(), name.end(), [](char byte) {
    return (byte >= 'a' && byte <= 'z') || (byte >= 'A' && byte <= 'Z') ||
           (byte >= '0' && byte <= '9') || byte == '.' || byte == '-' || byte == '_';
  });
}

}  // namespace

std::string FindWebFolder(const std::string& configured) {
  if (!configured.empty()) return configured;
  return FindInstalled("web", kBuiltWeb, kIndex).value_or(ARBORY_SOURCE_DIR "/" + kBuiltWeb);
}

HttpReply PageReply(const std::string& folder, const std::vector<std::string>& path,
                    bool takes_gzip) {
  std::string file = path.empty() ? kIndex : path[0];
  const bool is_asset = path.size() == 2 && path[0] == kAssets;
  if (is_asset) file += "/" + path[1];
  const bool known =
      path.size() <= 1 + (is_asset ? 1U : 0U) && std::all_of(path.begin(), path.end(), IsPageFile);
  HttpReply reply;
  const auto read = [&](const std::string& name) {
    return nas::ReadWholeFile(AT_FDCWD, folder + "/" + name, kMaxFileBytes);
  };
  auto content = known ? read(file) : nas::ErrnoError(ENOENT, file);
  if (!content) {
    if (!path.empty()) return ErrorReply(kNotFound, "There is nothing here; open / for the page.");
    reply.body = "The page has not been built. Build it with scripts/build-page, then reload.\n";
    reply.status = kNotFound;
    reply.fields = {{"Content-Type", "text/plain; charset=utf-8"}, {"Cache-Control", "no-store"}};
    return reply;
  }
  reply.status = kOk;
  const bool is_text = IsText(file);
  auto packed = is_text && takes_gzip ? read(file + kPacked) : nas::ErrnoError(ENOENT, file);
  reply.body = std::move(packed ? *packed : *content);
  reply.fields = {{"Content-Type", TypeOf(file)},
                  {"Content-Security-Policy", kPolicy},
                  {"Cross-Origin-Opener-Policy", "same-origin"},
                  {"Permissions-Policy", "camera=(), microphone=(), geolocation=()"},
                  {"Cache-Control", is_asset ? "public, max-age=31536000, immutable" : "no-cache"}};
  if (is_text) reply.fields.emplace_back("Vary", "Accept-Encoding");
  if (packed) reply.fields.emplace_back("Content-Encoding", "gzip");
  return reply;
}

}  // namespace arbory
