// Ed25519 and SHA-256, by libsodium.

#include "nas/fleet/plugin/signatures.h"

#include <sodium.h>

namespace nas {
namespace {

const unsigned char* Bytes(std::string_view text) {
  return reinterpret_cast<const unsigned char*>(text.data());
}
unsigned char* Room(std::string& text) { return reinterpret_cast<unsigned char*>(text.data()); }

}  // namespace

bool PrepareSignatures() { return sodium_init() >= 0; }

std::string Sha256(std::string_view text) {
  std::string hash(crypto_hash_sha256_BYTES, '\0');
  crypto_hash_sha256(Room(hash), Bytes(text), text.size());
  return hash;
}

std::string Sign(std::string_view text, const std::string& secret_key) {
  if (secret_key.size() != crypto_sign_SECRETKEYBYTES) return {};
  std::string signature(crypto_sign_BYTES, '\0');
  crypto_sign_detached(Room(signature), nullptr, Bytes(text), text.size(), Bytes(secret_key));
  return signature;
}

bool IsSigned(std::string_view text, std::string_view signature, const std::string& public_key) {
  return signature.size() == crypto_sign_BYTES && public_key.size() == crypto_sign_PUBLICKEYBYTES &&
         crypto_sign_verify_detached(Bytes(signature), Bytes(text), text.size(),
                                     Bytes(public_key)) == 0;
}

void MakeKey(std::string* secret_key, std::string* public_key) {
  secret_key->assign(crypto_sign_SECRETKEYBYTES, '\0');
  public_key->assign(crypto_sign_PUBLICKEYBYTES, '\0');
  crypto_sign_keypair(Room(*public_key), Room(*secret_key));
}

}  // namespace nas
