#include "nas/fleet/asker.h"

#include <algorithm>
#include <cstdlib>
#include <ctime>
#include <map>
#include <utility>

#include "nas/base/json_text.h"
#include "nas/fleet/token.h"

namespace nas {
namespace {

constexpr int kOk = 200;
constexpr int kPartial = 206;
constexpr int kBadRequest = 400;
constexpr int kUnauthorized = 401;
constexpr int kForbidden = 403;
constexpr int kNotFound = 404;
constexpr int kNotAllowed = 405;
constexpr int kNotSatisfiable = 416;
constexpr int kUnavailable = 503;

// Requests that are begun between two looks at those under way.
constexpr unsigned kSentAtOnce = 16;

// Of a list of shares.
constexpr size_t kMostShareBytes = size_t{1} << 20;

// What the box itself says; null where it was somebody in between.
Json::Value Said(const FleetReply& reply) {
  Json::Value body;
  return ParseJson(reply.body, &body) && body.isObject() ? body : Json::Value();
}

BoxAnswer AnswerOf(FleetReply reply) {
  using Outcome = FleetReply::Outcome;
  if (reply.outcome == Outcome::kDown) return {BoxState::kDown, "cannot be reached", 0, {}};
  if (reply.outcome == Outcome::kLate) return {BoxState::kLate, "no answer in time", 0, {}};
  if (reply.outcome == Outcome::kTooLong) return {BoxState::kDown, "says too much", 0, {}};
  const int status = reply.status;
  switch (status) {
    case kOk:
    case kPartial:
    case kNotSatisfiable:
      return {BoxState::kAnswered, "", status, std::move(reply.body)};
    case kBadRequest:
    case kNotFound:
    case kNotAllowed:
      return {BoxState::kOld, "does not understand the question", status, {}};
    case kUnauthorized:
      return {BoxState::kRefused,
              Said(reply)["why"] == "clock" ? "its clock is off" : "does not know this front",
              status,
              {}};
    case kForbidden:
      return {BoxState::kRefused, "no account", status, {}};
    case kUnavailable:
      // A proxy says so at once of a box that is gone.
      if (Said(reply)["code"] == kUnavailable) return {BoxState::kRefused, "busy", status, {}};
      return {BoxState::kDown, "cannot be reached", status, {}};
    default:
      return {BoxState::kDown, "answers with status " + std::to_string(status), status, {}};
  }
}

}  // namespace

const char* BoxStateName(BoxState state) {
  static constexpr const char* kNames[kBoxStates] = {"asked", "answered", "late",
                                                     "down",  "refused",  "old"};
  return kNames[static_cast<int>(state)];
}

FleetAsker::FleetAsker(const FleetSettings& fleet, size_t most_bytes)
    : fleet_(fleet), client_(LoadFleetLibrary().new_client(fleet.proxy, most_bytes)) {}

void FleetAsker::Ask(const FleetBox& box, Request request, Done done) {
  const auto known = offsets_.find(box.name);
  Prepare(box, std::move(request), known == offsets_.end() ? 0 : known->second, std::move(done));
}

void FleetAsker::Run(const std::function<bool()>& stop) {
  client_->Run([this, &stop] {
    SendSigned();
    return stop();
  });
  waiting_.clear();
  tokens_.Drop();
}

void FleetAsker::Prepare(const FleetBox& box, Request request, int clock_offset, Done done) {
  tokens_.Ask(box, RequestHash(request.method, request.target, request.body), clock_offset);
  waiting_.push_back({&box, std::move(request), clock_offset, std::move(done)});
}

// Boxes are asked while further tokens are signed.
void FleetAsker::SendSigned() {
  for (unsigned sent = 1; !waiting_.empty(); ++sent) {
    const std::string token = tokens_.Take();
    Waiting first = std::move(waiting_.front());
    waiting_.pop_front();
    if (token.empty()) {
      // The box would say that it does not know this front, which is not what is wrong.
      first.done({BoxState::kRefused, "this machine's key cannot be used", 0, {}});
      continue;
    }
    Send(std::move(first), token);
    if (sent % kSentAtOnce == 0) client_->Step();
  }
}

void FleetAsker::Send(Waiting waiting, const std::string& token) {
  const Request& request = waiting.request;
  FleetRequest sent;
  if (fleet_.proxy.empty()) {
    sent.address = waiting.box->address;
  } else {
    // It finds the box by this name. The address is the same for all boxes, so that a connection to
    // the proxy that one box has answered on is free to ask the next.
    sent.address = "http://proxy";
    sent.host = waiting.box->name;
  }
  sent.method = request.method;
  sent.target = request.target;
  sent.body = request.body;
  sent.token = token;
  sent.deadline_ms = fleet_.deadline_ms + request.wait_ms;
  sent.take_head = request.take_head;
  sent.take_piece = request.take_piece;
  client_->Ask(sent, [this, asked = std::move(waiting)](FleetReply reply) {
    if (reply.outcome == FleetReply::Outcome::kReply && reply.status == kUnauthorized &&
        SendAgain(asked, reply)) {
      return;
    }
    asked.done(AnswerOf(std::move(reply)));
  });
}

// Once for each box: one whose clock jumps is not followed.
bool FleetAsker::SendAgain(const Waiting& asked, const FleetReply& reply) {
  const FleetBox& box = *asked.box;
  const Json::Value said = Said(reply);
  if (said["why"] != "clock" || !said["now"].isInt64() || offsets_.contains(box.name)) return false;
  const std::int64_t offset = said["now"].asInt64() - std::time(nullptr);
  if (offset < -kMostClockOff || offset > kMostClockOff) return false;
  offsets_[box.name] = static_cast<int>(offset);
  Prepare(box, asked.request, offsets_[box.name], asked.done);
  return true;
}

const FleetBox* FindFleetBox(const std::string& name) {
  const auto& boxes = CurrentConfig().fleet.boxes;
  const auto box = std::ranges::lower_bound(boxes, name, {}, &FleetBox::name);
  return box == boxes.end() || box->name != name ? nullptr : &*box;
}

void AppendFleetShares(Json::Value* shares, Json::Value* troubles) {
  const FleetSettings& fleet = CurrentConfig().fleet;
  FleetAsker asker(fleet, kMostShareBytes);
  std::map<std::string, Json::Value> by_box;  // in the order of names, whoever answers first
  for (const FleetBox& box : fleet.boxes) {
    asker.Ask(box, {"GET", "/fleet/shares"}, [&, name = box.name](BoxAnswer answer) {
      Json::Value said;
      if (answer.state == BoxState::kAnswered && !ParseJson(answer.body, &said)) {
        answer = {BoxState::kDown, "says what is no answer", kOk, {}};
      }
      if (answer.state == BoxState::kAnswered) {
        by_box[name].swap(said);
        return;
      }
      Json::Value& trouble = (*troubles)[name];
      trouble["state"] = BoxStateName(answer.state);
      trouble["why"] = answer.why;
    });
  }
  asker.Run([] { return false; });
  for (const auto& [box, said] : by_box) {
    if (!said.isObject() || !said["shares"].isArray()) continue;
    for (const Json::Value& share : said["shares"]) {
      if (!share.isObject() || !share["name"].isString()) continue;
      Json::Value& told = shares->append(Json::objectValue);
      told["name"] = box + "/" + share["name"].asString();
      told["indexed"] = false;  // which would say that this machine's index knows it
    }
  }
}

}  // namespace nas
