#include "index/search/eyes.h"

#include <algorithm>

namespace maru::index {
namespace {

constexpr char kEyes = 'e';
constexpr char kSeenBlock = 'v';
/// Judging so many documents one by one costs as much as judging a block.
constexpr std::uint64_t kSeenPrice = 1024;

std::uint32_t NewNumber() {
  static std::atomic<std::uint32_t> last = 0;
  return ++last;
}

std::string NameOf(const Identity& who) {
  Encoder name;
  name.Number(who.uid).Number(who.unrestricted);
  for (const gid_t group : who.groups) name.Number(group);
  return name.Take();
}

/// Settles a fact for every folder from its parent's, each folder once. `own(id)` is asked for the
/// folder itself; `root` is what holds above the top.
template <class Own>
std::vector<bool> Inherit(const DirectoryTable& table, bool root, Own&& own) {
  enum : char { kUnknown, kNo, kYes };
  std::vector<char> state(table.DirectoryCount() + 1, kUnknown);
  state[0] = root ? kYes : kNo;
  std::vector<DirectoryId> way;
  for (DirectoryId id = 1; id < state.size(); ++id) {
    DirectoryId at = id;
    while (at < state.size() && state[at] == kUnknown && way.size() < kMaxDepth) {
      way.push_back(at);
      // Until it is settled, so that a ring leads to nothing.
      state[at] = kNo;
      at = table.Directory(at).parent;
    }
    bool above = at < state.size() && state[at] == kYes && (at != 0 || root);
    for (; !way.empty(); way.pop_back()) {
      above = own(way.back(), above);
      state[way.back()] = above ? kYes : kNo;
    }
  }
  std::vector<bool> result(state.size());
  for (DirectoryId id = 0; id < state.size(); ++id) result[id] = state[id] == kYes;
  return result;
}

bool BeginsWith(const std::vector<bool>& all, const std::vector<bool>& begin) {
  return all.size() >= begin.size() && std::equal(begin.begin(), begin.end(), all.begin());
}

}  // namespace

Eyes::Eyes(const DirectoryTable& table, const Identity& who) : number_(NewNumber()) {
  readable_.resize(table.RightsCount() + 1);
  std::vector<bool> traversable(readable_.size());
  for (RightsId id = 1; id < readable_.size(); ++id) {
    const int bits = RightsOf(who, table.Rights(id));
    readable_[id] = (bits & kACLRead) != 0;
    traversable[id] = (bits & kACLExecute) != 0;
  }
  reachable_ = Inherit(table, true, [&](DirectoryId id, bool above) {
    return above && traversable[table.Directory(id).rights];
  });
}

bool Eyes::GoOnFrom(const Eyes& others) const {
  return BeginsWith(reachable_, others.reachable_) && BeginsWith(readable_, others.readable_);
}

std::shared_ptr<const Eyes> Eyes::Of(const Reader& reader, const Identity& who) {
  const Snapshot& state = reader.State();
  const std::string name = NameOf(who);
  auto eyes = state.Find<Eyes>(kEyes, name, [&](const auto& old, const CommitChanges& changes) {
    if (!changes.table) return old;
    auto now = std::make_shared<Eyes>(state.Table(), who);
    if (now->GoOnFrom(*old)) now->number_ = old->number_;
    return std::shared_ptr<const Eyes>(now);
  });
  if (eyes) return eyes;
  eyes = std::make_shared<const Eyes>(state.Table(), who);
  state.Keep(kEyes, name, eyes);
  return eyes;
}

/// What they see of a whole block, when that is kept or worth it; else null.
std::shared_ptr<const BlockSet> Eyes::Seen(Reader& reader, DocumentId first,
                                           std::uint64_t wanted) const {
  const Snapshot& state = reader.State();
  const std::string name = Name() + BigEndian32(first);
  const auto advance = [&](const std::shared_ptr<const BlockSet>& old,
                           const CommitChanges& changes) {
    std::shared_ptr<BlockSet> seen;
    ForEachInBlock(changes.values, first, [&](DocumentId id) {
      if (!seen) seen = std::make_shared<BlockSet>(*old);
      ClearBit(*seen, id - first);
      if (Sees(reader.ValueOf(kPlaces, id))) SetBit(*seen, id - first);
    });
    return seen ? seen : old;
  };
  auto kept = state.Find<BlockSet>(kSeenBlock, name, advance);
  if (kept || !state.Spend(kSeenBlock, name, wanted, kSeenPrice)) return kept;
  const auto places = reader.Block(kPlaces, first, kBlockDocuments);
  auto seen = std::make_shared<BlockSet>();
  for (DocumentId offset = 0; offset < kBlockDocuments; ++offset) {
    if (Sees((*places)[offset])) SetBit(*seen, offset);
  }
  kept = seen;
  state.Keep(kSeenBlock, name, kept);
  return kept;
}

void Eyes::Screen(Reader& reader, DocumentId first, BlockSet& documents) const {
  const std::uint64_t count = CountBits(documents);
  if (count == 0) return;
  if (const auto seen = Seen(reader, first, count)) {
    for (std::size_t word = 0; word < kBlockWords; ++word) documents[word] &= (*seen)[word];
    return;
  }
  const BlockSet asked = documents;
  reader.ForEachValue(kPlaces, first, asked, [&](DocumentId offset, const Place& place) {
    if (!Sees(place)) ClearBit(documents, offset);
  });
}

std::vector<bool> FoldersUnder(const DirectoryTable& table, DirectoryId top) {
  return Inherit(table, false, [&](DirectoryId id, bool above) { return above || id == top; });
}

}  // namespace maru::index
