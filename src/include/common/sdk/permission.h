#pragma once

#include <map>
#include <memory>
#include <string>

struct MLIBCSzList;

namespace maruseeker {

namespace sdk {
class SDKShare;
}

/// What one user may do with files. For one request and one thread: it remembers every share and
/// every path it has asked about, so a change of rights during its life is not seen. Paths are full
/// paths, "/volume1/share/rest"; failures are Error 502, logged, and Error 800 for an unknown
/// share.
class FilePermission {
 public:
  explicit FilePermission(const std::string& user_name);
  ~FilePermission();
  FilePermission(const FilePermission&) = delete;
  FilePermission& operator=(const FilePermission&) = delete;

  /// May the user read the path? In "homes" only the rights of the path itself count.
  bool CheckRead(const std::string& full_path);
  /// May the user see the path in the listing of its folder? Neither the privilege on the share nor
  /// the exception for "homes" counts here.
  bool CheckList(const std::string& full_path);

  std::shared_ptr<sdk::SDKShare> GetShare(const std::string& share_name);
  /// What the user may do with the path, as bits: 4 read, 2 write, 1 execute.
  int GetPathACL(const std::string& full_path);

 private:
  std::string user_name_;
  MLIBCSzList* group_info_list_ = nullptr;
  std::map<std::string, std::shared_ptr<sdk::SDKShare>> shares_;
  std::map<std::string, int> acls_;
};

}  // namespace maruseeker
