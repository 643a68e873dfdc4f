#pragma once

#include <cstdint>
#include <string>
#include <vector>

/// What maructl can do. Each prints its answer on standard output and returns the exit status;
/// failures are exceptions, for main to print.
namespace maru::control {

enum ExitStatus : int {
  kGood = 0,
  /// The answer is no: nothing was found, a service does not answer, settings are not in force.
  kNo = 1,
  kUsage = 2,
  /// The question could not be answered.
  kFailed = 3,
};

int ShowStatus();
int ShowShares();
int ShowConfig();

struct SearchWish {
  std::vector<std::string> words;
  std::uint32_t limit = 100;
  /// Paths end with a NUL byte instead of a line break.
  bool null_ended = false;
};
int Search(const SearchWish& wish);

int GetPreference(const std::string& user, const std::string& key);
int SetPreference(const std::string& user, const std::string& key, const std::string& value);

}  // namespace maru::control
