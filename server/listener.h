#pragma once

#include "system/config.h"
#include "system/unique_fd.h"

namespace maru::server {

/// The listening socket that the configuration asks for. Throws std::runtime_error, also when it
/// would take passwords in the clear over a network: beyond this machine only with a certificate
/// and key, or with a proxy that holds them.
UniqueFd OpenListener(const Config& config);

}  // namespace maru::server
