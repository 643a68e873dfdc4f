#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "index/store/codec.h"
#include "index/store/document.h"

namespace maru::index {

/// Which rights record (see directory_table.h) a document has.
using RightsId = std::uint32_t;

/// Where a document lies and who may read it. What matching looks at: value slot 0.
struct Place {
  DirectoryId parent = 0;
  RightsId rights = 0;
  /// Row of the kinds' table in fields.h.
  std::uint8_t kind = 0;
  /// Of its name: with its folder's, orders what nothing else does.
  std::uint32_t name_hash = 0;

  static constexpr std::size_t kSize = 13;
  /// kSize bytes.
  std::string Encode() const;
  static Place Decode(std::string_view bytes);
};

/// Where a document's text lies among the stored texts: value slot 1 of those that have one.
struct TextPlace {
  std::uint32_t segment = 0;
  std::uint64_t offset = 0;
  std::uint64_t length = 0;

  /// Empty for a length of 0.
  std::string Encode() const;
  static TextPlace Decode(std::string_view bytes);
};

/// What a line of a result and its fragments need, read in one go: the engine's data of a document.
struct Stored {
  Place place;
  TextPlace text;
  Record record;

  std::string Encode() const;
  static Stored Decode(std::string_view bytes);
};

/// Entries of folders, one behind the other, in the metadata of EntriesKey.
std::string EntriesKey(DirectoryId directory);
void EncodeEntry(Encoder& out, const Entry& entry);
Entry DecodeEntry(Decoder& in);

inline constexpr unsigned kPlaceSlot = 0;
inline constexpr unsigned kTextSlot = 1;

}  // namespace maru::index
