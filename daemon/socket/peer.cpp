#include "daemon/socket/peer.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>

namespace maru::daemon {

bool IdentityOfPeer(int socket, uid_t service, Identity& identity) {
  ucred credentials{};
  socklen_t length = sizeof credentials;
  if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0 ||
      length != sizeof credentials) {
    return false;
  }
  std::vector<gid_t> groups(32);
  for (;;) {
    length = static_cast<socklen_t>(groups.size() * sizeof(gid_t));
    if (getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &length) == 0) break;
    if (errno != ERANGE) return false;
    groups.resize(length / sizeof(gid_t));
  }
  groups.resize(length / sizeof(gid_t));
  groups.push_back(credentials.gid);
  std::sort(groups.begin(), groups.end());
  groups.erase(std::unique(groups.begin(), groups.end()), groups.end());
  identity = {credentials.uid, std::move(groups),
              credentials.uid == 0 || credentials.uid == service};
  return true;
}

bool HasHungUp(int socket) {
  pollfd state{socket, 0, 0};
  return poll(&state, 1, 0) > 0 && (state.revents & (POLLHUP | POLLERR | POLLNVAL)) != 0;
}

bool HasInput(int socket) {
  pollfd state{socket, POLLIN, 0};
  return poll(&state, 1, 0) > 0;
}

}  // namespace maru::daemon
