#include "platform/file_index.h"

#include <string.h>

#include "platform/guard.h"
#include "system/config.h"
#include "system/index_id.h"
#include "system/indexed_shares.h"
#include "system/share_table.h"
#include "system/volume_path.h"

namespace {

int Answer(const std::string& text, char* buffer, std::size_t size) {
  return maru::CopyOut(text, buffer, size) ? 0 : maru::Fail(kErrBadParameter, -1);
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
  return maru::IndexedShares();
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
    return Answer(maru::Config::Get().state_dir + "/queue/" + maru::IndexIdOf(name), path, size);
  });
}

int FILEIDXDBPathCompose(const char* share_path, char* path, std::size_t size) {
  return maru::Guarded("FILEIDXDBPathCompose", -1, [&] {
    const std::string name = NameOfShare(share_path);
    if (name.empty()) return maru::Fail(kErrBadParameter, -1);
    return Answer(maru::IndexHome() + "/" + maru::IndexIdOf(name), path, size);
  });
}

int FILEIDXGetIndexID(const char* share_name, char* id, std::size_t size) {
  if (!IsName(share_name)) return maru::Fail(kErrBadParameter, -1);
  return maru::Guarded("FILEIDXGetIndexID", -1,
                       [&] { return Answer(maru::IndexIdOf(share_name), id, size); });
}
