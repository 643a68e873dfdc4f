#pragma once

#include <string>
#include <string_view>

#include "system/accounts.h"
#include "system/rights.h"
#include "system/share_table.h"

/// What Samba makes of one user in one share: whether they enter, whose rights on files count
/// there, and what of the share is there at all. The files' own rights come on top.
namespace maru {

/// What a user may do with a share as a whole.
enum SharePrivilege { kSharePrivReadWrite = 1, kSharePrivReadOnly = 2, kSharePrivNone = 4 };

struct ShareAccess {
  SharePrivilege privilege = kSharePrivNone;
  /// Whose rights on files count; of no meaning without a privilege.
  Identity identity;

  bool Admits() const { return privilege != kSharePrivNone; }
};

/// By the share's lists and the accounts it puts in the user's place. `session` is the user's own
/// identity. Who cannot be judged (an account that is forced does not exist) is not admitted.
/// Administrators of ours are not treated specially here. Whether they can reach the share's folder
/// is for CanReach (system/way.h).
ShareAccess AccessOf(const ShareSettings& share, const std::string& user_name,
                     const Identity& session);

/// Whether the share has this path ("" or "/a/b", from its folder) for the user: nothing of it is
/// vetoed, and where folders are personal it lies in one that the user may enter.
bool Serves(const ShareSettings& share, const std::string& user_name, std::string_view path);

/// Of a share with personal folders: the account's own, a name in the share's folder; empty when it
/// has none there.
std::string PersonalFolderOf(const ShareSettings& share, const Account& account);
/// Whose folder that is.
std::optional<Account> OwnerOfPersonal(const ShareSettings& share, const std::string& folder);

}  // namespace maru
