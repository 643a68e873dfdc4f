#include "daemon/language/keyword.h"

#include <algorithm>
#include <string>

#include "daemon/core/arguments.h"
#include "daemon/language/query_tree.h"
#include "index/text/tokenizer.h"

namespace maru::daemon {
namespace {

using index::Query;

// A text becomes tokens; those that mean nothing where they stand are dropped or become words; what
// is left always parses:
//   list    = { group }                    side by side
//   group   = operand { tighter operand }  joined by the operator that binds tighter
//   operand = [ "-" ] ( word | prefix | phrase | "(" list ")" )

/// In this order, so that comparisons tell what begins and what ends an operand.
enum class TokenKind { kWord, kPrefix, kPhrase, kMinus, kOpen, kClose, kOr, kAnd };

struct Token {
  TokenKind kind;
  std::string_view text;
};

constexpr std::string_view kBlanks(" \t\n\v\f\r\0", 7);
constexpr std::string_view kWordEnds(" \t\n\v\f\r\0\"()", 10);

bool IsBlank(char c) {
  return kBlanks.find(c) != std::string_view::npos;
}

/// Whether a minus stands here that excludes ("-boat"), not one that joins ("well-known").
bool Excludes(std::string_view text, std::size_t at) {
  const bool begins = at == 0 || IsBlank(text[at - 1]) || text[at - 1] == '(';
  return begins && text[at] == '-' && at + 1 < text.size() && !IsBlank(text[at + 1]) &&
         text[at + 1] != '-';
}

TokenKind KindOf(std::string_view word) {
  if (word == "OR" || word == "|") return TokenKind::kOr;
  if (word == "AND") return TokenKind::kAnd;
  return word.back() == '*' ? TokenKind::kPrefix : TokenKind::kWord;
}

std::vector<Token> Tokenize(std::string_view text) {
  std::vector<Token> tokens;
  for (std::size_t at = 0, end; at < text.size(); at = end) {
    end = at + 1;
    if (IsBlank(text[at])) continue;
    if (text[at] == '(' || text[at] == ')') {
      tokens.push_back({text[at] == '(' ? TokenKind::kOpen : TokenKind::kClose, {}});
    } else if (text[at] == '"') {
      const std::size_t close = text.find('"', end);
      if (close == std::string_view::npos) continue;
      tokens.push_back({TokenKind::kPhrase, text.substr(end, close - end)});
      end = close + 1;
    } else if (Excludes(text, at)) {
      tokens.push_back({TokenKind::kMinus, {}});
    } else {
      end = std::min(text.find_first_of(kWordEnds, end), text.size());
      const std::string_view word = text.substr(at, end - at);
      tokens.push_back({KindOf(word), word});
    }
  }
  return tokens;
}

/// Drops parentheses that have no partner or stand too deep.
std::vector<Token> Paired(const std::vector<Token>& tokens) {
  std::vector<bool> keep(tokens.size(), true);
  std::vector<std::size_t> open;
  for (std::size_t i = 0; i < tokens.size(); ++i) {
    if (tokens[i].kind == TokenKind::kOpen) {
      keep[i] = false;
      open.push_back(i);
    } else if (tokens[i].kind == TokenKind::kClose) {
      keep[i] = !open.empty() && open.size() <= kMaxKeywordDepth;
      if (keep[i]) keep[open.back()] = true;
      if (!open.empty()) open.pop_back();
    }
  }
  std::vector<Token> paired;
  for (std::size_t i = 0; i < tokens.size(); ++i) {
    if (keep[i]) paired.push_back(tokens[i]);
  }
  return paired;
}

bool BeginsOperand(const Token& token) {
  return token.kind <= TokenKind::kOpen;
}

bool EndsOperand(const Token& token) {
  return token.kind <= TokenKind::kPhrase || token.kind == TokenKind::kClose;
}

/// Operators without an operand on each side become words, a minus without one goes.
std::vector<Token> WithOperands(const std::vector<Token>& tokens) {
  std::vector<Token> sound;
  for (std::size_t i = 0; i < tokens.size(); ++i) {
    Token token = tokens[i];
    const bool followed = i + 1 < tokens.size() && BeginsOperand(tokens[i + 1]);
    const bool minus_follows = followed && tokens[i + 1].kind == TokenKind::kMinus;
    if (token.kind == TokenKind::kMinus && (!followed || minus_follows)) continue;
    if ((token.kind == TokenKind::kOr || token.kind == TokenKind::kAnd) &&
        (!followed || sound.empty() || !EndsOperand(sound.back()))) {
      token.kind = TokenKind::kWord;
    }
    sound.push_back(token);
  }
  return sound;
}

/// What is wanted, joined, or everything, without what is unwanted.
Query Without(Query::Kind kind, std::vector<Query> wanted, std::vector<Query> unwanted) {
  unwanted.insert(unwanted.begin(), wanted.empty() ? Query{} : Join(kind, std::move(wanted)));
  return Join(Query::Kind::kAndNot, std::move(unwanted));
}

class Parser {
 public:
  Parser(std::vector<Token> tokens, const std::vector<index::FieldWeight>& fields, bool any_word)
      : tokens_(std::move(tokens)), fields_(fields), any_word_(any_word) {}

