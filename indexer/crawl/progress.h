#pragma once

#include <chrono>
#include <string>

#include "indexer/tree/counts.h"

namespace maru::indexer {

/// Shows how a crawl goes on standard error: on a terminal one line that is written anew, else a
/// line every few seconds. One thread.
class Progress {
 public:
  using Clock = std::chrono::steady_clock;

  explicit Progress(bool quiet);

  /// How long to wait between two calls of Show.
  std::chrono::milliseconds Interval() const;

  /// A share's crawl begins.
  void Begin(const std::string& share);
  void Show(const Counts& counts);
  /// It has ended: the line that sums it up, on standard output.
  void End(const Counts& counts);

  /// The texts, without line ends. `seconds` since the share's begin.
  static std::string Line(const std::string& share, const Counts& counts, double seconds);
  static std::string Summary(const std::string& share, const Counts& counts, double seconds);

 private:
  double Seconds() const;

  const bool quiet_;
  const bool terminal_;
  std::string share_;
  Clock::time_point begin_;
};

}  // namespace maru::indexer
