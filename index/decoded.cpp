#include "index/decoded.h"

#include <algorithm>
#include <limits>

namespace maru::index {
namespace {

/// Postings kept of all databases together: 6 bytes each.
constexpr std::size_t kMostKept = 6u << 20;
constexpr std::size_t kMostOfTerm = 1u << 20;
/// Terms remembered of one database, most of them by their names only.
constexpr std::size_t kMostTerms = 1u << 14;

std::atomic<std::size_t> all_kept{0};

/// Null when a count is too high to be kept.
std::shared_ptr<const Postings> Decode(const std::string& term, const Xapian::Database& database) {
  auto postings = std::make_shared<Postings>();
  const std::size_t documents = database.get_termfreq(term);
  postings->ids.reserve(documents);
  postings->counts.reserve(documents);
  const auto end = database.postlist_end(term);
  for (auto at = database.postlist_begin(term); at != end; ++at) {
    const Xapian::termcount count = at.get_wdf();
    if (count > std::numeric_limits<std::uint16_t>::max()) return nullptr;
    postings->ids.push_back(*at);
    postings->counts.push_back(static_cast<std::uint16_t>(count));
  }
  return postings;
}

}  // namespace

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
  bool asked_before = false;
  auto postings = Find(term, asked_before);
  if (postings || !asked_before || database.get_termfreq(term) > kMostOfTerm) return postings;
  postings = Decode(term, database);
  if (postings) Keep(term, postings);
  return postings;
}

std::shared_ptr<const Postings> Decoded::Find(const std::string& term, bool& asked_before) const {
  const std::lock_guard lock(mutex_);
  const auto found = postings_.find(term);
  asked_before = found != postings_.end();
  if (asked_before) return found->second;
  if (postings_.size() >= kMostTerms) Forget();
  postings_.emplace(term, nullptr);
  return nullptr;
}

void Decoded::Keep(const std::string& term, const std::shared_ptr<const Postings>& postings) const {
  const std::size_t size = postings->ids.size();
  const std::lock_guard lock(mutex_);
  if (all_kept + size > kMostKept) Forget();
  if (all_kept + size > kMostKept) return;  // other databases have it all
  auto& place = postings_[term];
  if (place) return;
  place = postings;
  kept_ += size;
  all_kept += size;
}

/// With the lock, or with nobody else there. Those in use live on until they are let go.
void Decoded::Forget() const {
  postings_.clear();
  all_kept -= std::exchange(kept_, 0);
}

}  // namespace maru::index
