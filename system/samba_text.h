#pragma once

#include <map>
#include <string>
#include <string_view>
#include <vector>

/// Samba's settings as text: what testparm does not say of them. For this room.
namespace maru {

/// By section, in small letters: what it includes that is another file for each client. testparm
/// shows these with the variables as they are for itself. What cannot be read includes nothing.
std::map<std::string, std::string> VaryingIncludes(const std::string& path);

/// The canonical text with these includes in the place of testparm's own.
std::string WithIncludes(std::string_view text, const std::map<std::string, std::string>& varying);

struct SambaSection {
  std::string name;
  /// With its head.
  std::string text;
};

/// The sections of a file in their order; what is global goes to `global`.
std::vector<SambaSection> SectionsOf(std::string_view text, std::string& global);

}  // namespace maru
