// What a parent reads from its child's pipe: in which pieces it comes must not change what is read.

#include <algorithm>
#include <cstring>
#include <vector>

#include "nas/system/child.h"
#include "tests/fuzz/fuzz.h"

namespace {

using State = nas::ReplyReader::State;

struct Reading {
  State state = State::kMore;
  int status = 0, code = 0;
  std::vector<std::pair<std::string, std::string>> fields;
  std::uint64_t body_bytes = 0;
  std::string body;  // as far as it came
  bool operator==(const Reading&) const = default;
};

// As a connection reads: the head, and then as many bytes of the body as were announced.
Reading Read(std::string_view bytes, size_t piece) {
  Reading reading;
  nas::ReplyReader reader;
  while (!bytes.empty() && reading.state == State::kMore) {
    reading.state = reader.Feed(bytes.substr(0, piece));
    bytes.remove_prefix(std::min(piece, bytes.size()));
  }
  if (reading.state != State::kReady) return reading;
  const nas::ReplyHead& head = reader.head();
  reading = {State::kReady, head.status,         head.code,
             head.fields,   reader.body_bytes(), std::string(reader.body_begin())};
  DEMAND(reading.body.size() <= reading.body_bytes);
  reading.body += bytes.substr(0, reading.body_bytes - reading.body.size());
  return reading;
}

// Within the frame: neither a field nor the body holds a byte that stands behind its announced end.
void CheckReading(const std::string& bytes) {
  const Reading whole = Read(bytes, bytes.size());
  for (const size_t piece : {1, 2, 7, 9, 100}) DEMAND(Read(bytes, piece) == whole);
  if (whole.state != State::kReady) return;
  std::uint64_t length = 0;
  std::memcpy(&length, bytes.data(), sizeof length);
  const std::string frame = bytes.substr(sizeof length, length);
  const size_t head_bytes = frame.find("\n\n") + 2;
  DEMAND(head_bytes >= 2 && whole.body_bytes == length - head_bytes);
  DEMAND(whole.body == frame.substr(head_bytes));
  for (const auto& [name, value] : whole.fields) {
    DEMAND((name + value).find('\n') == std::string::npos);
  }
}

}  // namespace

// A signed byte, by which the announced length differs from the true one, and the frame. The input
// is also read as it is.
int fuzz::Target(std::string_view input) {
  constexpr size_t kMostBytes = size_t{16} << 10;
  if (input.empty() || input.size() > kMostBytes) return fuzz::kUseless;
  const std::string_view frame = input.substr(1);
  const auto difference = static_cast<std::uint64_t>(static_cast<signed char>(input[0]));
  const std::uint64_t length = frame.size() + difference;
  CheckReading(std::string(reinterpret_cast<const char*>(&length), sizeof length).append(frame));
  CheckReading(std::string(input));
  return fuzz::kUsed;
}
