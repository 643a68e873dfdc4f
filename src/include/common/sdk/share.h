#pragma once

#include <cstdint>
#include <set>
#include <string>

struct MARUSHARE;

namespace maruseeker::sdk {

/// A share, looked up by its name. Failed queries throw Error 502, logged, unless said
/// otherwise. Calls into the platform hold SDKMutex() but for IsHideUnReadable, GetPrivilege and
/// Enum.
class SDKShare {
 public:
  /// Throws Error 800, with the name as its reason, when there is no such share.
  explicit SDKShare(const std::string& share_name);
  ~SDKShare();
  SDKShare(const SDKShare&) = delete;
  SDKShare& operator=(const SDKShare&) = delete;

  const std::string& GetName() const { return share_name_; }

  /// Whether entries that a user cannot read are hidden from that user; false when unknown.
  bool IsHideUnReadable() const;
  /// Whether 100 MiB more fit into the share. Only a full disk or an exhausted quota say no: when
  /// it cannot be told, the answer is yes.
  bool IsSpaceEnough() const;
  /// What is denied to everybody: bit 1, to list; bit 4, to read.
  unsigned int GetFTPPrivilege() const;
  /// What the user may do with the share as a whole (platform/share.h): 4 is nothing, also when it
  /// cannot be told.
  int GetPrivilege(const std::string& user_name) const;
  /// Neither encrypted nor read-only.
  bool CanBeIndexed() const;
  bool IsEncryption() const;
  bool IsEnableRecycleBin() const;

  /// Where the share's index keeps its queue and its database, and the index's id. Each is asked
  /// for once and then remembered.
  std::string GetQueuePath() const;
  std::string GetDBPath() const;
  std::string GetDBName() const;

  /// The names of all shares. Throws Error 121. The platform's list stays allocated: it belongs to
  /// the process from then on.
  static std::set<std::string> Enum();

 private:
  MARUSHARE* share_info_ = nullptr;
  std::string share_name_;
  mutable std::string queue_path_;
  mutable std::string db_path_;
  mutable std::string db_name_;
};

}  // namespace maruseeker::sdk
