#include "index/search/fragment_finder.h"

#include <algorithm>

#include "index/text/signature.h"

namespace maru::index {
namespace {

/// Chunks of one text that are looked into, and those with matches among them.
constexpr std::size_t kMaxChunks = 64;
constexpr std::size_t kMaxMatching = 8;

struct Found {
  Window window;
  std::string html;
};

}  // namespace

FragmentFinder::FragmentFinder(std::vector<MarkGroup> groups)
    : groups_(std::move(groups)), words_(groups_) {
  for (MarkGroup& group : groups_) {
    const bool phrase = group.kind == MarkGroup::Kind::kPhrase;
    if (!phrase) std::sort(group.words.begin(), group.words.end());
    phrases_.emplace_back(phrase ? group.words : std::vector<std::string>());
    auto& hashes = all_.emplace_back();
    if (group.kind == MarkGroup::Kind::kPrefix) continue;
    hashes.emplace();
    for (const std::string& word : group.words) hashes->push_back(HashWord(word));
  }
}

/// How many groups a chunk may hold.
unsigned FragmentFinder::Promise(const StoredText& text, std::size_t chunk,
                                 const PresentWords& present) const {
  unsigned promise = 0;
  for (std::size_t i = 0; i < groups_.size(); ++i) {
    const auto may_hold = [&](std::uint64_t hash) { return text.MayHold(chunk, hash); };
    promise += groups_[i].kind == MarkGroup::Kind::kPhrase
                   ? phrases_[i].MayBegin(text, chunk)
                   : !present[i] || std::any_of(present[i]->begin(), present[i]->end(), may_hold);
  }
  return promise;
}

/// The chunks that promise the most, in that order.
std::vector<std::size_t> FragmentFinder::Promising(const StoredText& text,
                                                   const PresentWords& present) const {
  std::vector<std::size_t> chunks;
  if (text.Chunks() == 1) return {0};
  std::vector<unsigned> promises;
  for (std::size_t chunk = 0; chunk < text.Chunks(); ++chunk) {
    promises.push_back(Promise(text, chunk, present));
    if (promises.back() > 0) chunks.push_back(chunk);
  }
  std::stable_sort(chunks.begin(), chunks.end(),
                   [&](std::size_t a, std::size_t b) { return promises[a] > promises[b]; });
  if (chunks.size() > kMaxChunks) chunks.resize(kMaxChunks);
  return chunks;
}

std::vector<Fragment> FragmentFinder::In(StoredText& text, const PresentWords& present,
                                         const FragmentOptions& options) {
  const auto groups = static_cast<std::size_t>(std::count_if(
      present.begin(), present.end(), [](const auto& words) { return !words || !words->empty(); }));
  std::vector<Found> found;
  std::size_t matching = 0;
  for (const std::size_t chunk : Promising(text, present)) {
    piece_.clear();
    if (!text.Append(chunk, piece_)) continue;
    std::vector<Match> matches = words_.MatchesIn(piece_);
    // Only a phrase can begin here and end in the next chunk.
    if (matches.empty() && chunk + 1 < text.Chunks() && text.Append(chunk + 1, piece_)) {
      matches = words_.MatchesIn(piece_);
    }
    for (const Window& window : BestWindows(piece_, matches, options)) {
      found.push_back({window, RenderWindow(piece_, window, matches)});
    }
    const bool enough = found.size() >= options.count && found[0].window.groups >= groups;
    matching += !matches.empty();
    if (enough || matching == kMaxMatching) break;
  }
  std::stable_sort(found.begin(), found.end(),
                   [](const Found& a, const Found& b) { return IsBetter(a.window, b.window); });
  std::vector<Fragment> fragments;
  for (Found& one : found) {
    if (fragments.size() < options.count && !one.html.empty()) {
      fragments.push_back({std::move(one.html), one.window.matches});
    }
  }
  return fragments;
}

std::vector<Fragment> FragmentFinder::Whole(std::string_view text) const {
  const std::vector<Match> matches = words_.MatchesIn(text);
  if (matches.empty()) return {};
  const Window whole{0, text.size(), 1, static_cast<unsigned>(matches.size())};
  return {{RenderWindow(text, whole, matches), whole.matches}};
}

}  // namespace maru::index
