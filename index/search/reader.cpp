#include "index/search/reader.h"

#include <algorithm>

#include "index/store/engine.h"

namespace maru::index {
namespace {

constexpr char kPostings = 't';
/// Documents changed beyond which a list is better read anew, as a part of its length.
constexpr std::size_t kMuchMore = 8;

/// How often a document has the term: asked with ascending ids.
std::uint32_t CountIn(Xapian::PostingIterator& at, const Xapian::PostingIterator& end,
                      DocumentId id) {
  if (at != end) at.skip_to(id);
  return at != end && *at == id ? at.get_wdf() : 0;
}

/// The postings as they are after documents have changed; the same object when these do not matter.
std::shared_ptr<const Postings> Advanced(const std::shared_ptr<const Postings>& old,
                                         const std::vector<DocumentId>& changed,
                                         const Xapian::Database& database,
                                         const std::string& term) {
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
  auto at = database.postlist_begin(term);
  const auto end = database.postlist_end(term);
  for (const DocumentId id : changed) {
    const auto place = std::lower_bound(old->ids.begin(), old->ids.end(), id) - old->ids.begin();
    const auto index = static_cast<std::size_t>(place);
    const bool was = index < old->ids.size() && old->ids[index] == id;
    const std::uint32_t count = CountIn(at, end, id);
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

}  // namespace

std::shared_ptr<const Postings> Reader::KeptPostings(const std::string& term) const {
  return snapshot_->Find<Postings>(kPostings, term, [&](const auto& old, const auto& changes) {
    return Advanced(old, changes.terms, database_, term);
  });
}

std::shared_ptr<const Postings> Reader::PostingsOf(const std::string& term) const {
  auto kept = KeptPostings(term);
  if (kept) return kept;
  const std::uint64_t documents = database_.get_termfreq(term);
  if (documents == 0 || !snapshot_->Spend(kPostings, term, 0, documents)) return nullptr;
  auto postings = std::make_shared<Postings>();
  postings->ids.reserve(documents);
  postings->counts.reserve(documents);
  const auto end = database_.postlist_end(term);
  for (auto at = database_.postlist_begin(term); at != end; ++at) {
    postings->ids.push_back(*at);
    postings->counts.push_back(at.get_wdf());
  }
  kept = postings;
  snapshot_->Keep(kPostings, term, kept);
  return kept;
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
