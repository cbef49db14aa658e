#include "arbory/server/service/gzip.h"

#include <zlib.h>

#include <algorithm>

#include "arbory/server/transport/http_text.h"

namespace arbory {
namespace {

// One packet holds it anyway.
constexpr size_t kLeastBytes = 1200;
// Of what is compressed at once, in memory: some 40 ms of one processor. A longer reply goes to a
// program, and lies in a file by then.
constexpr size_t kMostBytes = size_t{2} << 20;
// Listings: a ninth of their size at 100 MB/s; the levels above take several times as long for a
// tenth less.
constexpr int kLevel = 4;
constexpr int kMemoryLevel = 8;
constexpr int kGzipWindow = 15 + 16;  // the format's header instead of zlib's

std::string_view Trimmed(std::string_view text) {
  while (text.starts_with(' ')) text.remove_prefix(1);
  while (text.ends_with(' ')) text.remove_suffix(1);
  return text;
}

// "gzip", "gzip;q=0.5"; not "gzip;q=0".
bool Names(std::string_view coding, std::string_view name) {
  const size_t semicolon = coding.find(';');
  if (LowerCase(Trimmed(coding.substr(0, semicolon))) != name) return false;
  if (semicolon == std::string_view::npos) return true;
  const std::string weight = LowerCase(Trimmed(coding.substr(semicolon + 1)));
  return weight.starts_with("q=") && weight.find_first_of("123456789") != std::string::npos;
}

std::string Compressed(const std::string& text) {
  z_stream stream = {};
  if (deflateInit2(&stream, kLevel, Z_DEFLATED, kGzipWindow, kMemoryLevel, Z_DEFAULT_STRATEGY) !=
      Z_OK) {
    return {};
  }
  std::string out(deflateBound(&stream, text.size()), '\0');
  // The library's interface takes no const.
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(text.data()));
  stream.avail_in = static_cast<uInt>(text.size());
  stream.next_out = reinterpret_cast<Bytef*>(out.data());
  stream.avail_out = static_cast<uInt>(out.size());
  const bool whole = deflate(&stream, Z_FINISH) == Z_STREAM_END;
  out.resize(whole ? stream.total_out : 0);
  deflateEnd(&stream);
  return out;
}

}  // namespace

bool TakesGzip(const HttpRequest& request) {
  const std::string* field = request.Field("accept-encoding");
  if (field == nullptr) return false;
  for (std::string_view rest = *field; !rest.empty();) {
    const std::string_view coding = rest.substr(0, rest.find(','));
    rest.remove_prefix(std::min(rest.size(), coding.size() + 1));
    if (Names(coding, "gzip")) return true;
  }
  return false;
}

nas::Reply Gzipped(nas::Reply reply) {
  const size_t size = reply.body.size();
  if (reply.beginning || size < kLeastBytes || size > kMostBytes) return reply;
  std::string body = Compressed(reply.body);
  if (body.empty() || body.size() >= size) return reply;
  reply.body = std::move(body);
  if (reply.head.fields.empty()) reply.head.fields = JsonReply(kOk, "").fields;
  reply.head.fields.emplace_back("Content-Encoding", "gzip");
  return reply;
}

}  // namespace arbory
