#pragma once

#include <json/value.h>

#include <array>
#include <cstdint>
#include <map>
#include <string>
#include <utility>

namespace maru::server {

/// Numbers about the requests served, as Prometheus reads them. One thread.
class Metrics {
 public:
  /// One request answered. `method` is one of a bounded set of names; beyond kMaxMethods new ones
  /// count as "other".
  void Count(const std::string& method, int status, double seconds);

  /// The text of /metrics; `host` holds the host's numbers by name, or is null when it did not
  /// answer.
  std::string Text(std::size_t connections, const Json::Value& host) const;

  static constexpr std::size_t kMaxMethods = 64;

 private:
  static constexpr std::array<double, 12> kBuckets = {0.001, 0.0025, 0.005, 0.01, 0.025, 0.05,
                                                      0.1,   0.25,   0.5,   1,    2.5,   10};
  struct Latency {
    std::array<std::uint64_t, kBuckets.size()> within{};
    std::uint64_t count = 0;
    double sum = 0;
  };

  std::map<std::string, Latency> latencies_;
  std::map<std::pair<std::string, int>, std::uint64_t> requests_;
};

}  // namespace maru::server
