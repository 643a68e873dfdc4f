#pragma once

#include <optional>
#include <string>
#include <string_view>

/// "/volume1/NAME/rest" taken apart, by its text alone.
namespace maru {

struct VolumePath {
  /// "/volume1/NAME".
  std::string_view folder;
  /// "NAME".
  std::string_view share;
  /// Empty, or "/rest".
  std::string_view rest;
};

/// At the slashes alone, whatever the components are. The parts point into `path`. False when it
/// does not begin with "/volume1/".
bool SplitAtShare(std::string_view path, VolumePath& parts);

/// The same; also false when the path names no share or has a component "..".
bool SplitVolumePath(std::string_view path, VolumePath& parts);

/// Takes the next component off `path`, past any number of slashes and components "."; empty at the
/// end.
std::string_view TakeComponent(std::string_view& path);

/// A folder as users write it, with the volume or without: "/volume1/photo/trip" of that or of
/// "/photo//trip/"; "/volume1" for the folder of all shares. None unless it is absolute and free of
/// ".", ".." and NUL.
std::optional<std::string> VolumePathOf(std::string_view path);

}  // namespace maru
