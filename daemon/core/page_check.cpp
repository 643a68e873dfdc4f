#include "daemon/core/page_check.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <numeric>
#include <string>

#include "daemon/core/capability.h"
#include "system/rights_cache.h"
#include "system/share_access.h"
#include "system/unique_fd.h"

namespace maru::daemon {
namespace {

RightsCache known_rights;

/// Walks from folder to folder of one share with the way to the present one kept open, so that hits
/// in the order of their paths look at each folder once. Every step is taken from the folder
/// before, never by a path: what is renamed meanwhile cannot lead past a folder that was not looked
/// at.
class Walk {
 public:
  Walk(const Identity& who, const ShareSettings& share) : who_(who) {
    UniqueFd root(open(share.path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    const bool open_to_them = root && Passable(root.Get());
    way_.push_back({{}, std::move(root), open_to_them});
  }

  bool Readable(const index::Hit& hit) {
    const std::string_view path = hit.path;
    const std::size_t slash = path.rfind('/');
    if (slash == std::string_view::npos) return Readable(way_[0].folder.Get(), "", hit.record);
    if (!Enter(path.substr(0, slash))) return false;
    return Readable(way_.back().folder.Get(), std::string(path.substr(slash + 1)), hit.record);
  }

 private:
  struct Step {
    std::string name;
    UniqueFd folder;
    /// Whether they may go through it, coming from the share's folder.
    bool passable;
  };

  /// What they may do with a file, and what it is; nothing when it cannot be examined.
  int Bits(int folder, const std::string& name, struct stat& status) const {
    if (who_.unrestricted) {
      const int flags = AT_SYMLINK_NOFOLLOW | AT_EMPTY_PATH;
      return fstatat(folder, name.c_str(), &status, flags) == 0 ? kACLRead | kACLExecute : 0;
    }
    FileRights rights;
    return known_rights.Read(folder, name.c_str(), rights, status) ? RightsOf(who_, rights) : 0;
  }
  bool Passable(int folder) const {
    struct stat status;
    return Bits(folder, "", status) & kACLExecute;
  }
  /// Another file in its place has a text of its own.
  bool Readable(int folder, const std::string& name, const index::Record& record) const {
    struct stat status;
    return (Bits(folder, name, status) & kACLRead) && status.st_ino == record.inode &&
           (record.is_dir ? S_ISDIR(status.st_mode) : S_ISREG(status.st_mode));
  }

  /// Makes the folder ("/a/b") the present one: steps that the way has in common with it stay, the
  /// others go, and what is missing is opened. False when they cannot reach it.
  bool Enter(std::string_view folder) {
    std::size_t depth = 0;
    while (!folder.empty()) {
      folder.remove_prefix(1);
      const std::string name(folder.substr(0, folder.find('/')));
      folder.remove_prefix(name.size());
      if (++depth >= kMaxPathDepth) return false;
      if (depth < way_.size() && way_[depth].name == name) continue;
      way_.resize(std::min(way_.size(), depth));
      if (!Descend(name)) return false;
    }
    way_.resize(depth + 1);
    return way_.back().passable;
  }

  bool Descend(const std::string& name) {
    const Step& from = way_.back();
    if (!from.passable) return false;
    UniqueFd folder(
        openat(from.folder.Get(), name.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    const bool passable = folder && Passable(folder.Get());
    way_.push_back({name, std::move(folder), passable});
    return passable;
  }

  const Identity& who_;
  std::vector<Step> way_;
};

bool IsServed(const Scope& scope, const ShareIndex& index, const std::string& path) {
  return scope.eyes.identity.unrestricted || Serves(*index.share, scope.eyes.user_name, path);
}

}  // namespace

std::vector<bool> ReadableNow(const Scope& scope, const std::vector<index::Hit>& hits) {
  std::vector<std::size_t> order(hits.size());
  std::iota(order.begin(), order.end(), 0);
  std::sort(order.begin(), order.end(), [&](std::size_t a, std::size_t b) {
    return std::tie(hits[a].share, hits[a].path) < std::tie(hits[b].share, hits[b].path);
  });
  const RaisedReadSearch raised;
  std::vector<bool> readable(hits.size());
  for (std::size_t i = 0; i < order.size();) {
    const std::size_t share = hits[order[i]].share;
    const ShareIndex& index = scope.indices[share];
    Walk walk(index.who, *index.share);
    for (; i < order.size() && hits[order[i]].share == share; ++i) {
      const index::Hit& hit = hits[order[i]];
      readable[order[i]] = IsServed(scope, index, hit.path) && walk.Readable(hit);
    }
  }
  return readable;
}

}  // namespace maru::daemon
