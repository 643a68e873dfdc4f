#pragma once

#include <string>
#include <vector>

/// What to look for, as a tree of plain values that knows no engine.
namespace maru::index {

struct FieldWeight {
  /// A text field of the table.
  std::string field;
  double weight = 1;

  friend bool operator==(const FieldWeight&, const FieldWeight&) = default;
};

struct Query {
  enum class Kind {
    kEverything,
    kNothing,
    kWord,    ///< words[0] and, unless `exact`, the words of its stem, in any of `fields`
    kPrefix,  ///< words that begin with words[0], in any of `fields`; at most kMaxExpansion of them
    kPhrase,  ///< words one behind the other, in any one of `fields`
    kValue,   ///< the keyword or flag field `field` equals `text`
    kRange,   ///< the number or time field `field` is in [low, high]
    kUnder,   ///< it lies in the folder with the path `text` ("/trip"; "" is all of a share) of the
              ///< index `field` ("": of every index), at any depth, or is it
    kAnd,     ///< all `parts`
    kOr,      ///< any of `parts`
    kAndNot,  ///< parts[0] and none of the others
    kFilter,  ///< parts[0], narrowed by the others without weight
  };

  Kind kind = Kind::kEverything;
  std::vector<std::string> words;
  std::vector<FieldWeight> fields;
  bool exact = false;
  std::string field;
  std::string text;
  double low = 0;
  double high = 0;
  std::vector<Query> parts;

  static constexpr unsigned kMaxExpansion = 100;
  /// Other words of its stem that a word is widened to.
  static constexpr unsigned kMaxForms = 12;

  friend bool operator==(const Query&, const Query&) = default;

  /// Deepest tree, most nodes and, with all words widened to as many as they could be, most terms
  /// the index takes; a larger one is refused with an Error, whatever stands in the index.
  static constexpr unsigned kMaxDepth = 32;
  static constexpr unsigned kMaxNodes = 4096;
  static constexpr std::size_t kMaxTerms = 32'768;
};

}  // namespace maru::index
