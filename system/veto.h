#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace maru {

/// Samba's `veto files`: entries that are never listed nor opened, and all that lies below them.
struct VetoPatterns {
  /// Between slashes, as in "/*.bak/secret/"; one without slashes is one pattern.
  static std::vector<std::string> Split(std::string_view value);

  /// Of one component of a path.
  bool Match(std::string_view name) const;
  /// Of any component of a path within the share ("/a/b").
  bool MatchAny(std::string_view path) const;

  std::vector<std::string> patterns;
  bool case_sensitive = false;

  friend bool operator==(const VetoPatterns&, const VetoPatterns&) = default;
};

}  // namespace maru
