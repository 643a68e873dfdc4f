#pragma once

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace maru::history {

/// Searches that are not in the history's table yet. Whoever searched adds a line to a file, which
/// costs a few calls of the system; whoever reads the table takes them into it first. Safe among
/// any number of processes, and a line survives the end of each of them. While entries are taken
/// over they stand aside in a file of their own: that may take long, and nobody who searches waits.
class Journal {
 public:
  struct Entry {
    uid_t uid = 0;
    std::string keyword;
    /// Seconds since the epoch.
    std::int64_t create_time = 0;
    /// Of the user's searches so many are kept; 0 or less: all.
    int max = 0;
  };

  explicit Journal(std::string path) : path_(std::move(path)), aside_(path_ + ".taken") {}
  /// The service's own, in the state folder.
  static Journal OfService();

  /// Adds an entry. `long_enough` tells whether it is time to take all of them over. False with
  /// errno; EFBIG when nobody could for too long.
  bool Add(const Entry& entry, bool& long_enough) const;

  /// What is there now, in the order of adding. A file that cannot be read is empty, with errno;
  /// lines that are none of ours are left out.
  std::vector<Entry> Entries() const;

  /// Gives all entries that were there at the call to `take`, in one turn or more, and forgets
  /// those of a turn when it returns true. A process that dies in between leaves them to the next
  /// one, even when it had taken them. False with errno when a file cannot be read or written, with
  /// errno 0 when `take` returned false.
  bool HandOver(const std::function<bool(const std::vector<Entry>&)>& take) const;

 private:
  bool SetAside() const;
  bool TakeAside(const std::function<bool(const std::vector<Entry>&)>& take) const;

  std::string path_;
  std::string aside_;
};

}  // namespace maru::history
