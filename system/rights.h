#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

/// File rights by the kernel's rules: owner, group, mode and POSIX access ACL with its mask.

constexpr int kACLRead = 4;
constexpr int kACLWrite = 2;
constexpr int kACLExecute = 1;

namespace maru {

/// Whose eyes: a user id and all its group ids, sorted.
struct Identity {
  uid_t uid = 0;
  std::vector<gid_t> groups;
  /// Root and the service itself: every right on every file.
  bool unrestricted = false;

  bool InGroup(gid_t gid) const;
  friend bool operator==(const Identity&, const Identity&) = default;
};

/// The identity of an account from the name service. Nothing, with errno, as AccountByName.
std::optional<Identity> IdentityOfUser(const std::string& user_name);
std::optional<Identity> IdentityOfUID(uid_t uid);

/// What the kernel consults for one file or directory.
struct FileRights {
  uid_t uid = 0;
  gid_t gid = 0;
  /// Permission bits 0777 only.
  std::uint16_t mode = 0;
  /// The raw value of the attribute system.posix_acl_access; empty when the mode says all.
  std::string acl;

  /// All but the ACL.
  void TakeMode(const struct stat& status);

  friend auto operator<=>(const FileRights&, const FileRights&) = default;
};

/// Reads them without following a link in the last component. `path` is relative to `directory` (or
/// AT_FDCWD); an empty path means `directory` itself. `status`, when given, is the file's as it was
/// just before. False with errno.
bool ReadFileRights(int directory, const char* path, FileRights& rights,
                    struct stat* status = nullptr);

/// The bits (4, 2, 1) of one identity by these rights alone (the way there is not judged). A
/// malformed ACL gives none.
int RightsOf(const Identity& who, const FileRights& rights);

/// Takes reading from everybody; who may search a folder stays as it was, who may write it need
/// not.
void WithoutRead(FileRights& rights);

}  // namespace maru
