#pragma once
// What travels on a connection to the index daemon, in both directions: frames,
//
//   a 32-bit number   bytes of the payload, in host order
//   a byte            what the payload is (FrameType)
//   payload
//
// Both ends are of one machine and one build: there is no version here but that of the hello
// (client.h). Nothing is read ahead, so a connection can be handed on between two frames.

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "nas/base/error.h"

namespace nas {

enum class FrameType : unsigned char {
  kStatus = 's',      // daemon: kIndexCurrent, or a few words why there is no answer
  kQuestion = 'q',    // asker: JSON
  kRows = 'r',        // daemon: a block of rows
  kCandidates = 'c',  // daemon: files whose contents the asker is to read
  kProgress = 'p',    // daemon: counts
  kUnread = 'u',      // daemon: a folder that could not be read
  kEnd = 'e',         // daemon: that was all
};

struct Frame {
  FrameType type = FrameType::kStatus;
  std::string payload;
};

// Of a question: as much as a list of very many locations and patterns takes.
inline constexpr size_t kMaxQuestionBytes = size_t{1} << 20;
// Of what the daemon sends.
inline constexpr size_t kMaxAnswerBytes = size_t{16} << 20;

// Sends all of it, waiting where the connection makes it wait. EPIPE, and no signal, where the
// other end is gone.
Status SendFrame(int connection, FrameType type, std::string_view payload);

// Takes frames off one connection, which is borrowed. For one thread.
class FrameReader {
 public:
  enum class State {
    kFrame,   // one was put into `frame`
    kNotYet,  // the time has passed; ask again, nothing is lost
    kEnded,   // the other end is gone, between two frames
    kBroken,  // it went within a frame, or said what no frame is, or is too long
  };
  FrameReader(int connection, size_t max_payload_bytes)
      : connection_(connection), max_payload_bytes_(max_payload_bytes) {}

  // Waits at most so many milliseconds in all; -1: without an end. A signal does not end the wait.
  State Read(int timeout_ms, Frame* frame);

 private:
  int connection_;
  size_t max_payload_bytes_;
  std::string bytes_;  // of the frame that is under way
  size_t wanted_ = 0;  // its length, head included, once that is known
};

}  // namespace nas
