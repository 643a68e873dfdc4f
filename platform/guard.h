#pragma once

#include <string.h>

#include <exception>
#include <string_view>

#include "platform/process.h"
#include "system/keep_errno.h"
#include "system/log.h"

namespace maru {

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

/// Writes the text and its end into the caller's buffer. False when it does not fit.
inline bool CopyOut(std::string_view text, char* buffer, std::size_t size) {
  if (!buffer || text.size() >= size) return false;
  memcpy(buffer, text.data(), text.size());
  buffer[text.size()] = '\0';
  return true;
}

}  // namespace maru
