#pragma once
// Any bytes as text of 64 letters and digits (RFC 4648, with padding).

#include <string>
#include <string_view>

namespace nas {

void AppendBase64(std::string_view bytes, std::string* out);

}  // namespace nas