  /// Groups side by side, up to a closing parenthesis or the end; none without a word.
  std::optional<Query> List() {
    std::vector<Query> wanted, unwanted;
    while (at_ < tokens_.size() && tokens_[at_].kind != TokenKind::kClose) {
      if (!Take(SideBySide())) Group(wanted, unwanted);
    }
    if (wanted.empty() && unwanted.empty()) return std::nullopt;
    return Without(any_word_ ? Query::Kind::kOr : Query::Kind::kAnd, std::move(wanted),
                   std::move(unwanted));
  }

 private:
  /// The operator that says what standing side by side says; the other one binds tighter.
  TokenKind SideBySide() const { return any_word_ ? TokenKind::kOr : TokenKind::kAnd; }
  TokenKind Tighter() const { return any_word_ ? TokenKind::kAnd : TokenKind::kOr; }

  bool Take(TokenKind kind) {
    if (at_ >= tokens_.size() || tokens_[at_].kind != kind) return false;
    ++at_;
    return true;
  }

  /// Operands with the tighter operator between them.
  void Group(std::vector<Query>& wanted, std::vector<Query>& unwanted) {
    std::vector<Query> with, without;
    do {
      const bool negated = Take(TokenKind::kMinus);
      std::optional<Query> operand = Operand();
      if (operand) (negated ? without : with).push_back(std::move(*operand));
    } while (Take(Tighter()));
    if (with.empty() && without.size() == 1) {
      unwanted.push_back(std::move(without[0]));
    } else if (any_word_) {
      if (with.empty() && without.empty()) return;
      wanted.push_back(Without(Query::Kind::kAnd, std::move(with), std::move(without)));
    } else {
      for (Query& query : without) with.push_back(Without(Query::Kind::kAnd, {}, {query}));
      if (!with.empty()) wanted.push_back(Join(Query::Kind::kOr, std::move(with)));
    }
  }

  std::optional<Query> Operand() {
    if (at_ >= tokens_.size() || tokens_[at_].kind == TokenKind::kClose) return std::nullopt;
    const Token token = tokens_[at_++];
    if (token.kind != TokenKind::kOpen) return Leaf(token);
    std::optional<Query> inside = List();
    Take(TokenKind::kClose);
    return inside;
  }

  std::optional<Query> Leaf(const Token& token) {
    std::vector<std::string> words = index::WordsOf(token.text);
    if (words.empty()) return std::nullopt;
    words_ += words.size();
    if (++terms_ > kMaxKeywordTerms || words_ > kMaxKeywordWords) {
      throw BadParameter("The keyword has more than " + std::to_string(kMaxKeywordTerms) +
                         " words");
    }
    const bool exact = token.kind == TokenKind::kPhrase;
    if (token.kind != TokenKind::kPrefix) return Words(std::move(words), exact);
    // "annual_rep*": what stands before its last word, and words that begin like that one.
    std::vector<Query> both{Node(Query::Kind::kPrefix, {std::move(words.back())}, false)};
    words.pop_back();
    if (!words.empty()) both.insert(both.begin(), Words(std::move(words), true));
    return Join(Query::Kind::kAnd, std::move(both));
  }

  Query Words(std::vector<std::string> words, bool exact) const {
    const Query::Kind kind = words.size() == 1 ? Query::Kind::kWord : Query::Kind::kPhrase;
    return Node(kind, std::move(words), exact);
  }

  Query Node(Query::Kind kind, std::vector<std::string> words, bool exact) const {
    Query query;
    query.kind = fields_.empty() ? Query::Kind::kNothing : kind;
    query.words = std::move(words);
    query.fields = fields_;
    query.exact = exact;
    return query;
  }

  std::vector<Token> tokens_;
  const std::vector<index::FieldWeight>& fields_;
  const bool any_word_;
  std::size_t at_ = 0;
  unsigned terms_ = 0;
  std::size_t words_ = 0;
};

}  // namespace

std::optional<Query> ParseKeyword(std::string_view text,
                                  const std::vector<index::FieldWeight>& fields, bool any_word) {
  if (text.size() > kMaxKeywordBytes) {
    throw BadParameter("The keyword is longer than " + std::to_string(kMaxKeywordBytes) + " bytes");
  }
  const std::vector<Token> tokens = Tokenize(text);
  if (tokens.empty() && text.find('"') == std::string_view::npos) return std::nullopt;
  Parser parser(WithOperands(Paired(tokens)), fields, any_word);
  std::optional<Query> query = parser.List();
  return query ? std::move(query) : Nothing();
}

}  // namespace maru::daemon
