#include "daemon/language/keyword.h"

#include <string>

#include "daemon/core/arguments.h"
#include "index/tokenizer.h"

namespace maru::daemon {
namespace {

using index::Query;

enum class Mark { kWord, kPrefix, kPhrase, kMinus, kOpen, kClose, kOr, kAnd };

struct Piece {
  Mark mark;
  std::string_view text;
};

bool IsBlank(char c) {
  return c == ' ' || (c >= '\t' && c <= '\r') || c == '\0';
}

bool EndsWord(char c) {
  return IsBlank(c) || c == '"' || c == '(' || c == ')';
}

std::vector<Piece> Split(std::string_view text) {
  std::vector<Piece> pieces;
  std::size_t at = 0;
  while (at < text.size()) {
    const char c = text[at];
    const bool begins = at == 0 || IsBlank(text[at - 1]) || text[at - 1] == '(';
    if (IsBlank(c)) {
      ++at;
    } else if (c == '(' || c == ')') {
      pieces.push_back({c == '(' ? Mark::kOpen : Mark::kClose, {}});
      ++at;
    } else if (c == '"') {
      const std::size_t end = text.find('"', at + 1);
      if (end != std::string_view::npos) {
        pieces.push_back({Mark::kPhrase, text.substr(at + 1, end - at - 1)});
      }
      at = end == std::string_view::npos ? at + 1 : end + 1;
    } else if (c == '-' && begins && at + 1 < text.size() && !IsBlank(text[at + 1]) &&
               text[at + 1] != '-') {
      pieces.push_back({Mark::kMinus, {}});
      ++at;
    } else {
      std::size_t end = at;
      while (end < text.size() && !EndsWord(text[end])) ++end;
      const std::string_view word = text.substr(at, end - at);
      const bool prefix = word.size() > 1 && word.back() == '*';
      pieces.push_back({word == "OR" || word == "|" ? Mark::kOr
                        : word == "AND"             ? Mark::kAnd
                        : prefix                    ? Mark::kPrefix
                                                    : Mark::kWord,
                        word});
      at = end;
    }
  }
  return pieces;
}

/// Drops parentheses that have no partner or stand too deep.
std::vector<Piece> Paired(const std::vector<Piece>& pieces) {
  std::vector<bool> keep(pieces.size(), true);
  std::vector<std::size_t> open;
  for (std::size_t i = 0; i < pieces.size(); ++i) {
    if (pieces[i].mark == Mark::kOpen) {
      keep[i] = false;
      open.push_back(i);
    } else if (pieces[i].mark == Mark::kClose) {
      keep[i] = !open.empty() && open.size() <= kMaxKeywordDepth;
      if (keep[i]) keep[open.back()] = true;
      if (!open.empty()) open.pop_back();
    }
  }
  std::vector<Piece> paired;
  for (std::size_t i = 0; i < pieces.size(); ++i) {
    if (keep[i]) paired.push_back(pieces[i]);
  }
  return paired;
}

bool BeginsOperand(const Piece& piece) {
  return piece.mark <= Mark::kOpen;
}

bool EndsOperand(const Piece& piece) {
  return piece.mark <= Mark::kPhrase || piece.mark == Mark::kClose;
}

/// Operators without an operand on each side become words, a minus without one goes.
std::vector<Piece> WithOperands(const std::vector<Piece>& pieces) {
  std::vector<Piece> sound;
  for (std::size_t i = 0; i < pieces.size(); ++i) {
    Piece piece = pieces[i];
    const bool followed = i + 1 < pieces.size() && BeginsOperand(pieces[i + 1]);
    const bool minus_follows = followed && pieces[i + 1].mark == Mark::kMinus;
    if (piece.mark == Mark::kMinus && (!followed || minus_follows)) continue;
    if ((piece.mark == Mark::kOr || piece.mark == Mark::kAnd) &&
        (!followed || sound.empty() || !EndsOperand(sound.back()))) {
      piece.mark = Mark::kWord;
    }
    sound.push_back(piece);
  }
  return sound;
}

Query Join(Query::Kind kind, std::vector<Query> parts) {
  if (parts.size() == 1) return std::move(parts[0]);
  Query query;
  query.kind = kind;
  query.parts = std::move(parts);
  return query;
}

Query Without(Query wanted, std::vector<Query> unwanted) {
  unwanted.insert(unwanted.begin(), std::move(wanted));
  return Join(Query::Kind::kAndNot, std::move(unwanted));
}

class Parser {
 public:
  Parser(std::vector<Piece> pieces, const KeywordOptions& options)
      : pieces_(std::move(pieces)), options_(options) {}

