#include "index/store/texts.h"

#include <dirent.h>
#include <fcntl.h>
#include <lz4.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

#include "index/store/codec.h"

namespace maru::index {
namespace {

constexpr std::uint64_t kSegmentBytes = 256u << 20;
constexpr std::size_t kBufferBytes = 1u << 20;
/// Read at once of a text's beginning: all of most texts, and of longer ones what precedes the
/// chunks.
constexpr std::size_t kFrontBytes = 8192;
constexpr std::uint64_t kMaxRaw = 1u << 20;

maruseeker::Error DiskError(const std::string& what) {
  return maruseeker::Error(maruseeker::kErrorStorage, what + ": " + std::strerror(errno));
}

}  // namespace

std::string SegmentPath(const std::string& folder, std::uint32_t segment) {
  return folder + "/texts." + std::to_string(segment);
}

void TextPacker::Cut(std::size_t end) {
  // A word may be followed by very long nothing; a chunk is never longer than a reader accepts.
  const std::string_view raw =
      text_.substr(chunk_begin_, std::min<std::size_t>(end - chunk_begin_, kMaxRaw));
  std::string packed(static_cast<std::size_t>(LZ4_compressBound(static_cast<int>(raw.size()))),
                     '\0');
  const int size = LZ4_compress_default(raw.data(), packed.data(), static_cast<int>(raw.size()),
                                        static_cast<int>(packed.size()));
  if (size <= 0) throw maruseeker::Error(maruseeker::kErrorStorage, "Cannot pack a text");
  packed.resize(static_cast<std::size_t>(size));
  packed.shrink_to_fit();
  chunks_.push_back({raw.size(), signature_.Take(), std::move(packed)});
  chunk_begin_ = end;
}

/// A text begins with the length of its heads, then the heads, the signatures, the chunks.
std::string TextPacker::Finish() {
  if (text_.empty()) return {};
  Cut(text_.size());
  Encoder heads;
  for (const Chunk& chunk : chunks_) {
    heads.Number(chunk.raw).Number(chunk.signature.size()).Number(chunk.packed.size());
  }
  std::string result = Encoder().String(heads.Take()).Take();
  for (const Chunk& chunk : chunks_) result += chunk.signature;
  for (const Chunk& chunk : chunks_) result += chunk.packed;
  return result;
}

TextWriter::TextWriter(std::string folder) : folder_(std::move(folder)) {
  for (const auto& [segment, size] : SegmentSizes()) segment_ = std::max(segment_, segment);
  Open();
}

TextWriter::~TextWriter() {
  if (file_ >= 0) close(file_);
}

void TextWriter::Open() {
  if (file_ >= 0) close(file_);
  const std::string path = SegmentPath(folder_, segment_);
  file_ = open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
  struct stat status {};
  if (file_ < 0 || fstat(file_, &status) != 0) throw DiskError("Cannot open " + path);
  size_ = static_cast<std::uint64_t>(status.st_size);
}

TextPlace TextWriter::Append(std::string_view packed) {
  if (packed.empty()) return {};
  if (size_ > 0 && size_ + packed.size() > kSegmentBytes) Turn();
  const TextPlace place{segment_, size_, packed.size()};
  buffer_ += packed;
  size_ += packed.size();
  if (buffer_.size() >= kBufferBytes) Flush();
  return place;
}

void TextWriter::Turn() {
  Sync();
  ++segment_;
  Open();
}

void TextWriter::Flush() {
  std::string_view rest = buffer_;
  while (!rest.empty()) {
    const ssize_t written = write(file_, rest.data(), rest.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) {
      const maruseeker::Error error = DiskError("Cannot store a text");
      // Whatever was written of it is no text of anybody: places are counted from the file's end
      // anew.
      buffer_.clear();
      Open();
      throw error;
    }
    rest.remove_prefix(static_cast<std::size_t>(written));
  }
  buffer_.clear();
}

void TextWriter::Sync() {
  Flush();
  if (fdatasync(file_) != 0) throw DiskError("Cannot store texts");
}

std::map<std::uint32_t, std::uint64_t> TextWriter::SegmentSizes() const {
  std::map<std::uint32_t, std::uint64_t> sizes;
  DIR* folder = opendir(folder_.c_str());
  if (!folder) throw DiskError("Cannot read " + folder_);
  while (const dirent* entry = readdir(folder)) {
    const std::string name = entry->d_name;
    if (!name.starts_with("texts.") || name.size() > 15) continue;
    const std::string digits = name.substr(6);
    if (digits.empty() || digits.find_first_not_of("0123456789") != std::string::npos) continue;
    struct stat status {};
    if (stat((folder_ + "/" + name).c_str(), &status) == 0) {
      sizes[static_cast<std::uint32_t>(std::stoul(digits))] =
          static_cast<std::uint64_t>(status.st_size);
    }
  }
  closedir(folder);
  return sizes;
}

void TextWriter::RemoveSegment(std::uint32_t segment) {
  if (segment != segment_) unlink(SegmentPath(folder_, segment).c_str());
}

TextReader::~TextReader() {
  for (const auto& [segment, file] : files_) {
    if (file >= 0) close(file);
  }
}

int TextReader::Segment(std::uint32_t segment) {
  const std::lock_guard lock(mutex_);
  const auto known = files_.find(segment);
  if (known != files_.end()) return known->second;
  const int file = open(SegmentPath(folder_, segment).c_str(), O_RDONLY | O_CLOEXEC);
  if (file >= 0) files_[segment] = file;
  return file;
}

bool TextReader::ReadAt(std::uint32_t segment, std::uint64_t offset, char* into, std::size_t size) {
  const int file = Segment(segment);
  while (size > 0) {
    const ssize_t got = pread(file, into, size, static_cast<off_t>(offset));
    if (got < 0 && errno == EINTR) continue;
    if (got <= 0) return false;
    into += got;
    offset += static_cast<std::uint64_t>(got);
    size -= static_cast<std::size_t>(got);
  }
  return true;
}

std::string TextReader::ReadPacked(const TextPlace& place) {
  std::string packed(place.length, '\0');
  if (!ReadAt(place.segment, place.offset, packed.data(), packed.size())) return {};
  return packed;
}

bool StoredText::ReadFront(std::size_t size) {
  const std::size_t have = front_.size();
  if (size <= have) return true;
  if (size > place_.length) return false;
  front_.resize(size);
  return reader_->ReadAt(place_.segment, place_.offset + have, front_.data() + have, size - have);
}

bool StoredText::Open(TextReader& reader, const TextPlace& place) {
  reader_ = &reader;
  place_ = place;
  chunks_.clear();
  front_.clear();
  if (place.length == 0 || !ReadFront(std::min<std::uint64_t>(place.length, kFrontBytes))) {
    return false;
  }
  try {
    Decoder start(front_);
    const std::uint64_t heads_size = start.Number();
    const std::size_t heads_at = front_.size() - start.Left();
    if (heads_size > place.length || !ReadFront(heads_at + heads_size)) return false;
    std::uint64_t offset = heads_at + heads_size;
    for (Decoder in(std::string_view(front_).substr(heads_at, heads_size)); !in.AtEnd();) {
      Chunk chunk{.raw = in.Number(),
                  .packed = 0,
                  .offset = 0,
                  .signature = in.Number(),
                  .signature_offset = offset};
      chunk.packed = in.Number();
      if (chunk.raw > kMaxRaw || chunk.signature > place.length - offset) throw Damaged();
      offset += chunk.signature;
      chunks_.push_back(chunk);
    }
    if (!ReadFront(offset)) throw Damaged();
    for (Chunk& chunk : chunks_) {
      chunk.offset = offset;
      if (chunk.packed > std::min(place.length - offset, 2 * kMaxRaw)) throw Damaged();
      offset += chunk.packed;
    }
  } catch (const maruseeker::Error&) {
    chunks_.clear();
  }
  return !chunks_.empty();
}

bool StoredText::MayHold(std::size_t chunk, std::uint64_t hash) const {
  return index::MayHold(
      std::string_view(front_).substr(chunks_[chunk].signature_offset, chunks_[chunk].signature),
      hash);
}

bool StoredText::Append(std::size_t index, std::string& text) {
  const Chunk& chunk = chunks_[index];
  std::string_view bytes;
  if (chunk.offset + chunk.packed <= front_.size()) {
    bytes = std::string_view(front_).substr(chunk.offset, chunk.packed);
  } else {
    packed_.resize(chunk.packed);
    if (!reader_->ReadAt(place_.segment, place_.offset + chunk.offset, packed_.data(),
                         packed_.size())) {
      return false;
    }
    bytes = packed_;
  }
  const std::size_t at = text.size();
  text.resize(at + chunk.raw);
  const int size = LZ4_decompress_safe(bytes.data(), text.data() + at,
                                       static_cast<int>(bytes.size()), static_cast<int>(chunk.raw));
  if (size >= 0 && static_cast<std::uint64_t>(size) == chunk.raw) return true;
  text.resize(at);
  return false;
}

}  // namespace maru::index
