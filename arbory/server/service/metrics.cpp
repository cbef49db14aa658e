#include "arbory/server/service/metrics.h"

#include <cmath>
#include <ctime>

#include "arbory/server/transport/http_text.h"
#include "nas/base/json_text.h"

namespace arbory {
namespace {

std::string Number(double value) {
  constexpr size_t kRoom = 32;
  char text[kRoom];
  snprintf(text, sizeof text, "%.6g", value);
  return text;
}

// Well-behaved clients encode such bytes; as they are, U+009B and its like would be commands to the
// terminal that shows the log.
std::string Visible(std::string_view path) {
  constexpr char kFirst = '!';
  constexpr char kLast = '~';
  std::string out;
  for (const char byte : path) {
    const bool plain = byte >= kFirst && byte <= kLast;
    out += plain ? std::string(1, byte) : PercentEncoded({&byte, 1});
  }
  return out;
}

std::string TimeText() {
  constexpr size_t kRoom = 32;
  char time[kRoom];
  const std::time_t now = std::time(nullptr);
  std::tm parts;
  gmtime_r(&now, &parts);
  strftime(time, sizeof time, "%Y-%m-%dT%H:%M:%SZ", &parts);
  return time;
}

class PrometheusText {
 public:
  void Begin(const std::string& name, const char* type, const char* help) {
    name_ = name;
    text_ += "# HELP " + name + " " + help + "\n# TYPE " + name + " " + type + "\n";
  }
  void Add(const std::string& suffix, const std::string& labels, const std::string& value) {
    text_ += name_ + suffix + (labels.empty() ? "" : "{" + labels + "}") + " " + value + "\n";
  }
  void Single(const std::string& name, const char* type, const char* help, std::uint64_t value) {
    Begin(name, type, help);
    Add("", "", std::to_string(value));
  }
  const std::string& text() const { return text_; }

 private:
  std::string name_;
  std::string text_;
};

}  // namespace

void Metrics::CountCall(const std::string& method, int code, double seconds) {
  ++calls_[{method, code}];
  Durations& durations = durations_[method];
  ++durations.count;
  durations.sum += seconds;
  for (size_t at = 0; at < kBounds.size(); ++at) {
    if (seconds <= kBounds[at]) ++durations.within[at];
  }
}

void Metrics::CountReply(int status, std::uint64_t bytes) {
  ++replies_[status];
  bytes_ += bytes;
}

std::string Metrics::Text(const Now& now) const {
  PrometheusText out;
  out.Begin("arbory_calls_total", "counter", "Calls answered, by method and code.");
  for (const auto& [key, count] : calls_) {
    out.Add("", "method=\"" + key.first + "\",code=\"" + std::to_string(key.second) + "\"",
            std::to_string(count));
  }
  out.Begin("arbory_call_seconds", "histogram", "From a call's request to its reply's beginning.");
  for (const auto& [method, durations] : durations_) {
    const std::string label = "method=\"" + method + "\"";
    for (size_t at = 0; at < kBounds.size(); ++at) {
      out.Add("_bucket", label + ",le=\"" + Number(kBounds[at]) + "\"",
              std::to_string(durations.within[at]));
    }
    out.Add("_bucket", label + ",le=\"+Inf\"", std::to_string(durations.count));
    out.Add("_sum", label, Number(durations.sum));
    out.Add("_count", label, std::to_string(durations.count));
  }
  out.Begin("arbory_replies_total", "counter", "Replies, by HTTP status.");
  for (const auto& [status, count] : replies_) {
    out.Add("", "status=\"" + std::to_string(status) + "\"", std::to_string(count));
  }
  out.Single("arbory_sent_bytes_total", "counter", "Bytes sent to clients.", bytes_);
  out.Single("arbory_logins_refused_total", "counter", "Logins refused.", refused_logins_);
  out.Single("arbory_sessions_ended_total", "counter",
             "Sessions ended as their account may log in no more or has another password.",
             ended_sessions_);
  out.Single("arbory_connections", "gauge", "Open connections.", now.connections);
  out.Single("arbory_running_calls", "gauge", "Children answering requests.", now.running);
  out.Single("arbory_workers", "gauge", "Processes that searches and cleanings run in.",
             now.workers);
  out.Single("arbory_sessions", "gauge", "Sessions.", now.sessions);
  return out.text();
}

std::string AccessLine(const HttpRequest& request, int status, std::uint64_t bytes) {
  constexpr double kTenths = 10;
  constexpr size_t kMaxPath = 1024;  // a longer one is cut: a line must fit a log's line
  constexpr size_t kMaxMethod = 32;  // clients may make one up
  const std::chrono::duration<double, std::milli> spent = Clock::now() - request.begun;
  Json::Value line;
  line["time"] = TimeText();
  line["peer"] = request.peer;
  line["method"] = request.method.substr(0, kMaxMethod);
  line["path"] = Visible(request.path().substr(0, kMaxPath));
  line["status"] = status;
  line["user"] = request.user;
  if (!request.front.empty()) line["front"] = request.front;
  line["ms"] = std::round(spent.count() * kTenths) / kTenths;
  line["bytes"] = Json::UInt64{bytes};
  return nas::JsonText(line, nas::JsonBytes::kClean) + "\n";
}

std::string EndedLine(const std::string& user, size_t sessions, const char* why) {
  Json::Value line;
  line["time"] = TimeText();
  line["user"] = user;
  line["sessions_ended"] = Json::UInt64{sessions};
  line["why"] = why;
  return nas::JsonText(line, nas::JsonBytes::kClean) + "\n";
}

}  // namespace arbory
