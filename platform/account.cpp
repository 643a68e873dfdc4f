#include "platform/account.h"

#include <errno.h>

#include <string_view>

#include "platform/guard.h"
#include "system/accounts.h"
#include "system/acting.h"
#include "system/share_table.h"

using maru::Account;
using maru::Fail;
using maru::Guarded;

namespace {

int LookupError() {
  return errno == 0 ? kErrNotFound : kErrSystem;
}

/// A record with what it points to.
struct Record : MARUUSER {
  explicit Record(const Account& account)
      : MARUUSER{nullptr, account.uid, account.gid, 0}, name(account.name) {
    szName = name.c_str();
  }
  Record(const Record&) = delete;
  Record& operator=(const Record&) = delete;

  std::string name;
};

int ToRecord(const std::optional<Account>& account, MARUUSER** user) {
  if (!account) return Fail(LookupError(), -1);
  *user = new Record(*account);
  return 0;
}

/// The account's own folder in the folder of all homes; it may be named differently from itself.
std::string HomeFolder(const Account& account, const std::string& homes) {
  std::string_view home = account.home;
  while (home.ends_with('/')) home.remove_suffix(1);
  if (!home.starts_with(homes + "/")) return account.name;
  return std::string(home.substr(homes.size() + 1));
}

}  // namespace

int MARUUserGet(const char* name, MARUUSER** user) {
  if (!name || !user) return Fail(kErrBadParameter, -1);
  *user = nullptr;
  return Guarded("MARUUserGet", -1, [&] { return ToRecord(maru::AccountByName(name), user); });
}

int MARUUserGetByUID(uid_t uid, MARUUSER** user) {
  if (!user) return Fail(kErrBadParameter, -1);
  *user = nullptr;
  return Guarded("MARUUserGetByUID", -1, [&] { return ToRecord(maru::AccountByUID(uid), user); });
}

void MARUUserFree(MARUUSER* user) {
  delete static_cast<Record*>(user);
}

bool MARUServiceUserHomeIsEnabled(int, const char*) {
  return Guarded("MARUServiceUserHomeIsEnabled", false, [] {
    const auto table = maru::ShareTable::Current();
    const maru::ShareSettings* homes = table->Find(maru::kHomesShare);
    return homes && homes->available;
  });
}

int MARUServiceHomePathGet(const char* user_name, char* path, std::size_t size) {
  if (!user_name || !path) return Fail(kErrBadParameter, -1);
  return Guarded("MARUServiceHomePathGet", -1, [&] {
    const std::optional<Account> account = maru::AccountByName(user_name);
    if (!account) return Fail(LookupError(), -1);
    const auto table = maru::ShareTable::Current();
    const maru::ShareSettings* homes = table->Find(maru::kHomesShare);
    if (!homes || !homes->available) return Fail(kErrNotFound, -1);
    const std::string home = homes->VolumePath() + "/" + HomeFolder(*account, homes->path);
    if (!maru::CopyOut(home, path, size)) return Fail(kErrBadParameter, -1);
    return static_cast<int>(home.size());
  });
}

int MLIBGroupIsAdminGroupMem(const char* user_name, int) {
  if (!user_name) return Fail(kErrBadParameter, -1);
  return Guarded("MLIBGroupIsAdminGroupMem", -1, [&] {
    const std::optional<Account> account = maru::AccountByName(user_name);
    if (!account) return Fail(LookupError(), -1);
    if (maru::IsAdministrator(*account)) return 1;
    return errno == 0 ? 0 : Fail(kErrSystem, -1);
  });
}

MLIBCSzList* MLIBGroupInfoListGet(const char* user_name, bool with_primary) {
  constexpr MLIBCSzList* kNone = nullptr;
  if (!user_name) return Fail(kErrBadParameter, kNone);
  return Guarded("MLIBGroupInfoListGet", kNone, [&] {
    const std::optional<Account> account = maru::AccountByName(user_name);
    if (!account) return Fail(LookupError(), kNone);
    const auto groups = maru::GroupsOf(*account);
    MLIBCSzList* list = groups ? MLIBCSzListAlloc(static_cast<int>(groups->size())) : nullptr;
    if (!list) return Fail(kErrSystem, kNone);
    for (std::size_t i = with_primary ? 0 : 1; i < groups->size(); ++i) {
      if (MLIBCSzListPush(&list, std::to_string((*groups)[i]).c_str()) < 0) {
        MLIBCSzListFree(list);
        return Fail(kErrSystem, kNone);
      }
    }
    return list;
  });
}

bool ResetCredentialsByName(const std::string& user_name, bool groups) {
  return Guarded("ResetCredentialsByName", false,
                 [&] { return maru::ActAs(user_name, groups) || Fail(LookupError(), false); });
}
