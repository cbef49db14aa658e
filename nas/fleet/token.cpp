#include "nas/fleet/token.h"

#include <charconv>
#include <vector>

#include "nas/base/hex.h"
#include "nas/base/random_name.h"
#include "nas/fleet/library.h"

namespace nas {
namespace {

constexpr char kVersion[] = "1";
constexpr size_t kParts = 8;
// Two names, a user's, and what has a length of its own.
constexpr size_t kMostBytes = 1024;

std::string TextToSign(const FleetToken& token) {
  return std::string(kVersion) + "." + token.front + "." + ToHex(token.user) + "." + token.box +
         "." + token.hash + "." + std::to_string(token.issued) + "." + token.nonce;
}

std::vector<std::string_view> PartsOf(std::string_view text) {
  std::vector<std::string_view> parts;
  while (parts.size() < kParts) {
    const size_t end = text.find('.');
    parts.push_back(text.substr(0, end));
    if (end == std::string_view::npos) return parts;
    text.remove_prefix(end + 1);
  }
  return {};  // more than there are
}

}  // namespace

std::string ToHex(std::string_view bytes) {
  std::string text;
  for (const char byte : bytes) AppendHex(static_cast<unsigned char>(byte), kLowerHex, &text);
  return text;
}

std::optional<std::string> FromHex(std::string_view digits) {
  constexpr int kBitsPerDigit = 4;
  if (digits.size() % 2 != 0) return std::nullopt;
  std::string bytes;
  for (size_t at = 0; at < digits.size(); at += 2) {
    const int high = HexValue(digits[at]);
    const int low = HexValue(digits[at + 1]);
    if (high < 0 || low < 0) return std::nullopt;
    bytes.push_back(static_cast<char>((high << kBitsPerDigit) | low));
  }
  return bytes;
}

std::string RequestHash(std::string_view method, std::string_view target, std::string_view body) {
  std::string text(method);
  text.append(" ").append(target).append("\n").append(body);
  return ToHex(LoadFleetLibrary().sha256(text));
}

std::string SignedToken(const FleetToken& token, const std::string& secret_key) {
  const std::string text = TextToSign(token);
  return text + "." + ToHex(LoadFleetLibrary().sign(kTokenContext + text, secret_key));
}

std::optional<ReceivedToken> ReadToken(std::string_view text) {
  if (text.size() > kMostBytes) return std::nullopt;
  const auto parts = PartsOf(text);
  if (parts.size() != kParts || parts[0] != kVersion) return std::nullopt;
  const auto user = FromHex(parts[2]);
  const auto signature = FromHex(parts[7]);
  ReceivedToken token;
  std::int64_t issued = 0;
  const char* end = parts[5].data() + parts[5].size();
  const auto number = std::from_chars(parts[5].data(), end, issued);
  if (!user || !signature || number.ec != std::errc() || number.ptr != end ||
      !IsRandomName(parts[6])) {
    return std::nullopt;
  }
  token.said = {std::string(parts[1]), *user,  std::string(parts[3]),
                std::string(parts[4]), issued, std::string(parts[6])};
  token.signed_text = kTokenContext + std::string(text.substr(0, text.rfind('.')));
  token.signature = *signature;
  return token;
}

bool IsGenuine(const ReceivedToken& token, const std::string& public_key) {
  return LoadFleetLibrary().is_signed(token.signed_text, token.signature, public_key);
}

}  // namespace nas
