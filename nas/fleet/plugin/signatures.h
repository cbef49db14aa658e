#pragma once
// See FleetLibrary.

#include <string>
#include <string_view>

namespace nas {

// False where nothing of this can be used.
bool PrepareSignatures();
std::string Sha256(std::string_view text);
std::string Sign(std::string_view text, const std::string& secret_key);
bool IsSigned(std::string_view text, std::string_view signature, const std::string& public_key);
void MakeKey(std::string* secret_key, std::string* public_key);

}  // namespace nas
