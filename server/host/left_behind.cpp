#include "server/host/left_behind.h"

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "system/json.h"
#include "system/unique_fd.h"
#include "system/whole_file.h"

namespace maru::server {
namespace {

constexpr std::size_t kMaxNote = 4096;

bool Names(int folder, const char* name, pid_t pid) {
  const UniqueFd file(openat(folder, name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  std::string text;
  Json::Value note;
  if (!file || !ReadToEnd(file, kMaxNote, text) || !json::FromString(text, note)) return false;
  const Json::Value& noted = json::Member(note, "pid");
  return noted.isInt() && noted.asInt() == pid;
}

}  // namespace

void RemoveFilesOf(pid_t pid) {
  const std::unique_ptr<DIR, int (*)(DIR*)> folder(opendir("/tmp"), closedir);
  if (!folder) return;
  while (const dirent* entry = readdir(folder.get())) {
    if (entry->d_type == DT_REG && Names(dirfd(folder.get()), entry->d_name, pid)) {
      unlinkat(dirfd(folder.get()), entry->d_name, 0);
    }
  }
}

}  // namespace maru::server
