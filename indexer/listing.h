#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "index/store/document.h"
#include "system/unique_fd.h"

/// What lies in a folder, seen through its descriptor: paths are never put together, so names may
/// be any bytes, trees any depth, and nothing follows a symbolic link.
namespace maru::indexer {

enum class FileType : std::uint8_t {
  kFile,
  kFolder,
  /// It is there, but the system could not say what it is.
  kUnknown,
};

struct Found {
  /// Lives as long as its Listing is not read again.
  std::string_view name;
  FileType type = FileType::kUnknown;
  /// False when it changed within the current tick of the clock that stamps files: a further change
  /// in that tick could not be told.
  bool settled = true;
  index::Stamp stamp;

  bool IsFolder() const { return type == FileType::kFolder; }
  /// The stamp to keep: one that no file has when this one cannot be relied on.
  index::Stamp KeptStamp() const { return settled ? stamp : index::Stamp{0, 0, 0, stamp.inode}; }
  /// Seconds since the epoch.
  std::int64_t ModTime() const;
};

/// Reads folders; keeps its buffers from one to the next. One thread.
class Listing {
 public:
  /// Reads a whole folder: files and folders in byte order of names. Left out are symbolic links,
  /// sockets, pipes and devices (never opened, never followed) and the folders of LeftOut. False
  /// with errno when the folder cannot be read; what vanishes meanwhile is no error.
  bool Read(int folder);
  std::span<const Found> Entries() const { return entries_; }

 private:
  bool ReadNames(int folder);

  struct Name {
    std::size_t offset;
    std::size_t length;
  };
  std::unique_ptr<char[]> buffer_;
  std::string bytes_;
  std::vector<Name> names_;
  std::vector<Found> entries_;
};

/// Looks at one name ("": the folder itself). False when there is nothing of the kind that is
/// indexed (errno 0), or with errno.
bool Look(int folder, const char* name, Found& found);

/// Folders that are never indexed, wherever they lie: recycle bins, snapshots, lost+found.
bool LeftOut(std::string_view folder_name);

/// A folder by its name in another, read-only, not followed when it is a link. Empty with errno.
UniqueFd OpenFolder(int parent, const char* name);

/// The same for "a/b" below `top`, and `top` once more for "": step by step, so of any length.
UniqueFd OpenPath(int top, const std::string& path);

/// The identity of what a descriptor stands for.
struct FileId {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  friend bool operator==(const FileId&, const FileId&) = default;
};
FileId IdOf(int descriptor);

}  // namespace maru::indexer
