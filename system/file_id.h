#pragma once

#include <sys/stat.h>

#include <cstdint>

namespace maru {

/// Which file it is, under whatever name, as long as it is there.
struct FileId {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;

  friend bool operator==(const FileId&, const FileId&) = default;
};

inline FileId IdOf(const struct stat& status) {
  return {status.st_dev, status.st_ino};
}

}  // namespace maru
