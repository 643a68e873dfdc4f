#pragma once

#include <sys/types.h>

#include <cstddef>
#include <string>

#include "platform/string_list.h"

/// Accounts and groups, answered by the name service of the machine (NSS). None of these functions
/// throws; each sets the last error (platform/process.h) when it fails. The account functions are
/// not to be called from two threads at once by callers that also switch identities.

struct MARUUSER {
  const char* szName;
  uid_t nUid;
  gid_t nGid;
  /// Where the account comes from, handed to MARUServiceUserHomeIsEnabled; 0: the name service.
  int nAuthType;
};

/// 0 and a record to be freed with MARUUserFree, or -1 (no such account, or the lookup failed) with
/// `*user` null.
int MARUUserGet(const char* name, MARUUSER** user);
int MARUUserGetByUID(uid_t uid, MARUUSER** user);
void MARUUserFree(MARUUSER* user);

/// Whether users have home folders in the share "homes": it is configured and available.
bool MARUServiceUserHomeIsEnabled(int auth_type, const char* user_name);

/// Writes where the user's home is, a volume path ("/volume1/homes/NAME"), and returns its length,
/// or -1 when the user is unknown, there are no homes, or the path does not fit `size` bytes. The
/// folder itself need not exist yet.
int MARUServiceHomePathGet(const char* user_name, char* path, std::size_t size);

/// 1 when the user is a member of the administrators' group (setting `admin_group`), by primary or
/// supplementary membership; 0 when not; -1 when the lookup failed. `reserved` is 0.
int MLIBGroupIsAdminGroupMem(const char* user_name, int reserved);

/// The user's groups as decimal group ids, the primary one first, as a new list to be freed with
/// MLIBCSzListFree; null when the user is unknown. With `with_primary` false the primary is left
/// out.
MLIBCSzList* MLIBGroupInfoListGet(const char* user_name, bool with_primary);

/// Makes the calling process act as `user_name` in everything: first back to root through the saved
/// id, then supplementary groups, group ids and user ids (real and effective; the saved ids stay 0
/// so that a later switch is possible), then verified. Start: real, effective or saved user id 0.
/// On false nothing has changed; a process that can neither go forth nor back ends itself. With
/// `groups` false the supplementary groups become just the primary group. One thread only.
bool ResetCredentialsByName(const std::string& user_name, bool groups);
