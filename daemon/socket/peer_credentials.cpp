#include "daemon/socket/peer_credentials.h"

#include <sys/socket.h>

#include <algorithm>
#include <cerrno>

namespace maru::daemon {

std::optional<Identity> IdentityOfPeer(int socket, uid_t service) {
  ucred credentials{};
  socklen_t length = sizeof credentials;
  if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0 ||
      length != sizeof credentials) {
    return std::nullopt;
  }
  std::vector<gid_t> groups(32);
  for (;;) {
    length = static_cast<socklen_t>(groups.size() * sizeof(gid_t));
    if (getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &length) == 0) break;
    if (errno != ERANGE) return std::nullopt;
    groups.resize(length / sizeof(gid_t));
  }
  groups.resize(length / sizeof(gid_t));
  groups.push_back(credentials.gid);
  std::sort(groups.begin(), groups.end());
  groups.erase(std::unique(groups.begin(), groups.end()), groups.end());
  const bool unrestricted = credentials.uid == 0 || credentials.uid == service;
  return Identity{credentials.uid, std::move(groups), unrestricted};
}

}  // namespace maru::daemon
