#include "index/store/record.h"

#include <algorithm>

namespace maru::index {
namespace {

std::uint32_t Fixed32(std::string_view bytes, std::size_t at) {
  std::uint32_t value = 0;
  for (std::size_t i = at; i < at + 4; ++i)
    value = value << 8 | static_cast<unsigned char>(bytes[i]);
  return value;
}

}  // namespace

std::string Place::Encode() const {
  return BigEndian32(parent) + BigEndian32(rights) + static_cast<char>(kind) +
         BigEndian32(name_hash);
}

Place Place::Decode(std::string_view bytes) {
  if (bytes.size() != kSize) return {};
  return {Fixed32(bytes, 0), Fixed32(bytes, 4), static_cast<std::uint8_t>(bytes[8]),
          Fixed32(bytes, 9)};
}

std::string TextPlace::Encode() const {
  if (length == 0) return {};
  return Encoder().Number(segment).Number(offset).Number(length).Take();
}

TextPlace TextPlace::Decode(std::string_view bytes) {
  if (bytes.empty()) return {};
  Decoder in(bytes);
  TextPlace place;
  place.segment = in.Number32();
  place.offset = in.Number();
  place.length = in.Number();
  return place;
}

std::string Stored::Encode() const {
  Encoder out;
  out.String(text.Encode())
      .String(record.name)
      .Number(record.is_dir)
      .Number(record.size)
      .Signed(record.mtime)
      .Number(record.inode);
  out.String(record.title).Number(record.authors.size());
  for (const std::string& author : record.authors) out.String(author);
  return place.Encode() + out.Take();
}

Stored Stored::Decode(std::string_view bytes) {
  const std::size_t split = std::min(bytes.size(), Place::kSize);
  Decoder in(bytes.substr(split));
  Stored stored;
  stored.place = Place::Decode(bytes.substr(0, split));
  stored.text = TextPlace::Decode(in.String());
  Record& record = stored.record;
  record.name = in.String();
  record.is_dir = in.Number() != 0;
  record.size = in.Number();
  record.mtime = in.Signed();
  record.inode = in.Number();
  record.title = in.String();
  for (std::uint64_t left = in.Number(); left > 0; --left) record.authors.emplace_back(in.String());
  return stored;
}

std::string EntriesKey(DirectoryId directory) {
  return "e" + BigEndian32(directory);
}

void EncodeEntry(Encoder& out, const Entry& entry) {
  out.String(entry.name).Number(entry.document).Number(entry.directory);
  out.Signed(entry.stamp.ctime_ns).Signed(entry.stamp.mtime_ns);
  out.Number(entry.stamp.size).Number(entry.stamp.inode).Signed(entry.stamp.born_ns);
}

Entry DecodeEntry(Decoder& in) {
  Entry entry;
  entry.name = in.String();
  entry.document = in.Number32();
  entry.directory = in.Number32();
  entry.stamp.ctime_ns = in.Signed();
  entry.stamp.mtime_ns = in.Signed();
  entry.stamp.size = in.Number();
  entry.stamp.inode = in.Number();
  entry.stamp.born_ns = in.Signed();
  return entry;
}

}  // namespace maru::index
