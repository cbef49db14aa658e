#pragma once
// The children that answer requests: no more at once than the server allows, and each counted. Of
// the loop's thread alone.

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "arbory/server/service/metrics.h"
#include "arbory/server/transport/http.h"
#include "nas/webapi/runner.h"

namespace arbory {

// A number of children at once, for one kind of work.
class Places {
 public:
  // `shared`: nobody takes more of them than are left for the others, so that one who asks for the
  // first time finds a place even while several hold all they can.
  Places(int all, bool shared) : all_(all), shared_(shared) {}

  // A place for as long as the token lives, which this object must outlive; null when `who` can
  // have none now.
  std::shared_ptr<void> Take(const std::string& who);

 private:
  const int all_;
  const bool shared_;
  int taken_ = 0;
  std::map<std::string, int> by_taker_;
};

class Calls {
 public:
  // Each kind has places of its own: a download lasts as long as its client likes, and a login must
  // be possible whatever the others do; fronts, each with the people of a whole company behind it,
  // have places among themselves.
  enum class Kind { kCall, kDownload, kLogin, kCheck, kFront };

  // `calls` is the number of calls at once; `several_users`: they are shared among users. What is
  // given must outlive this object, and this object the children it started.
  Calls(int calls, bool several_users, Metrics* metrics);

  // Has the child that `start` forks answer for `who`, a user, a front or where a login comes
  // from; 503 when
  // too many run or none can be forked. `name` names the call in the counts: a route or a row of
  // the module, never what a client made up; empty for what is not counted. Nor is what turns out
  // malformed in the child. A child that ends without a reply is answered for with 503.
  Answer Run(Kind kind, const std::string& who, const std::string& name,
             const std::function<nas::Child()>& start);

 private:
  Places& PlacesOf(Kind kind);

  Places calls_, downloads_, logins_, checks_, fronts_;
  Metrics& metrics_;
};

}  // namespace arbory
