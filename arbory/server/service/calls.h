#pragma once
// The children that answer requests: no more at once than the server allows, and each counted. Of
// the loop's thread alone.

#include <functional>
#include <map>
#include <string>

#include "arbory/server/service/metrics.h"
#include "arbory/server/transport/http.h"
#include "nas/webapi/runner.h"

namespace arbory {

struct CallLimits {
  int all = 0;
  int of_one_user = 0;
};

class Calls {
 public:
  // `running` tells how many children answer requests now. What is given must outlive this object,
  // and this object the children it started.
  Calls(const CallLimits& limits, std::function<size_t()> running, Metrics* metrics)
      : limits_(limits), running_(std::move(running)), metrics_(*metrics) {}

  // Has the child that `start` forks answer for the user; 503 when too many run or none can be
  // forked. `name` names the call in the counts: a route or a row of the module, never what a
  // client made up; empty for what is not counted. Nor is what turns out malformed in the child. A
  // child that ends without a reply is answered for with 503.
  Answer Run(const std::string& user, const std::string& name,
             const std::function<nas::Child()>& start);

 private:
  const CallLimits limits_;
  const std::function<size_t()> running_;
  Metrics& metrics_;
  std::map<std::string, int> by_user_;
};

}  // namespace arbory
