#pragma once

#include <cstddef>
#include <set>
#include <string>

/// Which shares have a full-text index, and under which ids and paths.

namespace maruseeker::fileindex {

class FolderMgr {
 public:
  /// Names of the shares that have an index on the disk, in byte order. Works for every user.
  std::set<std::string> GetIndexedShares() const;
};

namespace elastic {
/// The id under which the daemon knows a share's index: "fileindex_" + share name.
std::string GetFileIndexID(const std::string& share_name);
}  // namespace elastic

/// Splits "/volume1/photo/a/b.jpg" into share name "photo" and share path "/photo/a/b.jpg". 0; for
/// a path outside every share -1, with the second component taken as the name all the same.
int GetShareNamePathByFullPath(std::string& share_name, std::string& share_path,
                               const std::string& full_path);

}  // namespace maruseeker::fileindex

/// Paths of a share's queue and index folder, from its volume path, and its index id, from its
/// name. 0, or -1 when the buffer is too small or the argument malformed.
int FILEIDXQueuePathCompose(const char* share_path, char* path, std::size_t size);
int FILEIDXDBPathCompose(const char* share_path, char* path, std::size_t size);
int FILEIDXGetIndexID(const char* share_name, char* id, std::size_t size);
