#include "system/volume_path.h"

#include "system/share_table.h"

namespace maru {

bool SplitVolumePath(std::string_view path, VolumePath& parts) {
  const std::size_t volume = std::string_view(kVolume).size();
  if (!path.starts_with(kVolume) || path.size() < volume + 2 || path[volume] != '/') return false;
  const std::size_t end = std::min(path.find('/', volume + 1), path.size());
  parts.folder = path.substr(0, end);
  parts.share = path.substr(volume + 1, end - volume - 1);
  parts.rest = path.substr(end);
  if (parts.share.empty() || parts.share == "." || parts.share == "..") return false;
  std::string_view rest = parts.rest;
  for (std::string_view name = TakeComponent(rest); !name.empty(); name = TakeComponent(rest)) {
    if (name == "..") return false;
  }
  return true;
}

std::string_view TakeComponent(std::string_view& path) {
  for (;;) {
    path.remove_prefix(std::min(path.find_first_not_of('/'), path.size()));
    const std::string_view name = path.substr(0, path.find('/'));
    path.remove_prefix(name.size());
    if (name != ".") return name;
  }
}

}  // namespace maru
