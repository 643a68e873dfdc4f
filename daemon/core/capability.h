#pragma once

#include <string>

namespace maru::daemon {

/// Drops the privileges of root but CAP_DAC_READ_SEARCH, which lies unused until RaisedReadSearch.
/// Once, before threads start; throws std::runtime_error, and the process is then to end.
void BecomeDaemon(const std::string& account);

/// Whether the process can look at every file's rights: it is root or holds CAP_DAC_READ_SEARCH.
bool HoldsReadSearch();

/// For its lifetime CAP_DAC_READ_SEARCH is effective in this thread. Without the capability it does
/// nothing.
class RaisedReadSearch {
 public:
  RaisedReadSearch();
  ~RaisedReadSearch();
  RaisedReadSearch(const RaisedReadSearch&) = delete;
  RaisedReadSearch& operator=(const RaisedReadSearch&) = delete;
};

}  // namespace maru::daemon
