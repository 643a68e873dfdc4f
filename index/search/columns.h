#pragma once

#include <xapian.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <limits>

#include "index/store/document.h"
#include "index/store/record.h"

/// Values that every document has, in blocks of documents with neighbouring ids: matching reads
/// them by the block where many match, and one by one where few do.
namespace maru::index {

/// Documents that are gone through together.
inline constexpr std::size_t kBlockDocuments = 4096;

template <class Value>
using ColumnBlock = std::array<Value, kBlockDocuments>;

/// How many words a document has; 0 for one that is gone.
struct LengthColumn {
  using Value = std::uint32_t;

  char Kind() const { return 'l'; }
  Value Of(const Xapian::Database& database, DocumentId id) const {
    try {
      return database.get_doclength(id);
    } catch (const Xapian::DocNotFoundError&) {
      return 0;
    }
  }
  void Fill(const Xapian::Database& database, DocumentId first, ColumnBlock<Value>& block) const {
    auto at = database.postlist_begin({});
    const auto end = database.postlist_end({});
    if (at != end) at.skip_to(std::max<DocumentId>(first, 1));
    for (; at != end && *at - first < kBlockDocuments; ++at) {
      block[*at - first] = at.get_doclength();
    }
  }
};

/// What documents have in a value slot.
template <class T>
struct SlotColumn {
  using Value = T;

  char Kind() const { return static_cast<char>('0' + slot); }
  Value Of(const Xapian::Database& database, DocumentId id) const {
    auto at = database.valuestream_begin(slot);
    const auto end = database.valuestream_end(slot);
    if (at != end) at.skip_to(id);
    return at != end && at.get_docid() == id ? decode(*at) : none;
  }
  void Fill(const Xapian::Database& database, DocumentId first, ColumnBlock<Value>& block) const {
    block.fill(none);
    auto at = database.valuestream_begin(slot);
    const auto end = database.valuestream_end(slot);
    if (at != end) at.skip_to(std::max<DocumentId>(first, 1));
    for (; at != end && at.get_docid() - first < kBlockDocuments; ++at) {
      block[at.get_docid() - first] = decode(*at);
    }
  }

  Xapian::valueno slot;
  /// Of a document that has no value.
  Value none;
  Value (*decode)(const std::string& bytes);
};

/// Where documents lie and who may read them.
inline const SlotColumn<Place> kPlaces{
    kPlaceSlot, {}, [](const std::string& bytes) { return Place::Decode(bytes); }};

/// Where documents' texts lie.
inline const SlotColumn<TextPlace> kTexts{
    kTextSlot, {}, [](const std::string& bytes) { return TextPlace::Decode(bytes); }};

/// Numbers and times.
inline SlotColumn<double> NumberColumn(Xapian::valueno slot) {
  return {slot, std::numeric_limits<double>::quiet_NaN(),
          [](const std::string& bytes) { return Xapian::sortable_unserialise(bytes); }};
}

}  // namespace maru::index
