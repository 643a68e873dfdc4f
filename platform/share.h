#pragma once

#include <cstddef>
#include <cstdint>

#include "platform/string_list.h"

/// Shared folders, as the server's Samba settings define them, but for those that are withheld. No
/// function throws; failures are negative results with the last error set (platform/process.h).

struct MARUSHARE {
  char* szName;
  /// The share's own volume path, "/volume1/NAME".
  char* szPath;
  /// Parametric option `maruseeker:deny`, as bits: `list` is 1, `read` is 4.
  unsigned int fFTPPriv;
};

/// What a user may do with a share as a whole.
enum MARUSHAREPRIV { kSharePrivReadWrite = 1, kSharePrivReadOnly = 2, kSharePrivNone = 4 };

/// 0 and a record to be freed with MARUShareFree, or -1 when there is no such share. Names are
/// compared byte by byte.
int MARUShareGet(const char* name, MARUSHARE** share);
void MARUShareFree(MARUSHARE* share);

/// MARUSHAREPRIV of the user on the share, by its lists and the accounts it puts in users' places.
/// Members of the administrators' group have kSharePrivReadWrite everywhere. An unknown user has
/// none.
int MARUShareUserPrivGet(const char* user_name, const MARUSHARE* share);

/// The share that holds a volume path (lexically; ".." is refused): writes its name and its own
/// volume path. 0, or -1 when no share holds it or a buffer is too small.
int MARUShareNamePathGet(const char* volume_path, char* name, std::size_t name_size,
                         char* share_path, std::size_t path_size);

/// Each writes 0 or 1 and returns 0, or returns -1.
/// Entries the user cannot read are hidden (`hide unreadable`).
int MLIBShareHideUnreadableGet(const MARUSHARE* share, int* value);
/// The share lies on an encrypted file tree (statx).
int MLIBShareIsEncryptedGet(const MARUSHARE* share, int* value);
int MLIBShareIsEncryptionGet(const MARUSHARE* share, int* value);
/// The share lies on a file system mounted read-only. (Samba's own `read only` says what the
/// network may write, not whether the folder can be indexed.)
int MLIBShareIsReadOnlyGet(const MARUSHARE* share, int* value);
/// The share has a recycle bin (`vfs objects` has recycle).
int MLIBShareRecycleStatusGet(const MARUSHARE* share, int* value);

/// Called with each share; a result of 0 selects it.
using MLIBShareFilter = int (*)(const MARUSHARE* share);
/// Appends the names of the selected shares to the list. The number of names, or -1.
int MLIBShareEnum(MLIBCSzList** list, MLIBShareFilter filter);

/// Whether `bytes` more fit under the path: the quota of the file system where there is one, else
/// its free space. Not 0: yes. 0: no, and the last error is kErrOverQuota or kErrNoSpace, or
/// another code when it could not be told. `uid` 0 means the path's owner; `flags` is 0.
int MARUQuotaIsEnough(unsigned int uid, const char* path, std::uint64_t bytes, int flags);
