#include "index/texts.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <zstd.h>

#include <algorithm>
#include <cstring>

#include "index/codec.h"

namespace maru::index {
namespace {

constexpr std::uint64_t kSegmentBytes = 256u << 20;
constexpr std::size_t kBufferBytes = 1u << 20;
constexpr int kLevel = 3;
/// A chunk's head is three numbers; this many bytes hold the heads of texts up to about 4 MB.
constexpr std::size_t kHeadGuess = 4096;
constexpr std::uint64_t kMaxRaw = 1u << 20;

maruseeker::Error DiskError(const std::string& what) {
  return maruseeker::Error(maruseeker::kErrorDaemonExchange, what + ": " + std::strerror(errno));
}

bool ReadAt(int file, std::uint64_t offset, char* into, std::size_t size) {
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

struct ZstdContexts {
  ZSTD_CCtx* packer = ZSTD_createCCtx();
  ZSTD_DCtx* unpacker = ZSTD_createDCtx();
  ~ZstdContexts() {
    ZSTD_freeCCtx(packer);
    ZSTD_freeDCtx(unpacker);
  }
};

ZstdContexts& Contexts() {
  thread_local ZstdContexts contexts;
  return contexts;
}

struct ChunkHead {
  std::uint32_t first_position;
  std::uint64_t raw;
  std::uint64_t packed;
};

/// A text begins with the length of its heads, then the heads, then the chunks.
std::vector<ChunkHead> DecodeHeads(std::string_view bytes) {
  Decoder in(bytes);
  std::vector<ChunkHead> heads;
  while (!in.AtEnd()) {
    ChunkHead head{in.Number32(), in.Number(), in.Number()};
    heads.push_back(head);
  }
  return heads;
}

}  // namespace

std::string SegmentPath(const std::string& folder, std::uint32_t segment) {
  return folder + "/texts." + std::to_string(segment);
}

void TextPacker::Cut(std::uint32_t next_position, std::size_t end) {
  const std::string_view raw = text_.substr(chunk_begin_, end - chunk_begin_);
  std::string packed(ZSTD_compressBound(raw.size()), '\0');
  const std::size_t size = ZSTD_compressCCtx(Contexts().packer, packed.data(), packed.size(),
                                             raw.data(), raw.size(), kLevel);
  if (ZSTD_isError(size)) throw maruseeker::Error(maruseeker::kErrorDaemonExchange, "zstd failed");
  packed.resize(size);
  packed.shrink_to_fit();
  chunks_.push_back({chunk_position_, raw.size(), std::move(packed)});
  chunk_begin_ = end;
  chunk_position_ = next_position;
}

std::string TextPacker::Finish() {
  if (text_.empty()) return {};
  // A tail without words may be long; a chunk is never longer than a reader accepts.
  const std::size_t most = chunk_begin_ + kMaxRaw;
  Cut(UINT32_MAX, std::min(text_.size(), most));
  Encoder heads;
  for (const Chunk& chunk : chunks_) {
    heads.Number(chunk.first_position).Number(chunk.raw).Number(chunk.packed.size());
  }
  std::string result = Encoder().String(heads.Take()).Take();
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

std::string TextReader::ReadPacked(const TextPlace& place) {
  const int file = Segment(place.segment);
  std::string packed(place.length, '\0');
  if (file < 0 || !ReadAt(file, place.offset, packed.data(), packed.size())) return {};
  return packed;
}

TextPiece TextReader::Read(const TextPlace& place, std::uint32_t first, std::uint32_t last) {
  TextPiece piece;
  const int file = Segment(place.segment);
  if (file < 0 || place.length == 0) return piece;
  std::string start(std::min<std::uint64_t>(place.length, kHeadGuess), '\0');
  if (!ReadAt(file, place.offset, start.data(), start.size())) return piece;
  std::uint64_t heads_size = 0;
  std::size_t heads_at = 0;
  for (unsigned shift = 0; heads_at < start.size() && shift < 64; shift += 7) {
    const auto byte = static_cast<unsigned char>(start[heads_at++]);
    heads_size |= static_cast<std::uint64_t>(byte & 0x7f) << shift;
    if (byte < 0x80) break;
  }
  if (heads_size > place.length - heads_at) return piece;
  if (heads_at + heads_size > start.size()) {
    start.resize(heads_at + heads_size);
    if (!ReadAt(file, place.offset, start.data(), start.size())) return piece;
  }
  const std::vector<ChunkHead> heads =
      DecodeHeads(std::string_view(start).substr(heads_at, heads_size));

  std::uint64_t offset = heads_at + heads_size;
  bool any = false;
  for (std::size_t i = 0; i < heads.size(); ++i) {
    const bool before = i + 1 < heads.size() && heads[i + 1].first_position <= first;
    const bool behind = heads[i].first_position > last;
    if (before) piece.more_before = true;
    if (behind && any) piece.more_behind = true;
    if (!before && !(behind && any)) {
      if (heads[i].raw > kMaxRaw || offset + heads[i].packed > place.length) return {};
      std::string packed;
      std::string_view bytes;
      if (offset + heads[i].packed <= start.size()) {
        bytes = std::string_view(start).substr(offset, heads[i].packed);
      } else {
        packed.resize(heads[i].packed);
        if (!ReadAt(file, place.offset + offset, packed.data(), packed.size())) return {};
        bytes = packed;
      }
      if (!any) piece.first_position = heads[i].first_position;
      any = true;
      const std::size_t at = piece.text.size();
      piece.text.resize(at + heads[i].raw);
      const std::size_t size = ZSTD_decompressDCtx(Contexts().unpacker, piece.text.data() + at,
                                                   heads[i].raw, bytes.data(), bytes.size());
      if (ZSTD_isError(size) || size != heads[i].raw) return {};
    }
    offset += heads[i].packed;
  }
  return piece;
}

}  // namespace maru::index
