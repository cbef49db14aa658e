#include "arbory/server/service/fleet_files.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <sstream>
#include <stdexcept>
#include <utility>
#include <vector>

#include "arbory/server/transport/http_text.h"
#include "nas/base/file_io.h"
#include "nas/base/json_text.h"
#include "nas/fleet/asker.h"
#include "nas/fleet/signer.h"
#include "nas/match/query.h"
#include "nas/system/config.h"
#include "nas/system/identity.h"

namespace arbory {
namespace {

using nas::BoxState;

// Of a text's window and a line (files.cpp), each byte of them escaped; and of an error's sentence.
constexpr size_t kMostAnswerBytes = size_t{1} << 20;

// What the box has as /SHARE/PATH.
std::string TargetOf(const char* route, const std::vector<std::string>& parts) {
  std::string target = std::string("/fleet/") + route;
  for (const std::string& part : parts) target += "/" + PercentEncoded(part);
  return target;
}

// What follows `text` at its beginning, as a number up to `end`, which goes too.
std::optional<std::uint64_t> TakeNumber(std::string_view* text, std::string_view end) {
  std::uint64_t number = 0;
  const auto read = std::from_chars(text->data(), text->data() + text->size(), number);
  if (read.ec != std::errc()) return std::nullopt;
  text->remove_prefix(static_cast<size_t>(read.ptr - text->data()));
  if (!text->starts_with(end) || (end.empty() && !text->empty())) return std::nullopt;
  text->remove_prefix(end.size());
  return number;
}

// "bytes 5-9/100" in a reply of status 206, "bytes */100" in one of status 416.
struct SaidRange {
  ByteRange range;
  std::uint64_t size = 0;
};
std::optional<SaidRange> ReadRange(const nas::FleetHead& head) {
  const std::string_view unit = head.status == kPartial ? "bytes " : "bytes */";
  std::string_view text = head.range;
  if (!text.starts_with(unit)) return std::nullopt;
  text.remove_prefix(unit.size());
  if (head.status != kPartial) {
    const auto size = TakeNumber(&text, "");
    return size ? std::optional(SaidRange{{0, 0, false, false}, *size}) : std::nullopt;
  }
  const auto first = TakeNumber(&text, "-");
  const auto last = first ? TakeNumber(&text, "/") : std::nullopt;
  const auto size = last ? TakeNumber(&text, "") : std::nullopt;
  if (!size || *last < *first || *last >= *size) return std::nullopt;
  return SaidRange{{*first, *last - *first + 1, true, true}, *size};
}

// What a reply's head says of the bytes that follow; nothing where it does not make sense.
std::optional<SaidRange> ReadHead(const nas::FleetHead& head) {
  if (head.status != kOk) {
    auto said = ReadRange(head);
    const bool agrees = said && (head.status != kPartial ||
                                 head.length == static_cast<std::int64_t>(said->range.count));
    return agrees ? said : std::nullopt;
  }
  if (head.length < 0) return std::nullopt;
  const auto size = static_cast<std::uint64_t>(head.length);
  return SaidRange{{0, size, false, true}, size};
}

void SendError(int pipe, int status, const std::string& sentence) {
  nas::SendReply(pipe, AsChildsReply(ErrorReply(status, sentence)));
}

// Of a box that has not answered.
void SendTrouble(int pipe, const std::string& box, const nas::BoxAnswer& answer) {
  switch (answer.status) {
    case kNotFound:
      return SendError(pipe, kNotFound,
                       "There is no such file; it may have been moved or deleted.");
    case kForbidden:
      return SendError(pipe, kForbidden, box + " does not let you read this file.");
    default:
      break;
  }
  switch (answer.state) {
    case BoxState::kLate:
      return SendError(pipe, kUnavailable, box + " does not answer in time; try again later.");
    case BoxState::kRefused:
      return SendError(pipe, kUnavailable, box + " refuses now: " + answer.why + ".");
    case BoxState::kOld:
      return SendError(pipe, kUnavailable, box + " is too old to send files to this server.");
    default:
      return SendError(pipe, kUnavailable, box + " cannot be reached now; try again later.");
  }
}

// Asks the box, as the user for good; answers where the box does not, unless the reply has `begun`:
// what came after that would be taken for the file's.
void AskBox(const FileRequest& request, int pipe, nas::FleetAsker::Request asked, const bool& begun,
            const std::function<void(const nas::BoxAnswer&)>& answered) try {
  nas::StartFleetSigner(request.user);
  if (!nas::BecomeUser(request.user)) {
    return SendError(pipe, kUnavailable, "The server cannot act as this user.");
  }
  nas::GiveUpRoot();
  const nas::FleetBox& box = *nas::FindFleetBox(request.share);
  nas::FleetAsker asker(nas::CurrentConfig().fleet, kMostAnswerBytes);
  asker.Ask(box, std::move(asked), [&](const nas::BoxAnswer& answer) {
    if (answer.state == BoxState::kAnswered) return answered(answer);
    if (!begun) SendTrouble(pipe, box.name, answer);
  });
  asker.Run([] { return false; });
} catch (const std::runtime_error& error) {
  SendError(pipe, kUnavailable, error.what());
}

bool IsTextOrNone(const Json::Value& text) {
  return text.isNull() ||
         (text.isObject() && text["first_line"].isUInt64() && text["text"].isString() &&
          text["before"].isBool() && text["after"].isBool());
}

// The answer with what StartFirstLine says and nothing else; null for what is none.
Json::Value CheckedLine(const std::string& body, bool with_text) {
  Json::Value said;
  if (!nas::ParseJson(body, &said) || !said.isObject()) return {};
  Json::Value line;
  line["line"] = said["line"];
  line["parts"] = said["parts"];
  bool fits = (line["line"].isNull() || line["line"].isUInt64()) && line["parts"].isArray();
  for (const Json::Value& part : line["parts"]) fits = fits && part.isString();
  if (with_text && fits) {
    fits = IsTextOrNone(said["text"]);
    if (fits && said["text"].isNull()) line["text"] = Json::Value();
    for (const char* member : {"first_line", "text", "before", "after"}) {
      if (fits && !said["text"].isNull()) line["text"][member] = said["text"][member];
    }
  }
  return fits ? line : Json::Value();
}

}  // namespace

bool IsOnBox(const FileRequest& request) {
  // A front's own question is for this machine's files.
  return !request.admit && nas::FindFleetBox(request.share) != nullptr;
}

void PassFileOn(const FileRequest& request, int pipe) {
  bool begun = false;
  nas::FleetAsker::Request asked;
  asked.method = request.head_only ? "HEAD" : "GET";
  asked.target = TargetOf("files", request.path);
  if (request.range) asked.target += "?range=" + PercentEncoded(*request.range);
  asked.take_head = [&](const nas::FleetHead& head) {
    const auto said = ReadHead(head);
    if (!said) return false;
    begun = true;
    if (!said->range.satisfiable) return nas::SendReply(pipe, NoSuchBytes(said->size));
    return nas::SendHead(pipe, FileHead(request, said->size, head.modified, said->range),
                         said->range.count);
  };
  asked.take_piece = [&](std::string_view piece) { return nas::WriteAll(pipe, piece).ok(); };
  AskBox(request, pipe, std::move(asked), begun, [](const nas::BoxAnswer&) {});
}

void PassFirstLineOn(const FileRequest& request, const std::string& pattern, bool with_text,
                     int pipe) {
  // What is wrong with it this machine says as well, and a box's 400 means another thing.
  if (const auto parsed = nas::Query::Parse(pattern); !parsed) {
    return SendError(pipe, kBadRequest, parsed.error().path);
  }
  nas::FleetAsker::Request asked;
  asked.method = "GET";
  asked.target = TargetOf("lines", request.path) + "?pattern=" + PercentEncoded(pattern) +
                 (with_text ? "&text=1" : "");
  AskBox(request, pipe, std::move(asked), false, [&](const nas::BoxAnswer& answer) {
    const Json::Value line = CheckedLine(answer.body, with_text);
    if (line.isNull()) return SendTrouble(pipe, request.share, {});
    nas::SendReply(pipe,
                   AsChildsReply(JsonReply(kOk, nas::JsonText(line, nas::JsonBytes::kClean))));
  });
}

BoxFiles::BoxFiles() : asker_(nas::CurrentConfig().fleet, kMostAnswerBytes) {}

int BoxFiles::Fetch(const std::string& path,
                    const std::function<bool(std::uint64_t bytes, std::time_t modified)>& begin,
                    const std::function<bool(std::string_view piece)>& take) {
  std::vector<std::string> parts;
  std::istringstream text(path);
  for (std::string part; std::getline(text, part, '/');) parts.push_back(part);
  const nas::FleetBox* box = nas::FindFleetBox(parts.front());
  if (box == nullptr) return ENOENT;
  parts.erase(parts.begin());
  bool begun = false;
  nas::FleetAsker::Request asked;
  asked.method = "GET";
  asked.target = TargetOf("files", parts);
  asked.take_head = [&](const nas::FleetHead& head) {
    const auto said = ReadHead(head);
    begun =
        said && head.status == kOk && begin(said->size, std::max<std::int64_t>(head.modified, 0));
    return begun;
  };
  asked.take_piece = take;
  int trouble = EHOSTDOWN;
  asker_.Ask(*box, std::move(asked), [&](const nas::BoxAnswer& answer) {
    if (answer.status == kNotFound) trouble = ENOENT;
    if (answer.status == kForbidden) trouble = EACCES;
    if (answer.state == BoxState::kAnswered) trouble = 0;
  });
  asker_.Run([] { return false; });
  return begun && trouble != 0 ? EIO : trouble;
}

}  // namespace arbory
