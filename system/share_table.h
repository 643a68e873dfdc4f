#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "system/host_rules.h"
#include "system/rights.h"
#include "system/veto.h"

namespace maru {

/// A share whose folder is another for each user: they lie beside each other in the share's `path`,
/// each under its user's name, or where the account's home is.
struct PersonalFolders {
  /// The account's home says which folder is whose.
  bool by_home = false;
  /// Nobody enters another's.
  bool own_only = false;
  /// Below the user's own folder, "files/public": what is shared of it; empty for all.
  std::string inside;
};

/// One shared folder, as the Samba settings define it.
struct ShareSettings {
  std::string name;
  /// Where it lies on the disk. Of personal folders: the folder that holds them.
  std::string path;
  bool available = true;
  bool read_only = true;
  bool hide_unreadable = false;
  bool recycle = false;
  /// Parametric option `maruseeker:index = no` keeps a share out of the index.
  bool index = true;
  /// Parametric option `maruseeker:deny`, as bits: `list` is 1, `read` is 4.
  unsigned int deny = 0;
  std::vector<std::string> valid_users, invalid_users, read_list, write_list, admin_users;
  std::string force_user;
  /// With the "+" of "members only", when it has one.
  std::string force_group;
  bool guest_only = false;
  std::string guest_account = "nobody";
  /// From where one may enter it, and any share of this server.
  HostRules hosts, server_hosts;
  VetoPatterns veto;
  std::optional<PersonalFolders> personal;
  /// The name by which accounts of this server may be called before a backslash.
  std::string server_name;

  /// "/volume1/NAME".
  std::string VolumePath() const;
  /// Whether anybody at all may enter from there: nothing of it is there for other clients, whoever
  /// they are.
  bool IsOpenTo(const ClientAddress& client) const;
};

/// A share that cannot be searched, because something in its settings is wrong or is not judged as
/// Samba judges it.
struct WithheldShare {
  std::string name;
  std::string reason;

  friend bool operator==(const WithheldShare&, const WithheldShare&) = default;
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

  /// Parses the canonical form. Printers are left out. A section with a value that is wrong or not
  /// honoured withholds its share and no other. Throws std::runtime_error naming the line that is
  /// no settings at all.
  static ShareTable Parse(const std::string& text);

  const std::vector<ShareSettings>& Shares() const { return shares_; }
  /// Null when there is no such share, or it is withheld.
  const ShareSettings* Find(const std::string& name) const;
  /// In the order of their names.
  const std::vector<WithheldShare>& Withheld() const { return withheld_; }
  bool IsWithheld(const std::string& name) const;
  /// Empty, or why the newest settings are not in force.
  const std::string& Error() const { return error_; }

 private:
  void Withhold(const std::string& name, const std::string& reason);
  void WithholdTwins();

  std::vector<ShareSettings> shares_;
  std::vector<WithheldShare> withheld_;
  /// Where Samba keeps the shares' own ACLs.
  std::string samba_state_ = "/var/lib/samba";
  std::string error_;
  friend class ShareTableSource;
};

/// The share that holds the users' home folders.
inline constexpr const char* kHomesShare = "homes";

/// The volume under which all shares appear to users: "/volume1".
inline constexpr const char* kVolume = "/volume1";

}  // namespace maru
