#pragma once

#include <string>

namespace maru {

/// Samba's database of ACLs that shares themselves have (`sharesec`), as it is now.
class ShareACLs {
 public:
  /// Reads `share_info.tdb` in the folder. None there: no share has one.
  explicit ShareACLs(const std::string& folder);

  /// Why the share cannot be judged: it has an ACL, or that cannot be told. Empty otherwise.
  std::string ReasonAgainst(const std::string& share) const;

 private:
  std::string error_;
  std::string content_;
};

}  // namespace maru
