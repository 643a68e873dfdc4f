#pragma once

#include <sys/types.h>

#include <cstddef>

#include "system/unique_fd.h"

/// Descriptors that go from process to process with the bytes of a local socket.
namespace maru {

/// sendmsg of the bytes, with `passed` beside them unless it is -1; it stays the caller's too. Goes
/// on after EINTR, never raises SIGPIPE; otherwise result, errno and `flags` are sendmsg's.
ssize_t SendWithDescriptor(int socket, const void* bytes, std::size_t size, int passed, int flags);

/// recvmsg likewise. A descriptor that comes with the bytes is put into `passed`, closed on exec;
/// when none comes `passed` stays as it is. Where `passed` is null, and from the second on, the
/// kernel throws descriptors away.
ssize_t ReceiveWithDescriptor(int socket, void* bytes, std::size_t size, UniqueFd* passed,
                              int flags);

}  // namespace maru
