#pragma once
// Runs one API call as the web API server does: forks a request child (nas/system/child.h), becomes
// the user there, calls the entry function of the table's row and receives one reply. A search
// worker that the call forks lives on after the child; what it leaves in its copy of the response,
// when it falls back into the request's path, is dropped. For a process of one thread, as every
// fork is.

#include <functional>
#include <optional>
#include <string>

#include "nas/system/child.h"
#include "platform/webapi.h"

namespace nas {

struct ApiCall {
  std::string method;  // as the client spelled it
  Json::Value params;  // an object, or null for none
  std::string user;
  std::string session;
  // A search that the call begins ends when nobody has asked after it for Config::lease_seconds,
  // and its results go with it.
  bool leased = false;
  // Where given, makes `params` in the request child, as the user: reading what a client sent costs
  // time and memory that nobody else shall wait for. Gives the reply instead when it cannot.
  std::function<std::optional<Reply>(Json::Value* params)> read_params = {};
  // Where given, what becomes of the reply before it is sent; in the request child too.
  std::function<Reply(Reply)> finish = {};
  // The call may ask the boxes of a fleet in the user's name (nas/fleet/signer.h).
  bool asks_fleet = false;
  // Where given, is asked in the request child before that becomes the user, and gives the reply
  // where it may not be.
  std::function<std::optional<Reply>()> admit = {};
};

// Turns the entry function's reply into what is sent. Runs in the request child, so that a caller
// that needs only part of a large reply need not ship the rest of it. Called when the entry
// function sets its reply, so that a large one is not copied first.
using ReplyEncoder = std::function<Reply(int code, const Json::Value& data)>;
// Status 200 and the body {"code":N,"data":...}, one line of valid UTF-8 without a newline.
Reply EncodeJsonReply(int code, const Json::Value& data);

constexpr int kCodeBadRequest = 400;      // a parameter that asks for too much
constexpr int kCodeUnknownFailure = 100;  // an exception or a death inside the call

// For a process that makes calls, before the first one: loads what each of their children would
// load anew (the name service's libraries, SQLite's tables) and now inherits.
void PrepareForCalls();

// Forks the request child. Its pid is -1 with errno set when that fails.
Child StartCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode);

// Makes the call and waits for its reply and for the end of the request child. A call that cannot
// be made or answers nothing yields encode(kCodeUnknownFailure, null).
Reply RunCall(const NUVA::APIMethod& row, const ApiCall& call, const ReplyEncoder& encode);

// The second half of RunCall, for a call begun with StartCall. A process that is about to end
// itself need not wait for the child's end, which takes as long as a short call: whoever reaps the
// one then reaps the other.
enum class ChildsEnd { kAwaited, kLeft };
Reply FinishCall(Child child, const ReplyEncoder& encode, ChildsEnd end = ChildsEnd::kAwaited);

}  // namespace nas
