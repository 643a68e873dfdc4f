#pragma once

#include <functional>
#include <map>
#include <span>
#include <string>
#include <string_view>

#include "system/share_table.h"

/// Samba's parameters that bear on rights: the one table. For this room, and for the document that
/// prints it.
namespace maru {

/// One section of the settings while it is read.
struct ShareSection {
  ShareSettings share;
  bool global = false;
  bool printable = false;
  /// The module fruit vetoes "._*".
  bool hides_apple_double = false;
  std::string preexec, root_preexec;
  bool preexec_close = false, root_preexec_close = false;
  bool hostname_lookups = false;
  std::string samba_state;
  /// What a parameter's present value is withheld for, by its name.
  std::map<std::string_view, std::string> reasons;
};

struct ShareParameter {
  std::string_view name;
  /// How it counts here, for the document.
  std::string_view meaning;
  /// Throws std::runtime_error with what is wrong with the value, or is not honoured: that
  /// withholds the share.
  void (*set)(ShareSection& section, std::string_view value);
};

std::span<const ShareParameter> ShareParameters();

/// Sets the parameter of that name, if there is one: in the section, or, where it may not have this
/// value, in its reasons.
void SetShareParameter(ShareSection& section, std::string_view name, std::string_view value);

}  // namespace maru
