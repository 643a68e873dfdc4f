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
    const bool open_to_them = root && Allows(root.Get(), "", kACLExecute);
    way_.push_back({{}, std::move(root), open_to_them});
  }

  bool Readable(std::string_view path) {
    const std::size_t slash = path.rfind('/');
    if (slash == std::string_view::npos) return Allows(way_[0].folder.Get(), "", kACLRead);
    if (!Enter(path.substr(0, slash))) return false;
    return Allows(way_.back().folder.Get(), std::string(path.substr(slash + 1)), kACLRead);
  }

 private:
  struct Step {
    std::string name;
    UniqueFd folder;
    /// Whether they may go through it, coming from the share's folder.
    bool passable;
  };

  bool Allows(int folder, const std::string& name, int wanted) const {
    if (who_.unrestricted) {
      struct stat status;
      return fstatat(folder, name.c_str(), &status, AT_SYMLINK_NOFOLLOW | AT_EMPTY_PATH) == 0;
    }
    FileRights rights;
    return known_rights.Read(folder, name.c_str(), rights) && (RightsOf(who_, rights) & wanted);
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
    const bool passable = folder && Allows(folder.Get(), "", kACLExecute);
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
      const std::string& path = hits[order[i]].path;
      readable[order[i]] = IsServed(scope, index, path) && walk.Readable(path);
    }
  }
  return readable;
}

}  // namespace maru::daemon
