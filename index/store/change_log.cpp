#include "index/store/change_log.h"

#include <utility>

#include "index/store/codec.h"

namespace maru::index {
namespace {

/// Commits that are told, and documents of one: a reader that has more to catch up with derives
/// everything anew.
constexpr std::uint32_t kCommits = 64;
constexpr std::size_t kMostDocuments = 1024;

std::string KeyOf(std::uint32_t commit) {
  return "j" + BigEndian32(commit % kCommits);
}

void EncodeIds(Encoder& out, const std::set<DocumentId>& ids) {
  out.Number(ids.size());
  DocumentId before = 0;
  for (const DocumentId id : ids) out.Number(id - std::exchange(before, id));
}

std::vector<DocumentId> DecodeIds(Decoder& in) {
  std::vector<DocumentId> ids;
  DocumentId id = 0;
  for (std::uint64_t left = in.Number(); left > 0; --left) ids.push_back(id += in.Number32());
  return ids;
}

}  // namespace

std::optional<CommitChanges> ReadChanges(const MetadataReader& read, std::uint32_t commit) {
  const std::string bytes = read(KeyOf(commit));
  Decoder in(bytes);
  if (in.AtEnd() || in.Number32() != commit) return std::nullopt;
  CommitChanges changes;
  changes.everything = in.Number() != 0;
  changes.table = in.Number() != 0;
  changes.terms = DecodeIds(in);
  changes.values = DecodeIds(in);
  return changes;
}

void ChangeLog::Add(std::set<DocumentId>& ids, DocumentId id) {
  if (everything_) return;
  ids.insert(id);
  everything_ = ids.size() > kMostDocuments;
}

void ChangeLog::Save(const MetadataWriter& write, std::uint32_t commit, bool table_changed) const {
  const std::set<DocumentId> none;
  Encoder out;
  out.Number(commit).Number(everything_).Number(table_changed);
  EncodeIds(out, everything_ ? none : terms_);
  EncodeIds(out, everything_ ? none : values_);
  write(KeyOf(commit), out.Take());
}

}  // namespace maru::index
