#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

/// The one table of document fields: every prefix, slot and weight stands here and nowhere else.
namespace maru::index {

enum class FieldType {
  kText,     ///< words, searched by keyword
  kKeyword,  ///< one exact value, folded to lower case
  kNumber,   ///< a 64-bit number: ranges, sorting
  kTime,     ///< seconds since the epoch: ranges, sorting
  kFlag,     ///< true or false
  kPath,     ///< the full path, put together from the directory table
};

struct Field {
  std::string_view name;
  FieldType type;
  /// Of its terms; empty for the text content, and unused for numbers, times and paths.
  std::string_view prefix;
  /// Value slot of numbers and times; -1 for others.
  int slot;
  /// How much a match here counts when a request does not say; 0: not searched by keyword.
  double weight;
};

inline constexpr std::string_view kPath = "MARUMDPath";
inline constexpr std::string_view kName = "MARUMDFSName";
inline constexpr std::string_view kExtension = "MARUMDExtension";
inline constexpr std::string_view kIsDir = "MARUMDIsDir";
inline constexpr std::string_view kSize = "MARUMDFSSize";
inline constexpr std::string_view kText = "MARUMDTextContent";
inline constexpr std::string_view kOwner = "MARUMDOwnerUserID";
inline constexpr std::string_view kModTime = "MARUMDModTime";
inline constexpr std::string_view kKind = "MARUMDKind";
inline constexpr std::string_view kTitle = "MARUMDTitle";
inline constexpr std::string_view kAuthors = "MARUMDAuthors";

/// All fields, in the order of the table.
std::span<const Field> Fields();
/// Null for an unknown name.
const Field* FindField(std::string_view name);

/// Kinds of files ("document", "audio", "video", "image", "archive", "code", "folder", "other"), by
/// lower-case extension (no dot).
std::string_view KindOfExtension(std::string_view extension);
/// Whether `kind` is one of them.
bool IsKind(std::string_view kind);
/// Number of kinds, and the number of each (from 0, the row of the table; kKinds for an unknown
/// one).
inline constexpr std::uint8_t kKinds = 8;
/// Documents of each kind.
using KindCounts = std::array<std::uint64_t, kKinds>;
std::uint8_t KindNumber(std::string_view kind);
/// The extension of a file name: what follows its last dot, lower-cased; empty without one.
std::string ExtensionOf(std::string_view name);

}  // namespace maru::index
