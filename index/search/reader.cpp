#include "index/search/reader.h"

#include <algorithm>

#include "index/store/engine.h"

namespace maru::index {
namespace {

constexpr char kPostings = 't';
constexpr char kBeginning = 'b';
/// Documents changed beyond which a list is better read anew, as a part of its length.
constexpr std::size_t kMuchMore = 8;

/// The postings as they are after documents have changed, of which `count_of(id)` tells how often
/// each has the term now; the same object when these do not matter, null when there are too many.
template <class CountOf>
std::shared_ptr<const Postings> Advanced(const std::shared_ptr<const Postings>& old,
                                         const std::vector<DocumentId>& changed,
                                         CountOf&& count_of) {
  if (changed.size() * kMuchMore > old->ids.size() + kMuchMore * kMuchMore) return nullptr;
  auto now = std::make_shared<Postings>();
  bool same = true;
  std::size_t copied = 0;
  const auto copy_to = [&](std::size_t end) {
    const auto from = static_cast<std::ptrdiff_t>(copied), to = static_cast<std::ptrdiff_t>(end);
    now->ids.insert(now->ids.end(), old->ids.begin() + from, old->ids.begin() + to);
    now->counts.insert(now->counts.end(), old->counts.begin() + from, old->counts.begin() + to);
    copied = end;
  };
  for (const DocumentId id : changed) {
    const auto place = std::lower_bound(old->ids.begin(), old->ids.end(), id) - old->ids.begin();
    const auto index = static_cast<std::size_t>(place);
    const bool was = index < old->ids.size() && old->ids[index] == id;
    const std::uint32_t count = count_of(id);
    if (count == (was ? old->counts[index] : 0)) continue;
    same = false;
    copy_to(index);
    if (was) ++copied;
    if (count == 0) continue;
    now->ids.push_back(id);
    now->counts.push_back(count);
  }
  if (same) return old;
  copy_to(old->ids.size());
  return now;
}

/// How often a document has terms that begin with `prefix`.
std::uint32_t CountBeginning(const Xapian::Database& database, DocumentId id,
                             const std::string& prefix) {
  std::uint32_t count = 0;
  try {
    auto term = database.termlist_begin(id);
    const auto end = database.termlist_end(id);
    if (term != end) term.skip_to(prefix);
    for (; term != end && (*term).starts_with(prefix); ++term) count += term.get_wdf();
  } catch (const Xapian::DocNotFoundError&) {
    return 0;
  }
  return count;
}

/// The postings of all terms that begin with `prefix`, added up by document.
Postings AddedUp(const Xapian::Database& database, DocumentId last, const std::string& prefix,
                 const std::function<void()>& poll) {
  std::vector<std::uint32_t> counts(last + 1ull);
  std::size_t documents = 0;
  const auto end = database.allterms_end(prefix);
  for (auto term = database.allterms_begin(prefix); term != end; ++term) {
    poll();
    const auto postings_end = database.postlist_end(*term);
    for (auto at = database.postlist_begin(*term); at != postings_end; ++at) {
      documents += counts[*at] == 0;
      counts[*at] += at.get_wdf();
    }
  }
  Postings postings;
  postings.ids.reserve(documents);
  postings.counts.reserve(documents);
  for (std::size_t id = 0; id < counts.size(); ++id) {
    if (counts[id] == 0) continue;
    postings.ids.push_back(static_cast<DocumentId>(id));
    postings.counts.push_back(counts[id]);
  }
  return postings;
}

}  // namespace

std::shared_ptr<const Postings> Reader::KeptPostings(const std::string& term) const {
  return snapshot_->Find<Postings>(kPostings, term, [&](const auto& old, const auto& changes) {
    auto at = database_.postlist_begin(term);
    const auto end = database_.postlist_end(term);
    return Advanced(old, changes.terms, [&](DocumentId id) {
      if (at != end) at.skip_to(id);
      return at != end && *at == id ? at.get_wdf() : 0;
    });
  });
}

std::shared_ptr<const Postings> Reader::PostingsOf(const std::string& term) const {
  auto kept = KeptPostings(term);
  if (kept) return kept;
  const std::uint64_t documents = database_.get_termfreq(term);
  const bool worth = documents > 0 && snapshot_->Spend(kPostings, term, 0, documents);
  return worth ? Decode(term) : nullptr;
}

std::shared_ptr<const Postings> Reader::AllPostingsOf(const std::string& term) const {
  auto kept = KeptPostings(term);
  return kept ? kept : Decode(term);
}

std::shared_ptr<const Postings> Reader::Decode(const std::string& term) const {
  const std::uint64_t documents = database_.get_termfreq(term);
  auto postings = std::make_shared<Postings>();
  postings->ids.reserve(documents);
  postings->counts.reserve(documents);
  const auto end = database_.postlist_end(term);
  for (auto at = database_.postlist_begin(term); at != end; ++at) {
    postings->ids.push_back(*at);
    postings->counts.push_back(at.get_wdf());
  }
  const std::shared_ptr<const Postings> decoded = postings;
  snapshot_->Keep(kPostings, term, decoded);
  return decoded;
}

std::shared_ptr<const Postings> Reader::Beginning(const std::string& prefix,
                                                  const std::function<void()>& poll) const {
  auto postings =
      snapshot_->Find<Postings>(kBeginning, prefix, [&](const auto& old, const auto& changes) {
        return Advanced(old, changes.terms,
                        [&](DocumentId id) { return CountBeginning(database_, id, prefix); });
      });
  if (postings) return postings;
  postings =
      std::make_shared<const Postings>(AddedUp(database_, snapshot_->LastDocument(), prefix, poll));
  snapshot_->Keep(kBeginning, prefix, postings);
  return postings;
}

std::uint64_t Reader::FrequencyOf(const std::string& term) const {
  const auto kept = KeptPostings(term);
  return kept ? kept->ids.size() : database_.get_termfreq(term);
}

void Reader::Walked(const std::string& term, std::uint64_t steps,
                    std::uint64_t all) const noexcept {
  if (steps == 0) return;
  try {
    snapshot_->Spend(kPostings, term, steps, all);
  } catch (const std::bad_alloc&) {
    // It will be asked for again.
  }
}

std::optional<Stored> Reader::Read(DocumentId id) const {
  if (id == 0) return std::nullopt;
  try {
    return Stored::Decode(database_.get_document(id).get_data());
  } catch (const Xapian::DocNotFoundError&) {
    return std::nullopt;
  }
}

std::optional<Entry> Reader::Resolve(std::string_view path) const {
  const std::string root = database_.get_metadata(kRootKey);
  if (root.empty()) return std::nullopt;
  Decoder root_in(root);
  Entry at = DecodeEntry(root_in);
  while (!path.empty()) {
    if (path[0] == '/') {
      path.remove_prefix(1);
      continue;
    }
    const std::string_view name = path.substr(0, path.find('/'));
    path.remove_prefix(name.size());
    if (at.directory == 0) return std::nullopt;
    const std::string entries = database_.get_metadata(EntriesKey(at.directory));
    bool found = false;
    for (Decoder in(entries); !found && !in.AtEnd();) {
      Entry entry = DecodeEntry(in);
      found = entry.name == name;
      if (found) at = std::move(entry);
    }
    if (!found) return std::nullopt;
  }
  return at;
}

}  // namespace maru::index
