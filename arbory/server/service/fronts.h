#pragma once
// Requests of fronts: whether a token (nas/fleet/token.h) is a front's that this box knows, for
// this request, now, and for the first time; and in the child whether the front may speak for the
// user at all. Of the loop's thread alone but for Admit, which may wait for a directory server.
//
// In the loop nothing is looked up and little computed: what is not signed costs no signature's
// check where its front or box is unknown, and a tenth of a millisecond otherwise. Tokens that were
// used are remembered, of each front for itself and as long as they hold, so only a front can fill
// that memory, and only its own.

#include <ctime>
#include <map>
#include <optional>
#include <string>

#include "arbory/server/transport/http.h"
#include "nas/system/config.h"

namespace arbory {

class Fronts {
 public:
  // Throws std::runtime_error where there are fronts and their signatures cannot be checked.
  explicit Fronts(const nas::BoxSettings& box);

  // Fills in the request's user and front, or gives the refusal: 404 on a machine that knows no
  // front, 401 with "why" ("token", or "clock" with the box's time as "now"), 403 for a user of
  // another realm, and 503 for a front that asks too often.
  std::optional<HttpReply> LetIn(HttpRequest* request, std::time_t now);

  // As many uses of tokens are remembered of one front: three thousand requests a second.
  static constexpr size_t kMostUsed = 100'000;

 private:
  struct Used {
    std::map<std::string, std::time_t> by_nonce;
    std::time_t swept = 0;
  };
  bool UseOnce(const std::string& front, const std::string& nonce, std::time_t issued,
               std::time_t now, bool* full);

  const nas::BoxSettings box_;
  std::map<std::string, Used> used_;
};

// In the child, before it becomes the user: the refusal where the front may not speak for the user:
// there is none of that name, it is root or one of the system's own, or nobody whom the
// configuration names for this front.
std::optional<nas::Reply> Admit(const std::string& front, const std::string& user);

// In the child that is about to begin a search, before root is given up: takes one of the front's
// places, which this process and the worker that it forks hold until both have ended. Otherwise the
// refusal.
std::optional<HttpReply> TakeSearchPlace(const std::string& front);

}  // namespace arbory
