#pragma once

#include <unistd.h>

#include <utility>

namespace maru {

/// A file descriptor that its scope closes.
class UniqueFd {
 public:
  explicit UniqueFd(int descriptor = -1) : descriptor_(descriptor) {}
  UniqueFd(UniqueFd&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
  UniqueFd& operator=(UniqueFd&& other) noexcept {
    std::swap(descriptor_, other.descriptor_);
    return *this;
  }
  ~UniqueFd() {
    if (descriptor_ >= 0) close(descriptor_);
  }

  int Get() const { return descriptor_; }
  /// Hands the descriptor over to the caller.
  int Release() { return std::exchange(descriptor_, -1); }
  explicit operator bool() const { return descriptor_ >= 0; }

 private:
  int descriptor_;
};

}  // namespace maru
