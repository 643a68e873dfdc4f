#include <endian.h>
#include <errno.h>
#include <fcntl.h>
#include <linux/limits.h>
#include <string.h>
#include <sys/acl.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include <array>
#include <optional>

#include "system/rights.h"
#include "system/unique_fd.h"

namespace maru {
namespace {

constexpr const char* kAttribute = "system.posix_acl_access";
constexpr std::uint32_t kVersion = 2;
constexpr std::size_t kHeader = 4;
constexpr std::size_t kEntry = 8;

struct Entry {
  int tag;
  int bits;
  std::uint32_t id;
};

/// The attribute's entries, one at a time: a version of four bytes, then tag (2), bits (2) and id
/// (4), all little-endian.
class Entries {
 public:
  explicit Entries(const std::string& acl) : acl_(acl) {}

  bool WellFormed() const {
    return acl_.size() >= kHeader && (acl_.size() - kHeader) % kEntry == 0 &&
           Number<std::uint32_t>(0) == kVersion;
  }
  std::size_t Count() const { return (acl_.size() - kHeader) / kEntry; }
  Entry At(std::size_t index) const {
    const std::size_t at = kHeader + index * kEntry;
    return {Number<std::uint16_t>(at), Number<std::uint16_t>(at + 2) & 7,
            Number<std::uint32_t>(at + 4)};
  }

 private:
  template <class T>
  T Number(std::size_t at) const {
    T number;
    memcpy(&number, acl_.data() + at, sizeof(number));
    return sizeof(T) == 2 ? le16toh(static_cast<std::uint16_t>(number))
                          : static_cast<T>(le32toh(static_cast<std::uint32_t>(number)));
  }

  const std::string& acl_;
};

/// The kernel's walk through an access ACL. A user entry decides alone; of the group entries that
/// fit, each may give a bit; the mask bounds both; others come last, when no group entry fitted.
/// The owner never gets here.
std::optional<int> BitsOfACL(const Identity& who, const FileRights& rights) {
  const Entries entries(rights.acl);
  if (!entries.WellFormed()) return std::nullopt;
  std::optional<int> user, group, mask, other;
  for (std::size_t i = 0; i < entries.Count(); ++i) {
    const Entry entry = entries.At(i);
    switch (entry.tag) {
      case ACL_USER_OBJ:
        break;
      case ACL_USER:
        if (entry.id == who.uid && !user) user = entry.bits;
        break;
      case ACL_GROUP_OBJ:
        if (who.InGroup(rights.gid)) group = group.value_or(0) | entry.bits;
        break;
      case ACL_GROUP:
        if (who.InGroup(entry.id)) group = group.value_or(0) | entry.bits;
        break;
      case ACL_MASK:
        mask = entry.bits;
        break;
      case ACL_OTHER:
        other = entry.bits;
        break;
      default:
        return std::nullopt;
    }
  }
  if (user) return *user & mask.value_or(7);
  if (group) return *group & mask.value_or(7);
  return other;
}

/// The attribute of an open file, also of one opened by O_PATH, which only /proc can ask.
bool ReadACL(int descriptor, std::string& acl) {
  const std::string path = "/proc/self/fd/" + std::to_string(descriptor);
  std::array<char, 512> buffer;
  ssize_t size = getxattr(path.c_str(), kAttribute, buffer.data(), buffer.size());
  if (size >= 0) {
    acl.assign(buffer.data(), static_cast<std::size_t>(size));
    return true;
  }
  acl.clear();
  if (errno == ENODATA || errno == EOPNOTSUPP) return true;
  if (errno != ERANGE) return false;
  acl.resize(XATTR_SIZE_MAX);
  size = getxattr(path.c_str(), kAttribute, acl.data(), acl.size());
  acl.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
  return size >= 0;
}

bool ReadOpenFile(int descriptor, FileRights& rights, struct stat& status) {
  if (fstat(descriptor, &status) != 0 || !ReadACL(descriptor, rights.acl)) return false;
  rights.TakeMode(status);
  return true;
}

}  // namespace

void FileRights::TakeMode(const struct stat& status) {
  uid = status.st_uid;
  gid = status.st_gid;
  mode = static_cast<std::uint16_t>(status.st_mode & 0777);
}

bool ReadFileRights(int directory, const char* path, FileRights& rights, struct stat* status) {
  struct stat unwanted;
  struct stat& found = status ? *status : unwanted;
  if (*path == '\0') return ReadOpenFile(directory, rights, found);
  const UniqueFd file(openat(directory, path, O_PATH | O_NOFOLLOW | O_CLOEXEC));
  return file && ReadOpenFile(file.Get(), rights, found);
}

int RightsOf(const Identity& who, const FileRights& rights) {
  if (who.unrestricted) return kACLRead | kACLWrite | kACLExecute;
  if (who.uid == rights.uid) return rights.mode >> 6 & 7;
  // With an ACL the group bits of the mode are its mask; the kernel leaves the ACL aside where they
  // are empty, and judges by the mode alone.
  if (!rights.acl.empty() && (rights.mode & 070) != 0) return BitsOfACL(who, rights).value_or(0);
  return (who.InGroup(rights.gid) ? rights.mode >> 3 : rights.mode) & 7;
}

void WithoutRead(FileRights& rights) {
  // Without any bit the group's would say that the ACL is left aside.
  const bool has_acl = !rights.acl.empty() && (rights.mode & 070) != 0;
  rights.mode = static_cast<std::uint16_t>((rights.mode & ~0444) | (has_acl ? 020 : 0));
  for (std::size_t at = kHeader; at + kEntry <= rights.acl.size(); at += kEntry) {
    const bool is_mask = static_cast<unsigned char>(rights.acl[at]) == ACL_MASK;
    char& bits = rights.acl[at + sizeof(std::uint16_t)];
    bits = static_cast<char>((bits & ~kACLRead) | (is_mask ? kACLWrite : 0));
  }
}

}  // namespace maru
