#pragma once

#include <cerrno>
#include <string>
#include <system_error>

namespace maru {

/// Throws std::system_error of errno: "DOING: the system's words".
[[noreturn]] inline void ThrowErrno(const std::string& doing) {
  throw std::system_error(errno, std::generic_category(), doing);
}

/// ThrowErrno unless `good`.
inline void CheckErrno(bool good, const char* doing) {
  if (!good) ThrowErrno(doing);
}

}  // namespace maru
