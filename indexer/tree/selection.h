#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "indexer/tree/listing.h"
#include "system/rights.h"
#include "system/share_table.h"

namespace maru::indexer {

/// What of a share is indexed, and with which rights: what Samba shows nobody is no document, and
/// of personal folders each is closed as Samba closes it. A depth of 0 is the share's own folder, 1
/// what lies in it.
class Selection {
 public:
  /// Everything.
  Selection() = default;
  explicit Selection(const ShareSettings& share);

  bool Takes(std::size_t depth, const Found& found) const;
  /// Takes from the rights of a file or folder what nobody has by them.
  void Narrow(std::size_t depth, std::string_view name, FileRights& rights) const;

 private:
  bool IsOnWay(std::size_t depth, const Found& found) const;
  FileRights RightsOfOwner(const std::string& folder, const FileRights& rights) const;

  ShareSettings share_;
  /// Depth of the folders that are somebody's own; 0 when there are none.
  std::size_t personal_ = 0;
};

}  // namespace maru::indexer
