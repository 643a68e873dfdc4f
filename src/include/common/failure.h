#pragma once

#include "common/error.h"
#include "platform/log.h"

/// The one way to fail: a log line "Failed [condition], reason: text of the error" in the name of
/// the calling function, then the error itself.

/// Throws `Error(code, reason)` when `condition` holds; its own source text is what the log shows.
/// What follows the condition are the arguments of the error, evaluated only then.
#define MARU_FAIL_IF(condition, ...)                      \
  do {                                                    \
    if (condition) MARU_FAIL_AS(#condition, __VA_ARGS__); \
  } while (false)

/// Fails with a text of its own where the condition in force is spelled differently.
#define MARU_FAIL_AS(text, ...)                                \
  do {                                                         \
    const ::maruseeker::Error failure(__VA_ARGS__);            \
    MARU_LOG("Failed [%s], reason: %s", text, failure.what()); \
    throw failure;                                             \
  } while (false)
