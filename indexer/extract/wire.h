#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>

#include "system/unique_fd.h"

/// What goes over the socket pairs of the extractor processes. Both ends are of one build.
namespace maru::extract {

/// With the file's descriptor beside it.
struct Request {
  std::uint32_t row;
  std::uint64_t max_text;
};

/// Followed by as many bytes: title, authors (each ends with a line break), text.
struct Reply {
  std::uint32_t good;
  std::uint32_t title;
  std::uint32_t authors;
  std::uint64_t text;
};

/// More than an honest extractor answers for title and authors.
inline constexpr std::uint32_t kMaxReplyHead = 256u << 10;

using Deadline = std::chrono::steady_clock::time_point;

/// Whole messages; false at the end of the stream, on errors (errno), and when the deadline passes
/// (ETIMEDOUT). Never SIGPIPE. `descriptor` -1: none goes along.
bool SendAll(int socket, const void* bytes, std::size_t size, int descriptor, Deadline deadline);
bool ReceiveAll(int socket, void* bytes, std::size_t size, UniqueFd* descriptor, Deadline deadline);

/// No deadline.
inline constexpr Deadline kForever = Deadline::max();

}  // namespace maru::extract
