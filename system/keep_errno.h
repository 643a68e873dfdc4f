#pragma once

#include <errno.h>

namespace maru {

/// Leaves errno as it was: what a function tried on its way to success is nobody's failure, and the
/// next log line would name it.
class KeepErrno {
 public:
  KeepErrno() = default;
  ~KeepErrno() { errno = before_; }
  KeepErrno(const KeepErrno&) = delete;
  KeepErrno& operator=(const KeepErrno&) = delete;

 private:
  const int before_ = errno;
};

}  // namespace maru
