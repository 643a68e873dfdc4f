#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "index/search/query.h"

/// Queries put together, and told.
namespace maru::daemon {

index::Query Nothing();

/// The keyword or flag field `field` equals `text`.
index::Query Equals(std::string_view field, std::string text);

/// A node of a kind that has parts. A single part stands for itself, none for nothing.
index::Query Join(index::Query::Kind kind, std::vector<index::Query> parts);

/// The tree for a person's eyes, one line.
std::string Explain(const index::Query& query);

}  // namespace maru::daemon