  /// Groups side by side, up to a closing parenthesis or the end; none without a word.
  std::optional<Query> List() {
    std::vector<Query> wanted, unwanted;
    while (at_ < pieces_.size() && pieces_[at_].mark != Mark::kClose) {
      if (!Take(SideBySide())) Group(wanted, unwanted);
    }
    if (wanted.empty() && unwanted.empty()) return std::nullopt;
    Query all = wanted.empty() ? Query{}
                               : Join(options_.any_word ? Query::Kind::kOr : Query::Kind::kAnd,
                                      std::move(wanted));
    return Without(std::move(all), std::move(unwanted));
  }

 private:
  /// The operator that says what standing side by side says; the other one binds tighter.
  Mark SideBySide() const { return options_.any_word ? Mark::kOr : Mark::kAnd; }
  Mark Tighter() const { return options_.any_word ? Mark::kAnd : Mark::kOr; }

  bool Take(Mark mark) {
    if (at_ >= pieces_.size() || pieces_[at_].mark != mark) return false;
    ++at_;
    return true;
  }

  /// Operands with the tighter operator between them.
  void Group(std::vector<Query>& wanted, std::vector<Query>& unwanted) {
    std::vector<Query> with, without;
    do {
      const bool negated = Take(Mark::kMinus);
      std::optional<Query> operand = Operand();
      if (operand) (negated ? without : with).push_back(std::move(*operand));
    } while (Take(Tighter()));
    if (with.empty() && without.size() == 1) {
      unwanted.push_back(std::move(without[0]));
    } else if (options_.any_word) {
      if (with.empty() && without.empty()) return;
      Query all = with.empty() ? Query{} : Join(Query::Kind::kAnd, std::move(with));
      wanted.push_back(Without(std::move(all), std::move(without)));
    } else {
      for (Query& query : without) with.push_back(Without(Query{}, {std::move(query)}));
      if (!with.empty()) wanted.push_back(Join(Query::Kind::kOr, std::move(with)));
    }
  }

  std::optional<Query> Operand() {
    if (at_ >= pieces_.size() || pieces_[at_].mark == Mark::kClose) return std::nullopt;
    const Piece piece = pieces_[at_++];
    if (piece.mark != Mark::kOpen) return Leaf(piece);
    std::optional<Query> inside = List();
    Take(Mark::kClose);
    return inside;
  }

  std::optional<Query> Leaf(const Piece& piece) {
    std::vector<std::string> words = index::WordsOf(piece.text);
    if (words.empty()) return std::nullopt;
    words_ += words.size();
    if (++terms_ > kMaxKeywordTerms || words_ > kMaxKeywordWords) {
      throw BadParameter("The keyword has more than " + std::to_string(kMaxKeywordTerms) +
                         " words");
    }
    if (piece.mark != Mark::kPrefix) {
      const Query::Kind kind = words.size() == 1 ? Query::Kind::kWord : Query::Kind::kPhrase;
      return Words(kind, std::move(words), piece.mark == Mark::kPhrase);
    }
    // "annual_rep*": what stands before its last word, and words that begin like that one.
    const std::string last = std::move(words.back());
    words.pop_back();
    Query prefix = Words(Query::Kind::kPrefix, {last}, false);
    if (words.empty()) return prefix;
    const Query::Kind kind = words.size() == 1 ? Query::Kind::kWord : Query::Kind::kPhrase;
    std::vector<Query> both;
    both.push_back(Words(kind, std::move(words), true));
    both.push_back(std::move(prefix));
    return Join(Query::Kind::kAnd, std::move(both));
  }

  Query Words(Query::Kind kind, std::vector<std::string> words, bool exact) const {
    Query query;
    query.kind = options_.fields.empty() ? Query::Kind::kNothing : kind;
    query.words = std::move(words);
    query.fields = options_.fields;
    query.exact = exact;
    return query;
  }

  std::vector<Piece> pieces_;
  const KeywordOptions& options_;
  std::size_t at_ = 0;
  unsigned terms_ = 0;
  std::size_t words_ = 0;
};

}  // namespace

std::optional<Query> ParseKeyword(std::string_view text, const KeywordOptions& options) {
  if (text.size() > kMaxKeywordBytes) {
    throw BadParameter("The keyword is longer than " + std::to_string(kMaxKeywordBytes) + " bytes");
  }
  const std::vector<Piece> pieces = Split(text);
  if (pieces.empty() && text.find('"') == std::string_view::npos) return std::nullopt;
  Parser parser(WithOperands(Paired(pieces)), options);
  std::optional<Query> query = parser.List();
  if (query) return query;
  Query nothing;
  nothing.kind = Query::Kind::kNothing;
  return nothing;
}

}  // namespace maru::daemon
