#pragma once

#include <xapian.h>

#include <functional>

#include "index/document_set.h"

/// Exact totals. The engine finds the best few of many matches without looking at most of them; to
/// count them all it would weigh each. Here sets of documents are put together as bits.
namespace maru::index {

/// Whether terms alone answer the query: no phrases, ranges or sources.
bool IsOfTerms(const Xapian::Query& query);

/// The documents that match a query of terms. `look` is called now and then and may throw.
DocumentSet Matching(const Xapian::Database& database, const Xapian::Query& query,
                     const std::function<void()>& look);

}  // namespace maru::index
