#pragma once

#include <unistd.h>

#include <utility>

namespace maru {

/// Owns a file descriptor, or none (-1).
class UniqueFd {
 public:
  UniqueFd() = default;
  explicit UniqueFd(int descriptor) : descriptor_(descriptor) {}
  UniqueFd(UniqueFd&& other) noexcept : descriptor_(other.Release()) {}
  UniqueFd& operator=(UniqueFd&& other) noexcept {
    const UniqueFd old(std::exchange(descriptor_, other.Release()));
    return *this;
  }
  ~UniqueFd() { Close(); }

  int Get() const { return descriptor_; }
  /// Hands the descriptor over to the caller.
  int Release() { return std::exchange(descriptor_, -1); }
  void Close() {
    if (descriptor_ >= 0) close(Release());
  }
  explicit operator bool() const { return descriptor_ >= 0; }

 private:
  int descriptor_ = -1;
};

}  // namespace maru
