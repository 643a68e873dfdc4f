#pragma once

#include <xapian.h>

#include <string>

#include "index/store/writer.h"

namespace maru::index {

/// Inside of a Prepared: all but what only the writer knows (ids of rights, place of the text).
struct Prepared::Parts {
  Xapian::Document engine;
  Document document;
  std::string packed_text;
  std::size_t size = 0;
};

/// (Re)places the terms that come from a document's name, kind and owner.
void AddNameTerms(Xapian::Document& engine, const Document& document);
void RemoveNameTerms(Xapian::Document& engine);
std::string_view KindOf(const Document& document);

}  // namespace maru::index
