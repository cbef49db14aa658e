#pragma once
// What a front shows a box with each request: who asks, of whom, what, and when, signed with the
// front's key. Text without spaces, parts joined by dots:
//
//   1.FRONT.USER.BOX.HASH.ISSUED.NONCE.SIGNATURE
//
// FRONT and BOX are names, which have no dots; USER is hexadecimal, of USER@REALM; HASH is the
// SHA-256, hexadecimal, of the request's method, a space, its target, a line's end and its body;
// ISSUED is in seconds since 1970, NONCE a random name (random_name.h) and SIGNATURE, hexadecimal,
// Ed25519 over kTokenContext and all that stands before its dot. A token holds for kTokenSeconds,
// for one request.

#include <ctime>
#include <optional>
#include <string>
#include <string_view>

namespace nas {

inline constexpr char kTokenContext[] = "arbory-fleet:";
inline constexpr int kTokenSeconds = 30;
// How far a front's clock may be ahead unnoticed. One that is off by more, but by no more than
// kMostClockOff, signs again by the box's time.
inline constexpr int kTokenFutureSeconds = 5;
inline constexpr int kMostClockOff = 300;

struct FleetToken {
  std::string front;
  std::string user;  // USER@REALM, or USER
  std::string box;
  std::string hash;  // hexadecimal
  std::time_t issued = 0;
  std::string nonce;
};

// What a token's hash is of.
std::string RequestHash(std::string_view method, std::string_view target, std::string_view body);

// Throws std::runtime_error where the fleet's library cannot be loaded.
std::string SignedToken(const FleetToken& token, const std::string& secret_key);

// A token as it came. Nothing in it is true before IsGenuine has said so.
struct ReceivedToken {
  FleetToken said;
  std::string signed_text;
  std::string signature;
};
std::optional<ReceivedToken> ReadToken(std::string_view text);
bool IsGenuine(const ReceivedToken& token, const std::string& public_key);

std::string ToHex(std::string_view bytes);
// Nothing for what is not hexadecimal.
std::optional<std::string> FromHex(std::string_view digits);

}  // namespace nas
