#include "system/share_acls.h"

#include <errno.h>
#include <string.h>

#include "system/text.h"
#include "system/whole_file.h"

namespace maru {
namespace {

constexpr const char* kFile = "/share_info.tdb";
constexpr std::size_t kMaxFile = 64u << 20;
/// A record is a head of six numbers, the last of them this one, the key, and the data.
constexpr std::uint32_t kLiveRecord = 0x26011999;

}  // namespace

ShareACLs::ShareACLs(const std::string& folder) {
  const int before = errno;
  if (!ReadWholeFile(folder + kFile, kMaxFile, content_, Link::kFollow) && errno != ENOENT) {
    error_ = folder + kFile + ", which may hold an ACL of it, cannot be read: " + strerror(errno);
  }
  errno = before;
}

/// Looks for the key wherever it stands: of a removed record too little may be left to be told from
/// a live one, and then the share stays withheld.
std::string ShareACLs::ReasonAgainst(const std::string& share) const {
  if (!error_.empty()) return error_;
  std::string head(sizeof(kLiveRecord), '\0');
  memcpy(head.data(), &kLiveRecord, sizeof(kLiveRecord));
  const std::string key = head + "SECDESC/" + Lowered(share) + '\0';
  return content_.find(key) == std::string::npos ? "" : "it has an ACL of its own (sharesec)";
}

}  // namespace maru
