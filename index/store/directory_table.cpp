#include "index/store/directory_table.h"

#include <algorithm>

#include "index/store/codec.h"

namespace maru::index {
namespace {

void Encode(Encoder& out, const DirectoryRow& row) {
  out.Number(row.parent).Number(row.rights).String(row.name);
}
void Decode(Decoder& in, DirectoryRow& row) {
  row.parent = in.Number32();
  row.rights = in.Number32();
  row.name = in.String();
}
void Encode(Encoder& out, const FileRights& rights) {
  out.Number(rights.uid).Number(rights.gid).Number(rights.mode).String(rights.acl);
}
void Decode(Decoder& in, FileRights& rights) {
  rights.uid = in.Number32();
  rights.gid = in.Number32();
  rights.mode = static_cast<std::uint16_t>(in.Number32());
  rights.acl = in.String();
}

}  // namespace

template <class Row, char Prefix>
Row& RowTable<Row, Prefix>::Change(std::uint32_t id) {
  const std::uint32_t index = id - 1;
  const std::size_t block = index / kBlockRows;
  if (block >= blocks_.size()) {
    blocks_.resize(block + 1);
    stamps_.resize(block + 1);
    changed_.resize(block + 1);
  }
  if (!blocks_[block]) blocks_[block] = std::make_shared<Block<Row>>();
  if (blocks_[block].use_count() > 1)
    blocks_[block] = std::make_shared<Block<Row>>(*blocks_[block]);
  changed_[block] = true;
  count_ = std::max(count_, id);
  return (*blocks_[block])[index % kBlockRows];
}

template <class Row, char Prefix>
void RowTable<Row, Prefix>::Load(const MetadataReader& read, std::uint32_t since) {
  const std::string stamps = read(std::string{Prefix});
  Decoder in(stamps);
  count_ = in.AtEnd() ? 0 : in.Number32();
  blocks_.resize((count_ + kBlockRows - 1) / kBlockRows);
  stamps_.resize(blocks_.size());
  changed_.assign(blocks_.size(), false);
  for (std::uint32_t i = 0; i < blocks_.size(); ++i) {
    stamps_[i] = in.Number32();
    if (stamps_[i] <= since && blocks_[i]) continue;
    auto block = std::make_shared<Block<Row>>();
    const std::string bytes = read(Prefix + BigEndian32(i));
    Decoder rows(bytes);
    for (Row& row : *block) {
      if (rows.AtEnd()) break;
      Decode(rows, row);
    }
    blocks_[i] = std::move(block);
  }
}

template <class Row, char Prefix>
void RowTable<Row, Prefix>::Save(const MetadataWriter& write, std::uint32_t commit) {
  if (!Changed()) return;
  for (std::uint32_t i = 0; i < blocks_.size(); ++i) {
    if (!changed_[i]) continue;
    Encoder out;
    for (const Row& row : *blocks_[i]) Encode(out, row);
    write(Prefix + BigEndian32(i), out.Take());
    stamps_[i] = commit;
  }
  changed_.assign(blocks_.size(), false);
  Encoder out;
  out.Number(count_);
  for (const std::uint32_t stamp : stamps_) out.Number(stamp);
  write(std::string{Prefix}, out.Take());
}

std::string DirectoryTable::PathOf(DirectoryId id) const {
  std::vector<const std::string*> names;
  std::size_t size = 0;
  for (DirectoryId at = id; directories_[at].parent != 0; at = directories_[at].parent) {
    if (names.size() >= kMaxDepth) return {};
    names.push_back(&directories_[at].name);
    size += names.back()->size() + 1;
  }
  std::string path;
  path.reserve(size);
  for (auto name = names.rbegin(); name != names.rend(); ++name) {
    path += '/';
    path += **name;
  }
  return path;
}

DirectoryId DirectoryTable::AddDirectory() {
  if (free_.empty()) return directories_.Count() + 1;
  const DirectoryId id = free_.back();
  free_.pop_back();
  return id;
}

void DirectoryTable::RemoveDirectory(DirectoryId id) {
  directories_.Change(id) = {};
  freed_.push_back(id);
}

RightsId DirectoryTable::RightsIdOf(const FileRights& rights) {
  if (known_.empty()) {
    for (RightsId id = 1; id <= rights_.Count(); ++id) known_.emplace(rights_[id], id);
  }
  const auto [place, is_new] = known_.emplace(rights, rights_.Count() + 1);
  if (is_new) rights_.Change(place->second) = rights;
  return place->second;
}

void DirectoryTable::Load(const MetadataReader& read) {
  const std::string commit = read("commit");
  directories_.Load(read, commit_);
  rights_.Load(read, commit_);
  if (!commit.empty()) commit_ = Decoder(commit).Number32();
  known_.clear();
}

void DirectoryTable::Save(const MetadataWriter& write) {
  ++commit_;
  directories_.Save(write, commit_);
  rights_.Save(write, commit_);
  write("commit", Encoder().Number(commit_).Take());
  free_.insert(free_.end(), freed_.begin(), freed_.end());
  freed_.clear();
}

}  // namespace maru::index
