#include "server/front/metrics.h"

#include <sstream>

namespace maru::server {

void Metrics::Count(const std::string& method, int status, double seconds) {
  const bool fits = latencies_.contains(method) || latencies_.size() < kMaxMethods;
  const std::string name = fits ? method : "other";
  ++requests_[{name, status}];
  Latency& latency = latencies_[name];
  ++latency.count;
  latency.sum += seconds;
  for (std::size_t i = 0; i < kBuckets.size(); ++i)
    if (seconds <= kBuckets[i]) ++latency.within[i];
}

std::string Metrics::Text(std::size_t connections, const Json::Value& host) const {
  std::ostringstream text;
  text << "# HELP maruweb_requests_total Requests answered.\n"
          "# TYPE maruweb_requests_total counter\n";
  for (const auto& [key, count] : requests_)
    text << "maruweb_requests_total{method=\"" << key.first << "\",status=\"" << key.second
         << "\"} " << count << "\n";
  text << "# HELP maruweb_request_seconds Time from a request's last byte to its answer's first.\n"
          "# TYPE maruweb_request_seconds histogram\n";
  for (const auto& [method, latency] : latencies_) {
    const std::string label = "{method=\"" + method + "\"";
    for (std::size_t i = 0; i < kBuckets.size(); ++i)
      text << "maruweb_request_seconds_bucket" << label << ",le=\"" << kBuckets[i] << "\"} "
           << latency.within[i] << "\n";
    text << "maruweb_request_seconds_bucket" << label << ",le=\"+Inf\"} " << latency.count << "\n"
         << "maruweb_request_seconds_sum" << label << "} " << latency.sum << "\n"
         << "maruweb_request_seconds_count" << label << "} " << latency.count << "\n";
  }
  text << "# TYPE maruweb_connections gauge\nmaruweb_connections " << connections << "\n";
  for (const std::string& name : host.getMemberNames()) {
    const char* type = name == "children_forked" ? "counter" : "gauge";
    const char* suffix = name == "children_forked" ? "_total" : "";
    text << "# TYPE maruweb_" << name << suffix << " " << type << "\nmaruweb_" << name << suffix
         << " " << host[name].asUInt64() << "\n";
  }
  return text.str();
}

}  // namespace maru::server
