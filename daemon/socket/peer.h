#pragma once

#include <sys/types.h>

#include "system/rights.h"

namespace maru::daemon {

/// Who has connected: effective user id and groups at that moment, as the kernel attests. Root and
/// the service are unrestricted. False when the kernel does not say.
bool IdentityOfPeer(int socket, uid_t service, Identity& identity);

/// Whether the other side is gone altogether. (One that has merely said all it has to say is not.)
bool HasHungUp(int socket);

/// Whether there is something to be read.
bool HasInput(int socket);

}  // namespace maru::daemon
