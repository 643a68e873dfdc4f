#pragma once

#include <array>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "index/text/tokenizer.h"

/// Finds a query's words in texts.
namespace maru::index {

/// What counts as one in a field.
struct MarkGroup {
  enum class Kind {
    kWords,   ///< any of the words: a word and its other forms
    kPrefix,  ///< words that begin with the one word
    kPhrase,  ///< the words one behind the other
  };

  std::string field;
  /// Folded, without the field's prefix.
  std::vector<std::string> words;
  Kind kind = Kind::kWords;
};

/// Bytes [begin, end) of a text that a group matches.
struct Match {
  std::size_t begin;
  std::size_t end;
  std::size_t group;
};

/// Goes over a text once, whatever the number of words, and folds only what may be one of them.
class WordFinder {
 public:
  explicit WordFinder(const std::vector<MarkGroup>& groups);

  /// In order of their begins; at one place the longest first.
  std::vector<Match> MatchesIn(std::string_view text) const;
  bool AnyIn(std::string_view text) const;

 private:
  struct Wanted {
    std::size_t group;
    /// Whether words that go on are wanted too.
    bool goes_on = false;
    /// What must follow, of a phrase.
    std::vector<std::string> behind = {};
  };

  template <class Use>
  void ForEach(std::string_view text, Use&& use) const;
  template <class Use>
  void ForEachPlain(std::string_view text, Use&& use) const;
  void AddWord(const std::string& word, Wanted wanted);
  void FindProbes(std::size_t beginning);
  void MarkBegins(std::string_view text, std::size_t block, unsigned char* marks) const;
  bool MayBe(std::string_view word) const;
  template <class Use>
  bool Take(std::string_view text, const Token& token, Use& use) const;
  template <class Use>
  bool TakeWord(std::string_view text, const Token& token, std::size_t length, Use& use) const;

  /// Two bytes that words with one beginning have in common: their first, and one further on.
  struct Probe {
    char first;
    char last;
    std::size_t offset;
  };

  std::map<std::string, std::vector<Wanted>, std::less<>> words_;
  /// Of the words that may go on.
  std::set<std::size_t> beginnings_;
  /// When there are some, all words are ASCII, and in ASCII texts blocks where no probe fits are
  /// passed over.
  std::vector<Probe> probes_;
  /// By the first byte of the words: which lengths there are, one bit each.
  std::array<std::uint64_t, 256> lengths_{};
};

}  // namespace maru::index
