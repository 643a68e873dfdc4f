#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "index/store/document.h"
#include "system/file_id.h"
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
  /// Ends with a NUL; lives as long as its Listing is not read again, or the name that was given.
  std::string_view name;
  FileType type = FileType::kUnknown;
  /// It changed within the current tick of the clock that stamps files: a further change in that
  /// tick could not be told.
  bool is_racy = false;
  /// A file that also changes where its folder does not tell: one with other names, or that is
  /// mounted here.
  bool is_elsewhere = false;
  index::Stamp stamp{};

  bool IsFolder() const { return type == FileType::kFolder; }
  /// The stamp to keep: one that no file has when this one cannot be relied on.
  index::Stamp KeptStamp() const {
    return is_racy ? index::Stamp{0, 0, 0, stamp.inode, stamp.born_ns} : stamp;
  }
  /// Seconds since the epoch.
  std::int64_t ModTime() const;
};

/// Reads folders; keeps its buffers from one to the next. One thread.
class Listing {
 public:
  /// Reads a whole folder: files and folders in byte order of names. Left out are symbolic links,
  /// sockets, pipes and devices (never opened, never followed) and the folders of LeftOut. False
  /// with errno when the folder cannot be read; what vanishes meanwhile is no error.
  bool Read(int dir_fd);
  /// Looks at some names of a folder, which are in byte order and stay while the entries are used.
  void LookAt(int dir_fd, const std::vector<std::string>& names);
  /// Keeps only the entries of which `keep` is true.
  template <class Keep>
  void Filter(Keep&& keep) {
    std::erase_if(entries_, [&](const Found& found) { return !keep(found); });
  }
  std::span<const Found> Entries() const { return entries_; }

 private:
  bool ReadNames(int dir_fd);
  void Add(int dir_fd, const char* name);

  std::unique_ptr<char[]> buffer_;
  /// Each ends with a NUL.
  std::string names_;
  std::vector<Found> entries_;
};

/// Looks at one name ("": the folder itself). None when there is nothing of the kind that is
/// indexed (errno 0), or with errno.
std::optional<Found> Look(int dir_fd, const char* name);

/// The file system says that it is not there (any more), or not what it was.
bool HasVanished(int error);

/// Folders that are never indexed, wherever they lie: recycle bins, snapshots, lost+found.
bool LeftOut(std::string_view folder_name);

/// A folder by its name in another, read-only, not followed when it is a link. Empty with errno.
UniqueFd OpenFolder(int parent_fd, const char* name);
/// A share's own folder, which may lie behind a link: the settings say where. Empty with errno.
UniqueFd OpenTop(const std::string& path);

/// The identity of what a descriptor stands for.
FileId IdOf(int descriptor);

}  // namespace maru::indexer
