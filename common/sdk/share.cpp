#include "common/sdk/share.h"

#include "common/common.h"
#include "platform/file_index.h"
#include "platform/process.h"
#include "platform/share.h"

namespace maruseeker::sdk {
namespace {

constexpr std::uint64_t kEnoughSpace = 100u << 20;
constexpr std::size_t kPathSize = 4096;
constexpr std::size_t kNameSize = 1024;
constexpr int kShareListCapacity = 1024;

int EveryShare(const MARUSHARE*) {
  return 0;
}

}  // namespace

SDKShare::SDKShare(const std::string& share_name) : share_name_(share_name) {
  LockMutex lock(SDKMutex());
  MARU_FAIL_IF(0 > MARUShareGet(share_name.c_str(), &share_info_) || !share_info_, kErrorShare,
               share_name);
}

SDKShare::~SDKShare() {
  LockMutex lock(SDKMutex());
  MARUShareFree(share_info_);
}

bool SDKShare::IsHideUnReadable() const {
  int value = 0;
  return MLIBShareHideUnreadableGet(share_info_, &value) >= 0 && value == 1;
}

bool SDKShare::IsSpaceEnough() const {
  LockMutex lock(SDKMutex());
  if (MARUQuotaIsEnough(0, share_info_->szPath, kEnoughSpace, 0) != 0) return true;
  const int error = MLIBCErrGet();
  return error != kErrOverQuota && error != kErrNoSpace;
}

unsigned int SDKShare::GetFTPPrivilege() const {
  return share_info_->fFTPPriv;
}

int SDKShare::GetPrivilege(const std::string& user_name) const {
  const int privilege = MARUShareUserPrivGet(user_name.c_str(), share_info_);
  return privilege < 0 ? static_cast<int>(kSharePrivNone) : privilege;
}

bool SDKShare::CanBeIndexed() const {
  LockMutex lock(SDKMutex());
  int is_encrypted = 0;
  int is_readonly = 0;
  MARU_FAIL_IF(0 > MLIBShareIsEncryptedGet(share_info_, &is_encrypted), kErrorPlatform,
               "MLIBShareis_encryptedGet failed, share=" + share_name_);
  MARU_FAIL_IF(0 > MLIBShareIsReadOnlyGet(share_info_, &is_readonly), kErrorPlatform,
               "MLIBShareis_readonlyGet failed, share=" + share_name_);
  return is_encrypted == 0 && is_readonly == 0;
}

bool SDKShare::IsEncryption() const {
  LockMutex lock(SDKMutex());
  int is_encryption = 0;
  MARU_FAIL_IF(0 > MLIBShareIsEncryptionGet(share_info_, &is_encryption), kErrorPlatform,
               "MLIBShareIsEncryptionGet failed, share=" + share_name_);
  return is_encryption == 1;
}

bool SDKShare::IsEnableRecycleBin() const {
  LockMutex lock(SDKMutex());
  int is_enabled = 0;
  MARU_FAIL_IF(0 > MLIBShareRecycleStatusGet(share_info_, &is_enabled), kErrorPlatform,
               "MLIBShareRecycleStatusGet failed, share=" + share_name_);
  return is_enabled == 1;
}

std::string SDKShare::GetQueuePath() const {
  if (!queue_path_.empty()) return queue_path_;
  LockMutex lock(SDKMutex());
  char path[kPathSize] = {};
  MARU_FAIL_IF(0 > FILEIDXQueuePathCompose(share_info_->szPath, path, sizeof(path)), kErrorPlatform,
               "FILEIDXQueuePathCompose failed, share=" + share_name_);
  return queue_path_ = path;
}

std::string SDKShare::GetDBPath() const {
  if (!db_path_.empty()) return db_path_;
  LockMutex lock(SDKMutex());
  char path[kPathSize] = {};
  MARU_FAIL_IF(0 > FILEIDXDBPathCompose(share_info_->szPath, path, sizeof(path)), kErrorPlatform,
               "FILEIDXDBPathCompose failed, share=" + share_name_);
  return db_path_ = path;
}

std::string SDKShare::GetDBName() const {
  if (!db_name_.empty()) return db_name_;
  LockMutex lock(SDKMutex());
  char name[kNameSize] = {};
  MARU_FAIL_IF(0 > FILEIDXGetIndexID(share_info_->szName, name, sizeof(name)), kErrorPlatform,
               "FILEIDXGetIndexID failed, share=" + share_name_);
  return db_name_ = name;
}

std::set<std::string> SDKShare::Enum() {
  MLIBCSzList* share_list = MLIBCSzListAlloc(kShareListCapacity);
  if (!share_list) {
    MARU_FAIL_AS("nullptr == (share_list = MLIBCSzListAlloc(BUFSIZ))", kErrorDaemonExchange,
                 "MLIBCSzListAlloc failed");
  }
  if (0 > MLIBShareEnum(&share_list, &EveryShare)) {
    MARU_FAIL_AS("0 > MLIBShareEnum(&share_list, &enum_func)", kErrorDaemonExchange,
                 "MLIBShareEnum failed");
  }
  std::set<std::string> names;
  for (int i = 0; i < MLIBCSzListCount(share_list); ++i)
    names.insert(MLIBCSzListGet(share_list, i));
  return names;
}

}  // namespace maruseeker::sdk
