#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "system/rights.h"

namespace maru::index {

/// Ids count from 1; 0 is none. A document's id is its own within its index. It stays while the
/// file is changed, gets another name in its folder, or a folder moves; put into another folder, a
/// file becomes a new document.
using DocumentId = std::uint32_t;
using DirectoryId = std::uint32_t;

/// One file or folder, as the indexer hands it over.
struct Document {
  std::string name;
  DirectoryId parent = 0;
  FileRights rights;
  bool is_dir = false;
  std::uint64_t size = 0;
  /// Seconds since the epoch.
  std::int64_t mtime = 0;
  std::uint64_t inode = 0;
  std::string title;
  std::vector<std::string> authors;
  /// UTF-8; bytes that are not are skipped as separators.
  std::string text;
};

/// What is kept of a document for its line in a result.
struct Record {
  std::string name;
  bool is_dir = false;
  std::uint64_t size = 0;
  std::int64_t mtime = 0;
  /// Tells whether what lies at the document's path is still that file.
  std::uint64_t inode = 0;
  std::string title;
  std::vector<std::string> authors;
};

/// One entry of a folder as it was when it was last indexed; equal stamps mean nothing to do.
struct Stamp {
  std::int64_t ctime_ns = 0;
  std::int64_t mtime_ns = 0;
  std::uint64_t size = 0;
  std::uint64_t inode = 0;
  /// When the file was made: an inode is given out again. 0 where the file system does not tell.
  std::int64_t born_ns = 0;

  friend bool operator==(const Stamp&, const Stamp&) = default;
};

struct Entry {
  std::string name;
  DocumentId document = 0;
  /// Of a folder; 0 for everything else.
  DirectoryId directory = 0;
  Stamp stamp;
};

}  // namespace maru::index
