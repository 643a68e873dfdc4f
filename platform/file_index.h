#pragma once

#include <cstddef>
#include <set>
#include <string>

/// Shares that are indexed: which, and how their indices are named and where they lie.

namespace maruseeker::fileindex {

class FolderMgr {
 public:
  /// Those with an index on the disk, by name, in byte order. Works for every user.
  std::set<std::string> GetIndexedShares() const;
};

namespace elastic {
/// What the search daemon calls a share's index: "fileindex_" and the share's name.
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
