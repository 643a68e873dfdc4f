#include "index/fragments.h"

#include <utf8proc.h>

#include <algorithm>
#include <unordered_map>

#include "index/engine.h"
#include "index/tokenizer.h"

namespace maru::index {
namespace {

/// Characters of an average word with the blank behind it.
constexpr std::size_t kWordCharacters = 7;
/// Positions looked at per group: enough for the best fragments of any text.
constexpr std::size_t kMaxSpans = 4000;

using Positions = std::vector<Xapian::termpos>;

Positions PositionsOf(const Xapian::Database& database, Xapian::docid document,
                      const std::string& term) {
  Positions positions;
  auto position = database.positionlist_begin(document, term);
  for (; position != database.positionlist_end(document, term); ++position) {
    if (positions.size() >= kMaxSpans) break;
    positions.push_back(*position);
  }
  return positions;
}

/// The group's words that the document has: one walk over its list of terms, when there are many.
std::vector<std::string> TermsInDocument(const Xapian::Database& database, Xapian::docid document,
                                         std::string_view prefix,
                                         const std::vector<std::string>& words) {
  std::vector<std::string> terms;
  for (const std::string& word : words) terms.push_back(TermOf(prefix, word));
  constexpr std::size_t kFew = 4;
  if (terms.size() <= kFew) return terms;
  std::sort(terms.begin(), terms.end());
  std::vector<std::string> present;
  auto here = database.termlist_begin(document);
  for (const std::string& term : terms) {
    if (here == database.termlist_end(document)) break;
    here.skip_to(term);
    if (here != database.termlist_end(document) && *here == term) present.push_back(term);
  }
  return present;
}

void AddPhraseSpans(const std::vector<Positions>& positions, std::size_t group,
                    std::vector<Span>& spans) {
  if (positions.empty()) return;
  for (const Xapian::termpos first : positions[0]) {
    bool whole = true;
    for (std::size_t i = 1; whole && i < positions.size(); ++i) {
      whole = std::binary_search(positions[i].begin(), positions[i].end(),
                                 first + static_cast<Xapian::termpos>(i));
    }
    if (whole) {
      spans.push_back({first, first + static_cast<Xapian::termpos>(positions.size() - 1), group});
    }
  }
}

void Sort(std::vector<Span>& spans) {
  std::sort(spans.begin(), spans.end(), [](const Span& a, const Span& b) {
    return a.first != b.first ? a.first < b.first : a.last > b.last;
  });
}

void AppendEscaped(std::string& html, std::string_view text) {
  std::size_t at = 0;
  while (at < text.size()) {
    const auto byte = static_cast<unsigned char>(text[at]);
    if (byte <= 0x20 || byte == 0x7f) {
      if (!html.empty() && html.back() != ' ') html += ' ';
      ++at;
      continue;
    }
    if (byte < 0x80) {
      switch (text[at]) {
        case '&':
          html += "&amp;";
          break;
        case '<':
          html += "&lt;";
          break;
        case '>':
          html += "&gt;";
          break;
        case '"':
          html += "&quot;";
          break;
        case '\'':
          html += "&#39;";
          break;
        default:
          html += text[at];
      }
      ++at;
      continue;
    }
    utf8proc_int32_t c = 0;
    const auto size = utf8proc_iterate(reinterpret_cast<const utf8proc_uint8_t*>(text.data()) + at,
                                       static_cast<utf8proc_ssize_t>(text.size() - at), &c);
    if (size <= 0) {
      ++at;
      continue;
    }
    const auto category = utf8proc_category(c);
    if (category != UTF8PROC_CATEGORY_CC && category != UTF8PROC_CATEGORY_CF) {
      html.append(text, at, static_cast<std::size_t>(size));
    }
    at += static_cast<std::size_t>(size);
  }
}

}  // namespace

std::vector<Span> SpansFromIndex(const Xapian::Database& database, Xapian::docid document,
                                 std::string_view field_prefix,
                                 const std::vector<MarkGroup>& groups) {
  std::vector<Span> spans;
  for (std::size_t group = 0; group < groups.size(); ++group) {
    if (groups[group].phrase) {
      std::vector<Positions> positions;
      for (const std::string& word : groups[group].words) {
        positions.push_back(PositionsOf(database, document, TermOf(field_prefix, word)));
      }
      AddPhraseSpans(positions, group, spans);
      continue;
    }
    for (const std::string& term :
         TermsInDocument(database, document, field_prefix, groups[group].words)) {
      for (const Xapian::termpos position : PositionsOf(database, document, term)) {
        spans.push_back({position, position, group});
      }
    }
  }
  Sort(spans);
  return spans;
}

std::vector<Span> SpansInText(std::string_view text, const std::vector<MarkGroup>& groups) {
  std::unordered_map<std::string, Positions> words;
  Xapian::termpos position = 0;
  Tokenizer().ForEach(text, [&](const Token& token) {
    words[std::string(token.word)].push_back(++position);
    return true;
  });
  std::vector<Span> spans;
  for (std::size_t group = 0; group < groups.size(); ++group) {
    std::vector<Positions> positions;
    for (const std::string& word : groups[group].words) {
      const auto found = words.find(word);
      positions.push_back(found == words.end() ? Positions{} : found->second);
    }
    if (groups[group].phrase) {
      AddPhraseSpans(positions, group, spans);
      continue;
    }
    for (const Positions& list : positions) {
      for (const Xapian::termpos at : list) spans.push_back({at, at, group});
    }
  }
  Sort(spans);
  return spans;
}

std::vector<Window> BestWindows(const std::vector<Span>& spans, const FragmentOptions& options) {
  const auto width =
      static_cast<Xapian::termpos>(std::max<std::size_t>(options.length / kWordCharacters, 4));
  struct Candidate {
    std::size_t begin, end;
    std::size_t groups;
  };
  std::vector<Candidate> candidates;
  std::unordered_map<std::size_t, unsigned> inside;
  std::size_t end = 0;
  for (std::size_t begin = 0; begin < spans.size(); ++begin) {
    end = std::max(end, begin);
    while (end < spans.size() && spans[end].last < spans[begin].first + width) {
      ++inside[spans[end++].group];
    }
    if (end == begin) ++inside[spans[end++].group];
    candidates.push_back({begin, end, inside.size()});
    if (--inside[spans[begin].group] == 0) inside.erase(spans[begin].group);
  }
  std::stable_sort(
      candidates.begin(), candidates.end(), [](const Candidate& a, const Candidate& b) {
        return a.groups != b.groups ? a.groups > b.groups : a.end - a.begin > b.end - b.begin;
      });
  std::vector<Window> windows;
  for (const Candidate& candidate : candidates) {
    if (windows.size() >= options.count) break;
    const Xapian::termpos first = spans[candidate.begin].first;
    const Xapian::termpos last = spans[candidate.end - 1].last;
    const Xapian::termpos covered = last - first + 1;
    const Xapian::termpos before = covered < width ? (width - covered) / 2 : 0;
    const Xapian::termpos from = first > before ? first - before : 1;
    const Window window{from, std::max(last, from + width - 1),
                        static_cast<unsigned>(candidate.end - candidate.begin)};
    const bool overlaps = std::any_of(windows.begin(), windows.end(), [&](const Window& other) {
      return window.first <= other.last && other.first <= window.last;
    });
    if (!overlaps) windows.push_back(window);
  }
  return windows;
}

std::string RenderWindow(const TextPiece& piece, const Window& window,
                         const std::vector<Span>& spans) {
  const std::string_view text = piece.text;
  std::string html;
  Xapian::termpos position = piece.first_position - 1;
  std::size_t rendered =
      piece.first_position >= window.first && !piece.more_before ? 0 : text.size();
  std::size_t begin_of_next = text.size();
  bool started = rendered == 0;
  bool marking = false;
  Xapian::termpos mark_end = 0;
  auto span =
      std::lower_bound(spans.begin(), spans.end(), window.first,
                       [](const Span& a, Xapian::termpos first) { return a.first < first; });
  Tokenizer().ForEach(text, [&](const Token& token) {
    ++position;
    if (position < window.first) return true;
    if (position > window.last) {
      begin_of_next = token.begin;
      return false;
    }
    if (!started) {
      rendered = token.begin;
      started = true;
    }
    while (span != spans.end() && span->first < position) ++span;
    if (span != spans.end() && span->first == position && !marking) {
      AppendEscaped(html, text.substr(rendered, token.begin - rendered));
      rendered = token.begin;
      html += "<mark>";
      marking = true;
      mark_end = span->last;
    }
    if (marking && position >= mark_end) {
      AppendEscaped(html, text.substr(rendered, token.end - rendered));
      rendered = token.end;
      html += "</mark>";
      marking = false;
    }
    return true;
  });
  if (started) AppendEscaped(html, text.substr(rendered, begin_of_next - rendered));
  if (marking) html += "</mark>";
  while (html.ends_with(' ')) html.pop_back();
  return html;
}

}  // namespace maru::index
