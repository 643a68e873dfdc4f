#pragma once

#include <memory>
#include <string>
#include <vector>

#include "system/rights.h"

namespace maru {

/// One shared folder, as the Samba settings define it.
struct ShareSettings {
  std::string name;
  /// Where it lies on the disk. For "homes": the folder that holds the home folders.
  std::string path;
  bool available = true;
  bool read_only = true;
  bool hide_unreadable = false;
  bool recycle = false;
  /// Parametric option `maruseeker:index = no` keeps a share out of the index.
  bool index = true;
  /// Parametric option `maruseeker:deny`, as bits: `list` is 1, `read` is 4.
  unsigned int deny = 0;
  std::vector<std::string> valid_users, invalid_users, read_list, write_list;

  /// "/volume1/NAME".
  std::string VolumePath() const;
};

/// The shares of this server at one moment; immutable.
class ShareTable {
 public:
  /// The newest good table. Looks at the settings file's identity and time and reads it again when
  /// it changed, and once a minute for the sake of files that it includes; when the new one has an
  /// error, the last good table stays (also across restarts, from a copy in the state folder) and
  /// `Error` says why. The same settings give the same object. Never null; throws only what
  /// Config::Get throws. Thread-safe.
  static std::shared_ptr<const ShareTable> Current();
  /// The table as it was last read, without looking at the file: for request children.
  static void Freeze();

  /// Parses the canonical form. Shares that are no folders of one place (printers, paths with
  /// variables) are left out. Throws std::runtime_error naming the line.
  static ShareTable Parse(const std::string& text);

  const std::vector<ShareSettings>& Shares() const { return shares_; }
  /// Null when there is no such share.
  const ShareSettings* Find(const std::string& name) const;
  /// Empty, or why the newest settings are not in force.
  const std::string& Error() const { return error_; }

 private:
  std::vector<ShareSettings> shares_;
  std::string error_;
  friend class ShareTableSource;
};

/// What a user may do with a share as a whole.
enum SharePrivilege { kSharePrivReadWrite = 1, kSharePrivReadOnly = 2, kSharePrivNone = 4 };

/// That of the user on the share by `available`, `invalid users`, `valid users`, `read
/// list`, `write list` and `read only`, with @, + and & groups and %S. Administrators are not
/// treated specially here, nor are Samba's `admin users`, whose file operations are root's but who
/// enter no share and write to none without the lists.
SharePrivilege PrivilegeOf(const ShareSettings& share, const std::string& user_name,
                           const Identity& identity);

/// The share that holds the users' home folders.
inline constexpr const char* kHomesShare = "homes";

/// The volume under which all shares appear to users: "/volume1".
inline constexpr const char* kVolume = "/volume1";

}  // namespace maru
