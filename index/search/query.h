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
    kPrefix,  ///< words that begin with words[0], in any of `fields`
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

  friend bool operator==(const Query&, const Query&) = default;

  /// Deepest tree, most nodes and most words, each in each of its fields, that the index takes; a
  /// larger one is refused with an Error, whatever stands in the index. A word that is widened
  /// counts as kWidened words.
  static constexpr unsigned kMaxDepth = 32;
  static constexpr unsigned kMaxNodes = 4096;
  static constexpr std::size_t kMaxTerms = 32'768;
  static constexpr std::size_t kWidened = 16;
};

}  // namespace maru::index
