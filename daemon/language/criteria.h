#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "index/search/query.h"
#include "index/store/fields.h"

namespace maru::daemon {

constexpr std::size_t kMaxFieldName = 64;
/// Alternatives joined by " OR " in one value.
constexpr std::size_t kMaxAlternatives = 64;

/// One criterion as a query; none for a blank value. What a value may be is told by the field's
/// type (docs/search-language.md). Throws Error (120) that names the field and quotes the value.
std::optional<index::Query> ParseCriterion(const index::Field& field, const std::string& value);

/// Kinds of files separated by commas or " OR "; none for "", blanks and "all". Throws Error (120)
/// for an unknown kind.
std::optional<index::Query> ParseKinds(const std::string& kinds);

}  // namespace maru::daemon
