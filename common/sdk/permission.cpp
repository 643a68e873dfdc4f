#include "common/sdk/permission.h"

#include "common/common.h"
#include "common/sdk/share.h"
#include "platform/account.h"
#include "platform/acl.h"
#include "platform/share.h"

namespace maruseeker {
namespace {

using sdk::SDKShare;
using std::string;

constexpr int kTraverseAndRead = kACLRead | kACLExecute;
constexpr unsigned int kDenyList = 1;
constexpr unsigned int kDenyRead = 4;

string ExtractShareName(const string& full_path) {
  const std::size_t slash_pos1 = full_path.find('/', 1);
  MARU_FAIL_IF(string::npos == slash_pos1, kErrorPlatform, "Malformed path: " + full_path);
  const std::size_t slash_pos2 = full_path.find('/', slash_pos1 + 1);
  return full_path.substr(slash_pos1 + 1, slash_pos2 - slash_pos1 - 1);
}

}  // namespace

FilePermission::FilePermission(const string& user_name)
    : user_name_(user_name), group_info_list_(MLIBGroupInfoListGet(user_name_.c_str(), true)) {
  if (!group_info_list_) {
    MARU_FAIL_AS("nullptr == (group_info_list_ = MLIBGroupInfoListGet(user_name_.c_str(), TRUE))",
                 kErrorPlatform, "MLIBGroupInfoListGet failed, user: " + user_name_);
  }
}

FilePermission::~FilePermission() {
  MLIBCSzListFree(group_info_list_);
}

bool FilePermission::CheckRead(const string& full_path) {
  const auto share = GetShare(ExtractShareName(full_path));
  if (share->GetName() != "homes") {
    if (share->GetFTPPrivilege() & kDenyRead) return false;
    if (share->GetPrivilege(user_name_) == kSharePrivNone) return false;
  }
  return (GetPathACL(full_path) & kACLRead) != 0;
}

bool FilePermission::CheckList(const string& full_path) {
  const auto share = GetShare(ExtractShareName(full_path));
  if (share->GetFTPPrivilege() & kDenyList) return false;
  if ((GetPathACL(Dirname(full_path)) & kTraverseAndRead) != kTraverseAndRead) return false;
  if (!share->IsHideUnReadable()) return true;
  return (GetPathACL(full_path) & kACLRead) != 0;
}

std::shared_ptr<SDKShare> FilePermission::GetShare(const string& share_name) {
  const auto known = shares_.find(share_name);
  if (known != shares_.end()) return known->second;
  return shares_.emplace(share_name, std::make_shared<SDKShare>(share_name)).first->second;
}

int FilePermission::GetPathACL(const string& full_path) {
  const auto known = acls_.find(full_path);
  if (known != acls_.end()) return known->second;
  int perm = 0;
  MARU_FAIL_IF(
      -1 == MARUACLPermCalc(user_name_.c_str(), group_info_list_, full_path.c_str(), &perm),
      kErrorPlatform, "MARUACLPermCalc failed, user: " + user_name_ + ", path: " + full_path);
  return acls_.emplace(full_path, perm).first->second;
}

}  // namespace maruseeker
