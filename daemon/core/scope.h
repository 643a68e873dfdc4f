#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/core/core.h"

/// What a request may see: whose eyes, and which indices.
namespace maru::daemon {

/// Names of indices in one request: each counts once.
constexpr std::size_t kMaxIndices = 65'536;
/// Bytes of an index id.
constexpr std::size_t kMaxIndexId = 300;

/// An identity with the name that share settings know it by.
struct Eyes {
  Identity identity;
  std::string user_name;
  /// Sees nothing at all.
  bool blind = false;
};

/// The caller's eyes, narrowed by "permission" filters. For root and the service they become the
/// named user's. Anybody else may name just himself: another name, an unknown one, or two different
/// ones see nothing, so that no filter ever shows more than its absence. A user id without an
/// account sees nothing either.
Eyes EyesOf(const Identity& caller, const std::vector<std::string>& users);

/// One admitted index, whose it is, and whose rights on files count in it.
struct ShareIndex {
  std::string id;
  const ShareSettings* share;
  Identity who;
};

struct Scope {
  Eyes eyes;
  std::vector<ShareIndex> indices;
  /// Owns the shares.
  std::shared_ptr<const ShareTable> table;

  std::vector<std::string> Ids() const;
};

/// Of the index ids those that exist, as their share's settings are now, and whose share the eyes
/// may enter and reach from "/" on, and is open to the client's address: for administrators and
/// root as for all. A malformed one throws Error (120).
Scope ScopeOf(const Request& request, Eyes eyes, const std::vector<std::string>& ids);

/// Throws Error (120) for what can be no index id at all: empty, with a slash or a control
/// character, "." or "..".
void CheckIndexId(const std::string& id);

/// The scope's indices, in their order, each through the eyes that count in it. Throws Error (121)
/// when one is about to be made by other settings.
std::unique_ptr<index::View> OpenView(const Core& core, const Scope& scope,
                                      const CancelCheck& cancelled);

}  // namespace maru::daemon
