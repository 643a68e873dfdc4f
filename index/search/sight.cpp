#include "index/search/sight.h"

#include <algorithm>

namespace maru::index {

/// Something counted in each block, and in all of them.
template <class Count>
struct Counts {
  std::vector<Count> blocks;
  Count all{};
};

template <class Count>
struct BytesOf<Counts<Count>> {
  std::size_t operator()(const Counts<Count>& counts) const {
    return sizeof(counts) + counts.blocks.size() * sizeof(Count);
  }
};

namespace {

constexpr char kSeen = 'c';
constexpr char kFrequency = 'q';
/// The documents of so rare a term are judged one by one.
constexpr std::uint64_t kFew = 64;

Collection operator+(const Collection& a, const Collection& b) {
  return {a.documents + b.documents, a.words + b.words};
}
Collection operator-(const Collection& a, const Collection& b) {
  return {a.documents - b.documents, a.words - b.words};
}

/// The count of all blocks: what is kept of an earlier commit, less and plus those of the blocks
/// that have changed, or made anew.
template <class Count, class CountIn>
Count CountOf(const Snapshot& state, char kind, const std::string& name, CountIn&& count_in) {
  const std::size_t blocks = state.LastDocument() / kBlockDocuments + 1;
  const auto advance = [&](const std::shared_ptr<const Counts<Count>>& old,
                           const CommitChanges& changes) {
    auto now = std::make_shared<Counts<Count>>(*old);
    now->blocks.resize(blocks);
    for (auto id = changes.values.begin(); id != changes.values.end();) {
      const DocumentId block = *id / kBlockDocuments;
      const Count count = count_in(block * kBlockDocuments);
      now->all = now->all + count - now->blocks.at(block);
      now->blocks[block] = count;
      while (id != changes.values.end() && *id / kBlockDocuments == block) ++id;
    }
    return std::shared_ptr<const Counts<Count>>(now);
  };
  auto counts = state.Find<Counts<Count>>(kind, name, advance);
  if (counts) return counts->all;
  auto made = std::make_shared<Counts<Count>>();
  for (DocumentId block = 0; block < blocks; ++block) {
    made->blocks.push_back(count_in(block * kBlockDocuments));
    made->all = made->all + made->blocks.back();
  }
  counts = made;
  state.Keep(kind, name, counts);
  return counts->all;
}

}  // namespace

const Collection& Sight::Seen() {
  if (counted_) return seen_;
  if (eyes_) {
    seen_ = CountOf<Collection>(State(), kSeen, eyes_->Name(),
                                [&](DocumentId first) { return SeenIn(first); });
  } else {
    seen_ = {State().Documents(), State().TotalLength()};
  }
  counted_ = true;
  return seen_;
}

Collection Sight::SeenIn(DocumentId first) {
  poll_();
  BlockSet documents;
  documents.fill(~Bits{0});
  eyes_->Screen(reader_, first, documents);
  const auto lengths = reader_.Block(LengthColumn(), first, kBlockDocuments);
  Collection seen;
  ForEachBit(documents, [&](DocumentId offset) {
    ++seen.documents;
    seen.words += (*lengths)[offset];
  });
  return seen;
}

std::uint64_t Sight::FrequencyOf(const std::string& term, bool is_prefix) {
  const std::uint64_t all = is_prefix ? 0 : reader_.FrequencyOf(term);
  if (!is_prefix && (all == 0 || SeesAll())) return all;
  if (!is_prefix && all <= kFew) return CountFew(term);
  const auto postings = is_prefix ? Beginning(term) : reader_.AllPostingsOf(term);
  return SeesAll() ? postings->ids.size() : CountKept((is_prefix ? '*' : ' ') + term, *postings);
}

std::optional<std::vector<DocumentId>> Sight::FewBeginning(const std::string& prefix,
                                                           std::size_t most) {
  if (FrequencyOf(prefix, true) > most) return std::nullopt;
  const auto postings = Beginning(prefix);
  std::vector<DocumentId> seen;
  for (auto id = postings->ids.begin(); id != postings->ids.end();) {
    const DocumentId first = *id / kBlockDocuments * kBlockDocuments;
    BlockSet documents{};
    for (; id != postings->ids.end() && *id - first < kBlockDocuments; ++id) {
      SetBit(documents, *id - first);
    }
    Screen(first, documents);
    ForEachBit(documents, [&](DocumentId offset) { seen.push_back(first + offset); });
  }
  return seen;
}

std::uint64_t Sight::CountFew(const std::string& term) {
  std::uint64_t count = 0;
  const auto end = reader_.Database().postlist_end(term);
  for (auto at = reader_.Database().postlist_begin(term); at != end; ++at) {
    count += Sees(reader_.ValueOf(kPlaces, *at));
  }
  return count;
}

std::uint64_t Sight::CountKept(const std::string& name, const Postings& postings) {
  return CountOf<std::uint32_t>(State(), kFrequency, eyes_->Name() + name, [&](DocumentId first) {
    poll_();
    BlockSet documents{};
    ForEachInBlock(postings.ids, first, [&](DocumentId id) { SetBit(documents, id - first); });
    Screen(first, documents);
    return static_cast<std::uint32_t>(CountBits(documents));
  });
}

}  // namespace maru::index
