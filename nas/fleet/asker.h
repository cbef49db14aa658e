#pragma once
// Asking boxes in a user's name, many at once, and what became of each.

#include <json/value.h>

#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "nas/fleet/library.h"
#include "nas/fleet/signer.h"
#include "nas/system/config.h"

namespace nas {

enum class BoxState {
  kAsked,     // not known yet
  kAnswered,  // to the end
  kLate,      // said nothing by the deadline
  kDown,      // cannot be reached, or what it says cannot be used
  kRefused,   // does not know this front, user or folder, or has no place
  kOld,       // does not understand the question
};
inline constexpr int kBoxStates = 6;
// "asked", "answered", "late", "down", "refused", "old".
const char* BoxStateName(BoxState state);

struct BoxAnswer {
  BoxState state = BoxState::kDown;
  std::string why;   // a few words, of one that has not answered
  int status = 0;    // of HTTP; 0 without a reply
  std::string body;  // of one that has
};

class FleetAsker {
 public:
  // Borrows the settings. Answers longer than `most_bytes` count as no answers. The process must
  // have a signer (signer.h) and be the one that uses the object. Throws std::runtime_error where
  // the fleet's library cannot be loaded.
  FleetAsker(const FleetSettings& fleet, size_t most_bytes);

  struct Request {
    std::string method = "POST";
    std::string target;
    std::string body = {};
    int wait_ms = 0;  // that the box may take beyond the deadline, as it was asked to
    // As of FleetRequest.
    std::function<bool(const FleetHead& head)> take_head = {};
    std::function<bool(std::string_view piece)> take_piece = {};
  };
  using Done = std::function<void(BoxAnswer answer)>;
  // `done` is called from Run, once, and may ask again. The box must live as long. A box whose
  // clock is off by no more than kMostClockOff is asked once more, by its own time.
  void Ask(const FleetBox& box, Request request, Done done);
  // Until all boxes have answered or `stop` says so, which is asked a few dozen times a second.
  void Run(const std::function<bool()>& stop);

 private:
  // What waits for its token.
  struct Waiting {
    const FleetBox* box;
    Request request;
    int clock_offset;
    Done done;
  };
  void Prepare(const FleetBox& box, Request request, int clock_offset, Done done);
  void SendSigned();
  void Send(Waiting waiting, const std::string& token);
  bool SendAgain(const Waiting& asked, const FleetReply& reply);

  const FleetSettings& fleet_;
  std::unique_ptr<FleetClient> client_;
  std::deque<Waiting> waiting_;
  FleetTokens tokens_;
  std::map<std::string, int> offsets_;  // of boxes' clocks, in seconds
};

// The box of that name in the configuration; null where there is none.
const FleetBox* FindFleetBox(const std::string& name);

// The shares of all boxes that the user can enter, as "BOX/SHARE", appended to `shares`; and of
// each box that has not answered its state, in `troubles`.
void AppendFleetShares(Json::Value* shares, Json::Value* troubles);

}  // namespace nas
