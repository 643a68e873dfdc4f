#pragma once

#include <optional>
#include <string_view>
#include <vector>

#include "index/search/query.h"

namespace maru::daemon {

/// The language of search boxes (docs/search-language.md): words, "phrases", -exclusions,
/// prefixes*, OR and AND, parentheses. What is malformed is taken literally, so there are no syntax
/// errors.
struct KeywordOptions {
  /// Where its words are looked for.
  std::vector<index::FieldWeight> fields;
  /// Words side by side: any of them instead of all.
  bool any_word = false;
};

constexpr std::size_t kMaxKeywordBytes = 4096;
/// Words and phrases as typed, and the words these split into.
constexpr unsigned kMaxKeywordTerms = 64;
constexpr unsigned kMaxKeywordWords = 512;
/// Parentheses deeper than this are ignored; the query's tree stays within index::Query::kMaxDepth.
constexpr unsigned kMaxKeywordDepth = 6;

/// None for a blank text; kNothing for one without any word. Throws Error (120) beyond the bounds
/// above.
std::optional<index::Query> ParseKeyword(std::string_view text, const KeywordOptions& options);

}  // namespace maru::daemon
