#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "index/fields.h"
#include "index/query.h"

namespace maru::daemon {

constexpr std::size_t kMaxCriteria = 32;
/// Alternatives joined by " OR " in one value.
constexpr std::size_t kMaxAlternatives = 64;

/// One criterion as a query; none for a blank value. What a value may be is told by the field's
/// type (docs/search-language.md). Throws Error (120) that names the field and quotes the value.
std::optional<index::Query> ParseCriterion(const index::Field& field, const std::string& value);

/// Kinds of files separated by commas or " OR "; none for "", blanks and "all". Throws Error (120)
/// for an unknown kind.
std::optional<index::Query> ParseKinds(const std::string& kinds);

/// "/volume1/photo/trip" of that or of "/photo/trip", without a slash at the end; "/volume1" for
/// the folder of all shares. None unless it is absolute and free of "." and "..".
std::optional<std::string> VolumePathOf(std::string_view path);

}  // namespace maru::daemon
