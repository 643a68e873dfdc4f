#pragma once

#include <sys/types.h>

#include <optional>

#include "system/rights.h"

namespace maru::daemon {

/// Who has connected: effective user id and groups at that moment, as the kernel attests. Root and
/// the service are unrestricted. None when the kernel does not say.
std::optional<Identity> IdentityOfPeer(int socket, uid_t service);

}  // namespace maru::daemon
