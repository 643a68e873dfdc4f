#include "system/indexed_shares.h"

#include <sys/stat.h>

#include "system/config.h"
#include "system/index_id.h"
#include "system/keep_errno.h"
#include "system/share_table.h"

namespace maru {

std::string IndexHome() {
  return Config::Get().state_dir + "/index";
}

std::set<std::string> IndexedShares() {
  const KeepErrno keep;
  std::set<std::string> names;
  const auto table = ShareTable::Current();
  for (const ShareSettings& share : table->Shares()) {
    struct stat status;
    const std::string folder = IndexHome() + "/" + IndexIdOf(share.name);
    if (stat(folder.c_str(), &status) == 0 && S_ISDIR(status.st_mode)) names.insert(share.name);
  }
  return names;
}

}  // namespace maru
