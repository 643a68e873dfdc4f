#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "index/store/record.h"
#include "index/text/signature.h"

/// The stored texts of an index: append-only segment files beside the database. A text is kept in
/// chunks compressed one by one, each with a signature of its words, so that a fragment or a phrase
/// costs a chunk or two, however long the text: what a list of positions would tell is read there.
namespace maru::index {

/// Bytes of text in a chunk, about: ends at a word's end.
inline constexpr std::size_t kChunkBytes = 8192;

/// Packs a text while its words are walked through.
class TextPacker {
 public:
  explicit TextPacker(std::string_view text) : text_(text), many_(text.size() > kChunkBytes) {}

  /// Call for each word in order, with its hash and its first byte: chunks begin at words.
  void AddWord(std::uint64_t hash, std::size_t begin) {
    if (previous_) signature_.Add(HashPair(previous_, hash));
    if (begin - chunk_begin_ >= kChunkBytes) Cut(begin);
    if (many_) signature_.Add(hash);
    previous_ = hash;
  }
  /// The packed text; empty for an empty one.
  std::string Finish();

 private:
  void Cut(std::size_t end);

  std::string_view text_;
  /// A text in one chunk needs no signature of its words: the index knows them.
  bool many_;
  std::size_t chunk_begin_ = 0;
  std::uint64_t previous_ = 0;
  SignatureBuilder signature_;
  struct Chunk {
    std::size_t raw;
    std::string signature;
    std::string packed;
  };
  std::vector<Chunk> chunks_;
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

/// The files of stored texts. Thread-safe; keeps them open.
class TextReader {
 public:
  explicit TextReader(std::string folder) : folder_(std::move(folder)) {}
  ~TextReader();
  TextReader(const TextReader&) = delete;
  TextReader& operator=(const TextReader&) = delete;

  /// The packed text as it lies there; empty when gone.
  std::string ReadPacked(const TextPlace& place);
  /// Reads bytes at an offset of a segment; false when they are gone.
  bool ReadAt(std::uint32_t segment, std::uint64_t offset, char* into, std::size_t size);

 private:
  int Segment(std::uint32_t segment);

  std::string folder_;
  std::mutex mutex_;
  std::map<std::uint32_t, int> files_;
};

/// A stored text, chunk by chunk. To be used for one text after the other; one thread.
class StoredText {
 public:
  /// False, and no chunks, when the text is gone (the index was rewritten meanwhile) or damaged.
  bool Open(TextReader& reader, const TextPlace& place);

  std::size_t Chunks() const { return chunks_.size(); }
  /// Whether a pair of neighbours (HashPair) begins in the chunk, or, in a text of several chunks,
  /// a word (HashWord) stands there.
  bool MayHold(std::size_t chunk, std::uint64_t hash) const;
  /// Appends the chunk's text; false when it is gone or damaged.
  bool Append(std::size_t chunk, std::string& text);

 private:
  bool ReadFront(std::size_t size);

  struct Chunk {
    std::uint64_t raw;
    std::uint64_t packed;
    std::uint64_t offset;
    std::uint64_t signature;
    std::uint64_t signature_offset;
  };
  TextReader* reader_ = nullptr;
  TextPlace place_;
  std::vector<Chunk> chunks_;
  /// The text's first bytes: heads and signatures at least.
  std::string front_;
  std::string packed_;
};

/// The path of a segment's file.
std::string SegmentPath(const std::string& folder, std::uint32_t segment);

}  // namespace maru::index
