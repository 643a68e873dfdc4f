#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <string_view>

#include "index/store/document.h"

namespace maru::index {

/// The numbers that documents go by outside: ids count up, so that those of two of somebody's own
/// documents tell how many others' came between them. A permutation of its own for each index, for
/// as long as that index lives: a Feistel network (Luby and Rackoff, 1988) of keyed hashes.
class Aliases {
 public:
  static constexpr const char* kMetadata = "aliases";

  /// A key for a new index.
  static std::string NewKey();
  explicit Aliases(std::string_view key);

  /// From 1 to 2^30.
  std::uint32_t Of(DocumentId id) const;
  /// The document that goes by an alias; 0, or an id that is given to none, when there is none.
  DocumentId DocumentOf(std::uint32_t alias) const;

 private:
  std::uint32_t Mixed(unsigned round, std::uint32_t half) const;

  std::array<unsigned char, 16> key_{};
};

}  // namespace maru::index
