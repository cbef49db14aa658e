// What a parent reads from its child's pipe: in which pieces it comes must not change what is read,
// and what is sent comes back.

#include <unistd.h>

#include <algorithm>
#include <cstring>

#include "nas/base/unique_fd.h"
#include "nas/system/child.h"
#include "tests/fuzz/fuzz.h"

namespace {

using State = nas::ReplyReader::State;

struct Reading {
  State state = State::kMore;
  nas::ReplyHead head;
  std::uint64_t body_bytes = 0;
  std::string body;  // as far as it came

  bool operator==(const Reading& other) const {
    if (state != other.state) return false;
    return state != State::kReady ||
           (head.status == other.head.status && head.code == other.head.code &&
            head.fields == other.head.fields && body_bytes == other.body_bytes &&
            body == other.body);
  }
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
  reading.head = reader.head();
  reading.body_bytes = reader.body_bytes();
  reading.body = reader.body_begin();
  DEMAND(reading.body.size() <= reading.body_bytes);
  reading.body += bytes.substr(0, reading.body_bytes - reading.body.size());
  return reading;
}

std::string WithLength(std::uint64_t length, std::string_view frame) {
  return std::string(reinterpret_cast<const char*>(&length), sizeof length) + std::string(frame);
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
  for (const auto& [name, value] : whole.head.fields) {
    DEMAND((name + value).find('\n') == std::string::npos);
  }
}

// What was read is sent again, as a child does it.
void CheckRoundTrip(const Reading& reading) {
  int ends[2];
  DEMAND(pipe(ends) == 0);
  const nas::UniqueFd readable(ends[0]);
  nas::UniqueFd writable(ends[1]);
  DEMAND(nas::SendReply(writable.get(), {reading.head, reading.body}));
  writable.Reset();
  std::string bytes(size_t{64} << 10, '\0');
  const ssize_t count = read(readable.get(), bytes.data(), bytes.size());
  DEMAND(count > 0);
  bytes.resize(static_cast<size_t>(count));
  Reading expected = reading;
  expected.body_bytes = expected.body.size();
  DEMAND(Read(bytes, bytes.size()) == expected);
}

}  // namespace

// A signed byte, by which the announced length differs from the true one, and the frame. The input
// is also read as it is.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  constexpr size_t kFitsPipe = size_t{16} << 10;
  if (size == 0 || size > kFitsPipe) return fuzz::kUseless;
  const std::string_view input = fuzz::Text(data, size);
  const std::string_view frame = input.substr(1);
  const std::uint64_t difference = static_cast<std::uint64_t>(static_cast<std::int8_t>(data[0]));
  const std::string bytes = WithLength(frame.size() + difference, frame);
  CheckReading(bytes);
  CheckReading(std::string(input));
  const Reading reading = Read(bytes, bytes.size());
  if (reading.state == State::kReady) CheckRoundTrip(reading);
  return fuzz::kUsed;
}
