#include "platform/share.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

#include <string>

#include "platform/account.h"
#include "platform/guard.h"
#include "system/client_address.h"
#include "system/share_access.h"
#include "system/share_table.h"
#include "system/volume_path.h"

using maru::CopyOut;
using maru::Fail;
using maru::Guarded;
using maru::ShareSettings;
using maru::ShareTable;

namespace {

/// The settings of the share that a record stands for.
template <class Ask>
int AskSettings(const char* operation, const MARUSHARE* share, int* value, Ask ask) {
  if (!share || !value) return Fail(kErrBadParameter, -1);
  return Guarded(operation, -1, [&] {
    const auto table = ShareTable::Current();
    const ShareSettings* settings = table->Find(share->szName);
    if (!settings) return Fail(kErrNotFound, -1);
    *value = ask(*settings) ? 1 : 0;
    return 0;
  });
}

/// A record with what it points to.
struct Record : MARUSHARE {
  explicit Record(const ShareSettings& settings)
      : name(settings.name), path(settings.VolumePath()) {
    szName = name.data();
    szPath = path.data();
    fFTPPriv = settings.deny;
  }
  Record(const Record&) = delete;
  Record& operator=(const Record&) = delete;

  std::string name, path;
};

}  // namespace

int MARUShareGet(const char* name, MARUSHARE** share) {
  if (!name || !share) return Fail(kErrBadParameter, -1);
  *share = nullptr;
  return Guarded("MARUShareGet", -1, [&] {
    const auto table = ShareTable::Current();
    const ShareSettings* settings = table->Find(name);
    if (!settings) return Fail(kErrNotFound, -1);
    *share = new Record(*settings);
    return 0;
  });
}

void MARUShareFree(MARUSHARE* share) {
  delete static_cast<Record*>(share);
}

int MARUShareUserPrivGet(const char* user_name, const MARUSHARE* share) {
  if (!user_name || !share) return Fail(kErrBadParameter, -1);
  static_assert(int{kSharePrivReadWrite} == maru::kSharePrivReadWrite &&
                int{kSharePrivReadOnly} == maru::kSharePrivReadOnly &&
                int{kSharePrivNone} == maru::kSharePrivNone);
  return Guarded("MARUShareUserPrivGet", -1, [&] {
    const auto table = ShareTable::Current();
    const ShareSettings* settings = table->Find(share->szName);
    if (!settings) return Fail(kErrNotFound, -1);
    if (!settings->IsOpenTo(maru::PresentClient())) return int{kSharePrivNone};
    const std::optional<maru::Identity> identity = maru::IdentityOfUser(user_name);
    if (!identity) return int{kSharePrivNone};
    if (MLIBGroupIsAdminGroupMem(user_name, 0) == 1) return int{kSharePrivReadWrite};
    const maru::ShareAccess access = maru::AccessOf(*settings, user_name, *identity);
    return int{access.privilege};
  });
}

int MARUShareNamePathGet(const char* volume_path, char* name, std::size_t name_size,
                         char* share_path, std::size_t path_size) {
  if (!volume_path) return Fail(kErrBadParameter, -1);
  return Guarded("MARUShareNamePathGet", -1, [&] {
    maru::VolumePath place;
    if (!maru::SplitVolumePath(volume_path, place)) return Fail(kErrBadParameter, -1);
    if (!ShareTable::Current()->Find(std::string(place.share))) return Fail(kErrNotFound, -1);
    if (!CopyOut(place.share, name, name_size) || !CopyOut(place.folder, share_path, path_size)) {
      return Fail(kErrBadParameter, -1);
    }
    return 0;
  });
}

int MLIBShareHideUnreadableGet(const MARUSHARE* share, int* value) {
  return AskSettings("MLIBShareHideUnreadableGet", share, value,
                     [](const ShareSettings& settings) { return settings.hide_unreadable; });
}

int MLIBShareIsEncryptedGet(const MARUSHARE* share, int* value) {
  if (!share || !value) return Fail(kErrBadParameter, -1);
  struct statx status;
  if (statx(AT_FDCWD, share->szPath, 0, STATX_TYPE, &status) != 0) return Fail(kErrSystem, -1);
  *value = status.stx_attributes & STATX_ATTR_ENCRYPTED ? 1 : 0;
  return 0;
}

int MLIBShareIsEncryptionGet(const MARUSHARE* share, int* value) {
  return MLIBShareIsEncryptedGet(share, value);
}

int MLIBShareIsReadOnlyGet(const MARUSHARE* share, int* value) {
  if (!share || !value) return Fail(kErrBadParameter, -1);
  struct statvfs status;
  if (statvfs(share->szPath, &status) != 0) return Fail(kErrSystem, -1);
  *value = status.f_flag & ST_RDONLY ? 1 : 0;
  return 0;
}

int MLIBShareRecycleStatusGet(const MARUSHARE* share, int* value) {
  return AskSettings("MLIBShareRecycleStatusGet", share, value,
                     [](const ShareSettings& settings) { return settings.recycle; });
}

int MLIBShareEnum(MLIBCSzList** list, MLIBShareFilter filter) {
  if (!list || !*list || !filter) return Fail(kErrBadParameter, -1);
  return Guarded("MLIBShareEnum", -1, [&] {
    int count = 0;
    const auto table = ShareTable::Current();
    for (const ShareSettings& settings : table->Shares()) {
      const Record share(settings);
      if (filter(&share) != 0) continue;
      if (MLIBCSzListPush(list, settings.name.c_str()) < 0) return Fail(kErrSystem, -1);
      ++count;
    }
    return count;
  });
}
