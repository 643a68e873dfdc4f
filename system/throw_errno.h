#pragma once

#include <cerrno>
#include <string>
#include <system_error>

namespace maru {

/// Throws std::system_error: "DOING: the system's words".
[[noreturn]] inline void ThrowErrno(const std::string& doing, int error = errno) {
  throw std::system_error(error, std::generic_category(), doing);
}

/// ThrowErrno unless `good`.
inline void CheckErrno(bool good, const char* doing) {
  if (!good) ThrowErrno(doing);
}

}  // namespace maru
