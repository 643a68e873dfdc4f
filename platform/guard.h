#pragma once

#include <errno.h>

#include <exception>

#include "platform/log.h"
#include "platform/process.h"

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

/// The one wall of the functions that must not throw: the result of `body`, or `failure` when it
/// throws, which is logged and set as the last error. For this room.
template <class Result, class Body>
Result Guarded(const char* operation, Result failure, Body body) {
  try {
    return body();
  } catch (const std::exception& exception) {
    MARU_LOG("%s: %s", operation, exception.what());
    MLIBCErrSet(kErrSystem);
    return failure;
  }
}

/// Sets the last error and passes the result on.
template <class Result>
Result Fail(int code, Result result) {
  MLIBCErrSet(code);
  return result;
}

}  // namespace maru
