#pragma once

#include <time.h>

#include <cstdint>

namespace maru::server {

using Seconds = std::int64_t;

/// Seconds since the machine started, sleep included: a clock that never goes back.
inline Seconds Now() {
  timespec time{};
  clock_gettime(CLOCK_BOOTTIME, &time);
  return time.tv_sec;
}

}  // namespace maru::server
