#pragma once
// What only machines of a fleet need of other libraries: signatures, and asking other machines. It
// lies in a library of its own, so that all others, who start in milliseconds, do not load it.

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace nas {

// The beginning of a reply whose body is passed on as it comes.
struct FleetHead {
  int status = 0;
  std::int64_t length = -1;    // of the body; -1: it does not say
  std::int64_t modified = -1;  // in seconds since 1970; -1: it does not say
  std::string range = {};      // Content-Range
};

// One request to a machine.
struct FleetRequest {
  std::string address;    // "http://HOST:PORT"
  std::string host = {};  // what the Host field says; empty: as the address has it
  std::string method = "POST";
  std::string target;  // "/fleet/..."
  std::string token;
  std::string body = {};
  int deadline_ms = 0;  // for the reply to be whole, or to begin where it is passed on
  // Where set, replies of the statuses 200, 206 and 416 go to these instead of into memory: the
  // head, and for the first two the body, in pieces. One that answers false ends the request.
  std::function<bool(const FleetHead& head)> take_head = {};
  std::function<bool(std::string_view piece)> take_piece = {};
};

struct FleetReply {
  enum class Outcome {
    kReply,  // status and body hold
    kDown,   // no connection, or one that broke off
    kLate,   // nothing whole by the deadline, or nothing further of what is passed on
    kTooLong,
  };
  Outcome outcome = Outcome::kDown;
  int status = 0;
  std::string body;
};

// Any number of requests at once, over connections that are kept. Belongs to one thread; not to be
// used on both sides of a fork.
class FleetClient {
 public:
  virtual ~FleetClient() = default;
  using Done = std::function<void(FleetReply reply)>;
  // Begins one; `done` is called from Run, once, and may begin others.
  virtual void Ask(const FleetRequest& request, Done done) = 0;
  // Goes on with what can go on without waiting; may call what Run calls.
  virtual void Step() = 0;
  // Until `stop` says so, which is asked first and then at least a few dozen times a second and may
  // begin requests, or all requests have ended. What has not ended then is broken off without a
  // word.
  virtual void Run(const std::function<bool()>& stop) = 0;
};

// Keys, signatures and hashes are bytes.
struct FleetLibrary {
  std::string (*sha256)(std::string_view text);
  // 64 bytes. The key is one of make_key's.
  std::string (*sign)(std::string_view text, const std::string& secret_key);
  bool (*is_signed)(std::string_view text, std::string_view signature,
                    const std::string& public_key);
  // Both keys of a new pair.
  void (*make_key)(std::string* secret_key, std::string* public_key);
  // For a process that forks others which ask: what the client sets up once, they inherit.
  void (*prepare_client)();
  // Replies longer than `most_bytes` are not read to their end. `socket`: of a proxy that all
  // connections go to; empty for none. The caller deletes it.
  FleetClient* (*new_client)(const std::string& socket, size_t most_bytes);
};

inline constexpr char kFleetLibraryEntry[] = "ArboryFleetLibrary";
using FleetLibraryEntry = const FleetLibrary* (*)();

// Loads it for the rest of the process. Throws std::runtime_error where it cannot be had.
const FleetLibrary& LoadFleetLibrary();

}  // namespace nas
