#include "arbory/server/transport/http_text.h"

#include <algorithm>

#include "nas/base/hex.h"
#include "nas/base/json_text.h"
#include "nas/base/utf8.h"

namespace arbory {
namespace {

constexpr int kBitsPerDigit = 4;
constexpr size_t kEscapeBytes = 3;  // "%2F"

bool IsUnreserved(char byte) {
  return (byte >= 'a' && byte <= 'z') || (byte >= 'A' && byte <= 'Z') ||
         (byte >= '0' && byte <= '9') || byte == '-' || byte == '.' || byte == '_' || byte == '~';
}

std::optional<std::string> Decoded(std::string_view text) {
  std::string out;
  while (!text.empty()) {
    if (text[0] != '%') {
      out += text[0];
      text.remove_prefix(1);
      continue;
    }
    const int high = text.size() > 1 ? nas::HexValue(text[1]) : -1;
    const int low = text.size() > 2 ? nas::HexValue(text[2]) : -1;
    if (high < 0 || low < 0) return std::nullopt;
    out += static_cast<char>((high << kBitsPerDigit) | low);
    text.remove_prefix(kEscapeBytes);
  }
  return out;
}

bool IsPlainSegment(const std::string& segment) {
  return !segment.empty() && segment != "." && segment != ".." &&
         std::none_of(segment.begin(), segment.end(),
                      [](char byte) { return byte == '/' || byte == '\0'; });
}

// The characters that turn the direction of what follows, each replaced by "_".
std::string WithoutTurns(std::string text) {
  static constexpr std::string_view kTurns[] = {
      "\u061C", "\u200E", "\u200F", "\u202A", "\u202B", "\u202C",
      "\u202D", "\u202E", "\u2066", "\u2067", "\u2068", "\u2069",
  };
  for (const std::string_view turn : kTurns) {
    for (size_t at = text.find(turn); at != std::string::npos; at = text.find(turn, at)) {
      text.replace(at, turn.size(), "_");
    }
  }
  return text;
}

}  // namespace

std::optional<std::vector<std::string>> SplitPath(std::string_view path) {
  std::vector<std::string> segments;
  if (!path.starts_with('/')) return std::nullopt;
  if (path == "/") return segments;
  while (!path.empty()) {
    path.remove_prefix(1);
    const std::string_view encoded = path.substr(0, path.find('/'));
    path.remove_prefix(encoded.size());
    auto segment = Decoded(encoded);
    if (!segment || !IsPlainSegment(*segment)) return std::nullopt;
    segments.push_back(std::move(*segment));
  }
  return segments;
}

std::optional<std::string> QueryValue(std::string_view query, std::string_view name) {
  while (!query.empty()) {
    const std::string_view pair = query.substr(0, query.find('&'));
    query.remove_prefix(std::min(query.size(), pair.size() + 1));
    const size_t equals = pair.find('=');
    if (pair.substr(0, equals) != name) continue;
    // Forms write a space as "+", and a "+" as %2B.
    std::string value(equals == std::string_view::npos ? "" : pair.substr(equals + 1));
    std::ranges::replace(value, '+', ' ');
    return Decoded(value);
  }
  return std::nullopt;
}

void UseHostOfTarget(HttpRequest* request) {
  constexpr std::string_view kScheme = "http://";
  constexpr std::string_view kTlsScheme = "https://";
  const std::string lower = LowerCase(request->target.substr(0, kTlsScheme.size()));
  const size_t scheme = lower.starts_with(kScheme)      ? kScheme.size()
                        : lower.starts_with(kTlsScheme) ? kTlsScheme.size()
                                                        : 0;
  if (scheme == 0) return;
  const size_t end = std::min(request->target.find_first_of("/?", scheme), request->target.size());
  const std::string host = request->target.substr(scheme, end - scheme);
  if (host.empty() || host.find('@') != std::string::npos) return;
  request->target.erase(0, end);
  if (!request->target.starts_with('/')) request->target.insert(0, "/");
  for (auto& [name, value] : request->fields) {
    if (name == "host") value = host;
  }
}

std::string PercentEncoded(std::string_view text) {
  std::string out;
  for (const char byte : text) {
    if (IsUnreserved(byte)) {
      out += byte;
    } else {
      out += '%';
      nas::AppendHex(static_cast<unsigned char>(byte), nas::kUpperHex, &out);
    }
  }
  return out;
}

std::string Cookie(const HttpRequest& request, std::string_view name) {
  for (const auto& [field, value] : request.fields) {
    if (field != "cookie") continue;
    std::string_view rest = value;
    while (!rest.empty()) {
      std::string_view pair = rest.substr(0, rest.find(';'));
      rest.remove_prefix(std::min(rest.size(), pair.size() + 1));
      while (pair.starts_with(' ')) pair.remove_prefix(1);
      const size_t equals = pair.find('=');
      if (equals != std::string_view::npos && pair.substr(0, equals) == name) {
        return std::string(pair.substr(equals + 1));
      }
    }
  }
  return {};
}

std::string ContentDisposition(bool inline_shown, const std::string& name) {
  std::string plain = name;
  for (char& byte : plain) {
    const bool safe = byte >= ' ' && byte <= '~' && byte != '"' && byte != '\\' && byte != '%';
    if (!safe) byte = '_';
  }
  return std::string(inline_shown ? "inline" : "attachment") + "; filename=\"" + plain +
         "\"; filename*=UTF-8''" + PercentEncoded(WithoutTurns(name));
}

std::string HttpDate(std::time_t time) {
  constexpr size_t kRoom = 64;
  char text[kRoom];
  std::tm parts;
  gmtime_r(&time, &parts);
  return {text, std::strftime(text, sizeof text, "%a, %d %b %Y %H:%M:%S GMT", &parts)};
}

std::string LowerCase(std::string_view text) {
  std::string lower(text);
  for (char& byte : lower) {
    if (byte >= 'A' && byte <= 'Z') byte = static_cast<char>(byte - 'A' + 'a');
  }
  return lower;
}

std::optional<Json::Value> JsonBody(const std::string& body) {
  Json::Value params(Json::objectValue);
  if (body.empty()) return params;
  const bool read = nas::ParseJson(body, &params, nas::kRequestMaxDepth);
  return read && params.isObject() ? std::optional(params) : std::nullopt;
}

HttpReply BadBodyReply() { return ErrorReply(kBadRequest, "The body must be one JSON object."); }

HttpReply JsonReply(int status, std::string body) {
  return {status,
          {{"Content-Type", "application/json"}, {"Cache-Control", "no-store"}},
          std::move(body)};
}

nas::Reply AsChildsReply(HttpReply reply) {
  return {{reply.status, reply.status, std::move(reply.fields)}, std::move(reply.body)};
}

HttpReply ErrorReply(int status, int code, std::string_view sentence) {
  Json::Value body;
  body["code"] = code;
  body["error"] = std::string(sentence);
  return JsonReply(status, nas::JsonText(body, nas::JsonBytes::kClean));
}

HttpReply ErrorReply(int status, std::string_view sentence) {
  return ErrorReply(status, status, sentence);
}

HttpReply NotAllowedReply(const std::string& allowed_methods) {
  HttpReply reply = ErrorReply(kNotAllowed, "Use " + allowed_methods + " here.");
  reply.fields.emplace_back("Allow", allowed_methods);
  return reply;
}

HttpReply BusyReply(int status, std::string_view sentence, const std::string& retry_seconds) {
  HttpReply reply = ErrorReply(status, sentence);
  reply.fields.emplace_back("Retry-After", retry_seconds);
  return reply;
}

}  // namespace arbory
