#pragma once

#include <map>
#include <string>

#include "system/share_table.h"

namespace maru::server {

/// The shares of this server under kVolume, in this process's own mount namespace: the machine does
/// not see them, and they end with the last process of the namespace.
class ShareMounts {
 public:
  /// Enters a mount namespace, in which the machine's own mounts go on appearing, and makes an
  /// empty kVolume in it. Throws std::system_error. Once.
  ShareMounts();

  /// Mounts what is new, lies elsewhere now, or is another folder (the operator has mounted or
  /// unmounted a file system there, which must not be held here), unmounts what is gone. A share
  /// that cannot be mounted is logged once and tried again with every call; the others stand.
  void Apply(const ShareTable& table);

 private:
  void Mount(const ShareSettings& share);
  void Unmount(const std::string& name);

  /// Share name to the path that is mounted there; empty when mounting it failed.
  std::map<std::string, std::string> mounted_;
};

}  // namespace maru::server
