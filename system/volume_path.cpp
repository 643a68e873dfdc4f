#include "system/volume_path.h"

#include "system/share_table.h"

namespace maru {

namespace {

std::string_view TakeName(std::string_view& path) {
  path.remove_prefix(std::min(path.find_first_not_of('/'), path.size()));
  const std::string_view name = path.substr(0, path.find('/'));
  path.remove_prefix(name.size());
  return name;
}

}  // namespace

bool SplitAtShare(std::string_view path, VolumePath& parts) {
  const std::size_t volume = std::string_view(kVolume).size();
  if (!path.starts_with(kVolume) || !path.substr(volume).starts_with('/')) return false;
  const std::size_t end = std::min(path.find('/', volume + 1), path.size());
  parts.folder = path.substr(0, end);
  parts.share = path.substr(volume + 1, end - volume - 1);
  parts.rest = path.substr(end);
  return true;
}

bool SplitVolumePath(std::string_view path, VolumePath& parts) {
  if (!SplitAtShare(path, parts)) return false;
  if (parts.share.empty() || parts.share == "." || parts.share == "..") return false;
  std::string_view rest = parts.rest;
  for (std::string_view name = TakeComponent(rest); !name.empty(); name = TakeComponent(rest)) {
    if (name == "..") return false;
  }
  return true;
}

std::string_view TakeComponent(std::string_view& path) {
  std::string_view name;
  do {
    name = TakeName(path);
  } while (name == ".");
  return name;
}

std::optional<std::string> VolumePathOf(std::string_view path) {
  if (!path.starts_with('/') || path.find('\0') != std::string_view::npos) return std::nullopt;
  std::string clean;
  for (std::string_view name = TakeName(path); !name.empty(); name = TakeName(path)) {
    if (name == "." || name == "..") return std::nullopt;
    clean.append("/").append(name);
  }
  const std::string volume = kVolume;
  return clean == volume || clean.starts_with(volume + "/") ? clean : volume + clean;
}

}  // namespace maru
