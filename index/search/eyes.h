#pragma once

#include <atomic>
#include <memory>
#include <string>
#include <vector>

#include "index/search/bits.h"
#include "index/search/reader.h"
#include "index/store/codec.h"
#include "index/store/directory_table.h"
#include "system/rights.h"

namespace maru::index {

/// What one identity can reach and read of one share at one commit: which folders, which rights.
/// Immutable, thread-safe.
class Eyes {
 public:
  Eyes(const DirectoryTable& table, const Identity& who);
  /// Those kept for the reader's commit, or new ones.
  static std::shared_ptr<const Eyes> Of(const Reader& reader, const Identity& who);

  bool Sees(const Place& place) const {
    return Bit(reachable_, place.parent) && Bit(readable_, place.rights);
  }
  /// Takes those that these eyes do not see out of the documents of the block from `first` on.
  void Screen(Reader& reader, DocumentId first, BlockSet& documents) const;

  /// By which what is derived with them is kept: the same for all that see the same.
  std::string Name() const { return BigEndian32(number_); }
  std::size_t Bytes() const { return (reachable_.size() + readable_.size()) / 8; }

 private:
  static bool Bit(const std::vector<bool>& bits, std::uint32_t id) {
    return id < bits.size() && bits[id];
  }
  /// Whether these see what the others see, and perhaps folders and rights that are new.
  bool GoOnFrom(const Eyes& others) const;
  std::shared_ptr<const BlockSet> Seen(Reader& reader, DocumentId first,
                                       std::uint64_t wanted) const;

  std::vector<bool> reachable_, readable_;
  /// Names what they have seen of blocks. Theirs also who go on from them.
  std::uint32_t number_;
};

template <>
struct BytesOf<Eyes> {
  std::size_t operator()(const Eyes& eyes) const { return eyes.Bytes(); }
};

/// The folders that lie under `top` (and `top`), as a bit an id.
std::vector<bool> FoldersUnder(const DirectoryTable& table, DirectoryId top);

}  // namespace maru::index
