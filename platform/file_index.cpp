#include "platform/file_index.h"

#include <string.h>
#include <sys/stat.h>

#include "platform/guard.h"
#include "system/config.h"
#include "system/index_id.h"
#include "system/share_table.h"
#include "system/volume_path.h"

namespace {

int CopyOut(const std::string& text, char* buffer, std::size_t size) {
  if (!buffer || text.size() >= size) return maru::Fail(kErrBadParameter, -1);
  memcpy(buffer, text.c_str(), text.size() + 1);
  return 0;
}

std::string IndexFolder(const std::string& share_name) {
  return maru::Config::Get().state_dir + "/index/" + maru::IndexIdOf(share_name);
}

/// The name of the share whose own volume path this is; empty when it is none.
std::string NameOfShare(const char* share_path) {
  maru::VolumePath place;
  if (!share_path || !maru::SplitVolumePath(share_path, place)) return {};
  return place.rest.empty() ? std::string(place.share) : std::string();
}

bool IsName(const char* name) {
  return name && *name && strcmp(name, ".") != 0 && strcmp(name, "..") != 0 && !strchr(name, '/');
}

}  // namespace

namespace maruseeker::fileindex {

std::set<std::string> FolderMgr::GetIndexedShares() const {
  const maru::KeepErrno keep;
  std::set<std::string> names;
  const auto table = maru::ShareTable::Current();
  for (const maru::ShareSettings& share : table->Shares()) {
    struct stat status;
    if (stat(IndexFolder(share.name).c_str(), &status) == 0 && S_ISDIR(status.st_mode)) {
      names.insert(share.name);
    }
  }
  return names;
}

std::string elastic::GetFileIndexID(const std::string& share_name) {
  return maru::IndexIdOf(share_name);
}

int GetShareNamePathByFullPath(std::string& share_name, std::string& share_path,
                               const std::string& full_path) {
  const std::size_t volume_end = full_path.find('/', 1);
  const std::size_t start = volume_end == std::string::npos ? full_path.size() : volume_end + 1;
  share_name = full_path.substr(start, full_path.find('/', start) - start);
  share_path.clear();
  return maru::Guarded("GetShareNamePathByFullPath", -1, [&] {
    maru::VolumePath place;
    if (!maru::SplitVolumePath(full_path, place)) return maru::Fail(kErrBadParameter, -1);
    if (!maru::ShareTable::Current()->Find(share_name)) return maru::Fail(kErrNotFound, -1);
    share_path = "/" + share_name + std::string(place.rest);
    return 0;
  });
}

}  // namespace maruseeker::fileindex

int FILEIDXQueuePathCompose(const char* share_path, char* path, std::size_t size) {
  return maru::Guarded("FILEIDXQueuePathCompose", -1, [&] {
    const std::string name = NameOfShare(share_path);
    if (name.empty()) return maru::Fail(kErrBadParameter, -1);
    return CopyOut(maru::Config::Get().state_dir + "/queue/" + maru::IndexIdOf(name), path, size);
  });
}

int FILEIDXDBPathCompose(const char* share_path, char* path, std::size_t size) {
  return maru::Guarded("FILEIDXDBPathCompose", -1, [&] {
    const std::string name = NameOfShare(share_path);
    if (name.empty()) return maru::Fail(kErrBadParameter, -1);
    return CopyOut(IndexFolder(name), path, size);
  });
}

int FILEIDXGetIndexID(const char* share_name, char* id, std::size_t size) {
  if (!IsName(share_name)) return maru::Fail(kErrBadParameter, -1);
  return maru::Guarded("FILEIDXGetIndexID", -1,
                       [&] { return CopyOut(maru::IndexIdOf(share_name), id, size); });
}
