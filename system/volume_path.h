#pragma once

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

/// The parts point into `path`. False when the path is not of this form or has a component "..".
bool SplitVolumePath(std::string_view path, VolumePath& parts);

/// Takes the next component off `path`, past any number of slashes and components "."; empty at the
/// end.
std::string_view TakeComponent(std::string_view& path);

}  // namespace maru
