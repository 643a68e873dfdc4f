#pragma once

#include <optional>
#include <string_view>
#include <vector>

#include "index/search/query.h"

/// The language of search boxes (docs/search-language.md): words, "phrases", -exclusions,
/// prefixes*, OR and AND, parentheses. What is malformed is taken literally, so there are no syntax
/// errors.
namespace maru::daemon {

constexpr std::size_t kMaxKeywordBytes = 4096;
/// Words and phrases as typed, and the words these split into.
constexpr unsigned kMaxKeywordTerms = 64;
constexpr unsigned kMaxKeywordWords = 512;
/// Parentheses deeper than this are ignored; the query's tree stays within index::Query::kMaxDepth.
constexpr unsigned kMaxKeywordDepth = 6;

/// Words are looked for in `fields`; of words side by side all are, or with `any_word` any. None
/// for a blank text; kNothing for one without any word. Throws Error (120) beyond the bounds above.
std::optional<index::Query> ParseKeyword(std::string_view text,
                                         const std::vector<index::FieldWeight>& fields,
                                         bool any_word = false);

}  // namespace maru::daemon
