#include "index/decoded.h"

#include <algorithm>
#include <set>

namespace maru::index {
namespace {

/// Bytes.
constexpr std::size_t kRoom = 40u << 20;
constexpr std::size_t kRoomOfOne = sizeof(DocumentId) + sizeof(std::uint32_t);
/// What a list takes whatever its length, its name included.
constexpr std::size_t kRoomOfList = 256;
constexpr std::uint64_t kMostOfTerm = 1u << 20;
/// Terms remembered of all databases, most of them by their names only.
constexpr std::size_t kMostTerms = 1u << 15;

std::atomic<std::size_t> room_taken{0};

}  // namespace

std::shared_ptr<const Postings> Postings::Of(const std::string& term,
                                             const Xapian::Database& database) {
  const std::shared_ptr<Postings> postings(new Postings);
  const std::size_t documents = database.get_termfreq(term);
  postings->room_ = kRoomOfList + documents * kRoomOfOne;
  if (room_taken.fetch_add(postings->room_) + postings->room_ > kRoom) return nullptr;
  postings->ids.reserve(documents);
  postings->counts.reserve(documents);
  const auto end = database.postlist_end(term);
  for (auto at = database.postlist_begin(term); at != end; ++at) {
    postings->ids.push_back(*at);
    postings->counts.push_back(at.get_wdf());
  }
  return postings;
}

Postings::~Postings() {
  room_taken -= room_;
}

/// All that keep postings.
struct Decoded::Everybody {
  std::mutex mutex;
  std::set<const Decoded*> list;
  std::size_t rows = 0;
};

Decoded::Everybody& Decoded::All() {
  static Everybody all;
  return all;
}

Decoded::Decoded(DocumentId last) : lengths_(last / kBlockDocuments + 1), read_(lengths_.size()) {
  const std::lock_guard lock(All().mutex);
  All().list.insert(this);
}

Decoded::~Decoded() {
  const std::lock_guard lock(All().mutex);
  All().list.erase(this);
  All().rows -= rows_.size();
}

const std::uint32_t* Decoded::Lengths(DocumentId first, const Xapian::Database& database) const {
  if (const std::uint32_t* known = KnownLengths(first)) return known;
  std::vector<std::uint32_t> lengths(kBlockDocuments);
  auto at = database.postlist_begin({});
  const auto end = database.postlist_end({});
  if (at != end) at.skip_to(std::max<DocumentId>(first, 1));
  for (; at != end && *at - first < kBlockDocuments; ++at) {
    lengths[*at - first] = at.get_doclength();
  }
  const std::size_t number = first / kBlockDocuments;
  const std::lock_guard lock(mutex_);
  if (!read_[number].load(std::memory_order_relaxed)) {
    lengths_[number] = std::move(lengths);
    read_[number].store(true, std::memory_order_release);
  }
  return lengths_[number].data();
}

std::shared_ptr<const Postings> Decoded::Of(const std::string& term,
                                            const Xapian::Database& database) const {
  {
    const std::lock_guard lock(All().mutex);
    const auto known = rows_.find(term);
    if (known == rows_.end()) return nullptr;
    if (known->second.postings || known->second.left > 0) return known->second.postings;
  }
  auto postings = Postings::Of(term, database);
  if (!postings) {
    {
      const std::lock_guard lock(All().mutex);
      MakeRoom(true);
    }
    // What searches under way still use takes its room until they are done.
    postings = Postings::Of(term, database);
    if (!postings) return nullptr;
  }
  const std::lock_guard lock(All().mutex);
  const auto [row, added] = rows_.try_emplace(term, Row{postings, 0});
  All().rows += added;
  if (!row->second.postings) row->second.postings = postings;
  return row->second.postings;
}

void Decoded::Walked(const std::string& term, std::uint64_t steps,
                     std::uint64_t all) const noexcept {
  if (steps == 0 || all > kMostOfTerm) return;
  try {
    const std::lock_guard lock(All().mutex);
    if (All().rows >= kMostTerms) {
      MakeRoom(false);
      if (All().rows >= kMostTerms / 2) MakeRoom(true);
    }
    const auto [row, added] = rows_.try_emplace(term, Row{nullptr, static_cast<std::int64_t>(all)});
    All().rows += added;
    row->second.left -= static_cast<std::int64_t>(steps);
  } catch (const std::bad_alloc&) {
    // It will be asked for again.
  }
}

/// Forgets the terms that are remembered by their names only, or all. With the lock; postings in
/// use live on until they are let go.
void Decoded::MakeRoom(bool all) {
  All().rows = 0;
  for (const Decoded* decoded : All().list) {
    std::erase_if(decoded->rows_, [&](const auto& row) { return all || !row.second.postings; });
    All().rows += decoded->rows_.size();
  }
}

}  // namespace maru::index
