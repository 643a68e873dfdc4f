#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "index/record.h"

/// The stored texts of an index: append-only segment files beside the database. A text is kept in
/// chunks compressed one by one, so that a fragment costs one or two chunks, however long the text.
namespace maru::index {

/// Bytes of text in a chunk, about: ends at a word's end.
inline constexpr std::size_t kChunkBytes = 8192;

/// Packs a text while its words are walked through. Not copyable: holds a compressor.
class TextPacker {
 public:
  explicit TextPacker(std::string_view text) : text_(text) {}

  /// Call before each word with its position and first byte: chunks begin at words.
  void BeforeWord(std::uint32_t position, std::size_t begin) {
    if (begin - chunk_begin_ >= kChunkBytes) Cut(position, begin);
  }
  /// The packed text; empty for an empty one.
  std::string Finish();

 private:
  void Cut(std::uint32_t next_position, std::size_t end);

  std::string_view text_;
  std::size_t chunk_begin_ = 0;
  std::uint32_t chunk_position_ = 1;
  struct Chunk {
    std::uint32_t first_position;
    std::size_t raw;
    std::string packed;
  };
  std::vector<Chunk> chunks_;
};

/// A piece of a text with the position of its first word.
struct TextPiece {
  std::string text;
  std::uint32_t first_position = 1;
  /// Whether the text goes on before and behind it.
  bool more_before = false;
  bool more_behind = false;
};

/// Appends to the newest segment. One thread; throws Error (121) when the disk refuses.
class TextWriter {
 public:
  explicit TextWriter(std::string folder);
  ~TextWriter();
  TextWriter(const TextWriter&) = delete;
  TextWriter& operator=(const TextWriter&) = delete;

  /// Where the packed text now lies.
  TextPlace Append(std::string_view packed);
  /// All appended is on the disk afterwards.
  void Sync();
  std::uint32_t CurrentSegment() const { return segment_; }
  /// Begins a new segment with the next text.
  void Turn();
  std::map<std::uint32_t, std::uint64_t> SegmentSizes() const;
  void RemoveSegment(std::uint32_t segment);

 private:
  void Open();
  void Flush();

  std::string folder_;
  std::uint32_t segment_ = 1;
  int file_ = -1;
  std::uint64_t size_ = 0;
  std::string buffer_;
};

/// Reads pieces of stored texts. Thread-safe; keeps the segment files open.
class TextReader {
 public:
  explicit TextReader(std::string folder) : folder_(std::move(folder)) {}
  ~TextReader();
  TextReader(const TextReader&) = delete;
  TextReader& operator=(const TextReader&) = delete;

  /// The chunks that hold the words from position `first` to `last`. An empty piece when the text
  /// is gone (the index was rewritten meanwhile) or damaged.
  TextPiece Read(const TextPlace& place, std::uint32_t first, std::uint32_t last);
  /// The packed text as it lies there; empty when gone.
  std::string ReadPacked(const TextPlace& place);

 private:
  int Segment(std::uint32_t segment);

  std::string folder_;
  std::mutex mutex_;
  std::map<std::uint32_t, int> files_;
};

/// The path of a segment's file.
std::string SegmentPath(const std::string& folder, std::uint32_t segment);

}  // namespace maru::index
