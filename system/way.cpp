#include "system/way.h"

#include <errno.h>
#include <fcntl.h>
#include <linux/limits.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>

#include "system/keep_errno.h"
#include "system/rights_cache.h"
#include "system/unique_fd.h"
#include "system/volume_path.h"

namespace maru {
namespace {

/// The kernel's own limit.
constexpr int kMaxLinks = 40;

RightsCache known_rights;

class Way {
 public:
  explicit Way(const Identity& who) : who_(who) {}

  bool IsOpenTo(std::string rest) {
    if (!Stand(AT_FDCWD, "/")) return false;
    while (true) {
      std::string_view left = rest;
      const std::string name(TakeComponent(left));
      if (name.empty()) return true;
      std::string after(left);
      std::string target;
      if (ReadLink(name, target)) {
        if (++links_ > kMaxLinks) return false;
        if (target.starts_with('/') && !Stand(AT_FDCWD, "/")) return false;
        after = target + "/" + after;
      } else if (!Stand(at_.Get(), name)) {
        return errno == ENOENT;
      }
      rest = std::move(after);
    }
  }

 private:
  /// Goes into a folder; false, with errno, when they cannot go through it.
  bool Stand(int from, const std::string& name) {
    UniqueFd next(openat(from, name.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    FileRights rights;
    struct stat status;
    if (!next || !known_rights.Read(next.Get(), "", rights, status)) return false;
    errno = EACCES;
    at_ = std::move(next);
    return (RightsOf(who_, rights) & kACLExecute) != 0;
  }

  bool ReadLink(const std::string& name, std::string& target) const {
    std::array<char, PATH_MAX> buffer;
    const ssize_t size = readlinkat(at_.Get(), name.c_str(), buffer.data(), buffer.size());
    if (size > 0) target.assign(buffer.data(), static_cast<std::size_t>(size));
    return size > 0;
  }

  const Identity& who_;
  UniqueFd at_;
  int links_ = 0;
};

}  // namespace

bool CanReach(const Identity& who, const std::string& folder) {
  const KeepErrno keep;
  return who.unrestricted || Way(who).IsOpenTo(folder);
}

}  // namespace maru
