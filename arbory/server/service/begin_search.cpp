#include "arbory/server/service/begin_search.h"

#include <optional>
#include <utility>

#include "arbory/running_search.h"
#include "arbory/server/service/row_addresses.h"
#include "arbory/server/service/user_calls.h"
#include "arbory/server/transport/http.h"
#include "arbory/server/transport/http_text.h"
#include "nas/base/json_text.h"
#include "nas/system/config.h"
#include "nas/system/first_page.h"
#include "nas/system/identity.h"
#include "platform/webfm.h"

namespace arbory {
namespace {

// Most searches have found something by then, and a person feels no more.
constexpr int kMostWaitTenths = 3;
// Of a first page: more than a screen shows, and a reply that need not be spooled.
constexpr int kMostRows = 1000;
constexpr char kLimit[] = "limit";

nas::ApiCall CallOf(const nas::ApiCall& outer, const NUVA::APIMethod& row, Json::Value params) {
  nas::ApiCall call = outer;
  call.method = row.method;
  call.params = std::move(params);
  call.read_params = {};
  call.finish = {};
  return call;
}

nas::Reply Ask(const NUVA::APIMethod& row, const nas::ApiCall& call,
               const nas::ReplyEncoder& encode) {
  return nas::FinishCall(nas::StartCall(row, call, encode), encode, nas::ChildsEnd::kLeft);
}

// The data of a reply of the module, as JSON; empty where it failed. A page is not taken apart to
// be put together again.
std::string DataOf(const nas::Reply& reply) {
  constexpr std::string_view kBefore = "{\"code\":0,\"data\":";
  const std::string_view body = reply.body;
  if (reply.head.code != 0 || !body.starts_with(kBefore) || !body.ends_with('}')) return {};
  return std::string(body.substr(kBefore.size(), body.size() - kBefore.size() - 1));
}

// What the search has found once that is something, or it has ended. The child that lists waits for
// it, as one that lists again and again would take from the search what it needs to find anything.
std::string FirstPage(const nas::ApiCall& outer, const NUVA::APIMethod& list, Json::Value params) {
  const Json::Value& limit = params[kLimit];
  if (!limit.isInt() || limit.asInt() <= 0 || limit.asInt() > kMostRows) params[kLimit] = kMostRows;
  nas::ApiCall listing = CallOf(outer, list, {});
  listing.read_params = [&](Json::Value* asked) -> std::optional<nas::Reply> {
    if (WfmLibUGIDSet(nullptr, outer.user.c_str()) >= 0) {
      nas::GiveUpRoot();
      WaitForFirstRows(outer.user, params["taskid"].asString(), kMostWaitTenths);
    }
    asked->swap(params);
    return std::nullopt;
  };
  return DataOf(Ask(list, listing, EncodeWithAddresses));
}

// What the listing will ask for, which the search may find first.
void ExpectPage(const Json::Value& listing) {
  if (!listing.isObject() || !listing["sort_by"].isString()) return;
  nas::FirstPage page;
  page.sort_by = listing["sort_by"].asString();
  const Json::Value& direction = listing["sort_direction"];
  page.descending = direction.isString() && LowerCase(direction.asString()) == "desc";
  const Json::Value& limit = listing[kLimit];
  page.rows = limit.isUInt() && limit.asUInt() > 0 ? limit.asUInt() : kMostRows;
  nas::ExpectFirstPage(std::move(page));
}

nas::Reply Begin(const nas::ApiCall& call, const NUVA::APIMethod& start,
                 const NUVA::APIMethod& list) {
  nas::ApiCall plain = call;
  plain.finish = {};
  nas::Reply read = ReadQuery(plain);
  Json::Value body;
  if (read.head.status != kOk || !nas::ParseJson(read.body, &body) || body.isMember("wrong")) {
    return read;
  }
  Json::Value listing = body["params"]["list"];
  body["params"].removeMember("list");
  ExpectPage(listing);
  nas::ApiCall starting = CallOf(call, start, body["params"]);
  starting.asks_fleet = true;
  const nas::Reply reply = Ask(start, starting, nas::EncodeJsonReply);
  std::string page;
  if (Json::Value begun; nas::ParseJson(DataOf(reply), &begun) && begun.isObject()) {
    if (!listing.isObject()) listing = Json::Value(Json::objectValue);
    listing["taskid"] = body["taskid"] = begun["taskid"];
    page = FirstPage(call, list, std::move(listing));
  } else {
    body = Json::Value();
    body["code"] = reply.head.code;
  }
  std::string text = nas::JsonText(body, nas::JsonBytes::kClean);
  if (!page.empty()) text.replace(text.size() - 1, 1, ",\"page\":" + page + "}");
  return AsChildsReply(JsonReply(kOk, std::move(text)));
}

}  // namespace

nas::Child StartBegin(const nas::ApiCall& call, const NUVA::APIMethod& start,
                      const NUVA::APIMethod& list) {
  return nas::StartChild(
      [&](int pipe) {
        nas::Reply reply = Begin(call, start, list);
        nas::SendReply(pipe, call.finish ? call.finish(std::move(reply)) : reply);
      },
      nas::CurrentConfig().call_memory_bytes());
}

}  // namespace arbory
