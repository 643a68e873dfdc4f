#include "common/sdk/user.h"

#include <memory>

#include "common/common.h"
#include "platform/account.h"

namespace maruseeker::sdk {
namespace {

using Entry = std::unique_ptr<MARUUSER, decltype(&MARUUserFree)>;

/// What a look-up with this result and record stands for.
Entry Found(int result, MARUUSER* record) {
  Entry entry(record, &MARUUserFree);
  if (result < 0 || !entry) throw Error(kErrorUser);
  return entry;
}

}  // namespace

User::User(const std::string& user_name) : name(user_name) {
  LockMutex lock(SDKMutex());
  MARUUSER* record = nullptr;
  const int result = MARUUserGet(name.c_str(), &record);
  Fill(*Found(result, record));
}

User::User(std::uint32_t user_id) {
  LockMutex lock(SDKMutex());
  MARUUSER* record = nullptr;
  const int result = MARUUserGetByUID(user_id, &record);
  const Entry entry = Found(result, record);
  name = entry->szName;
  Fill(*entry);
}

void User::Fill(const MARUUSER& entry) {
  uid = entry.nUid;
  gid = entry.nGid;
  auth_type = entry.nAuthType;
  home_enabled = MARUServiceUserHomeIsEnabled(auth_type, name.c_str());
}

}  // namespace maruseeker::sdk
