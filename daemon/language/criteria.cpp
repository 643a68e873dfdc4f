#include "daemon/language/criteria.h"

#include <algorithm>
#include <vector>

#include "daemon/core/arguments.h"
#include "daemon/core/scope.h"
#include "daemon/language/keyword.h"
#include "daemon/language/query_tree.h"
#include "daemon/language/range.h"
#include "index/text/tokenizer.h"
#include "system/index_id.h"
#include "system/share_table.h"
#include "system/text.h"
#include "system/volume_path.h"

namespace maru::daemon {
namespace {

using index::Field;
using index::FieldType;
using index::Query;

/// An exact value of the index is at most this long.
constexpr std::size_t kMaxValue = 200;

maruseeker::Error BadValue(const Field& field, const std::string& value, const std::string& why) {
  return BadParameter("The value " + Quoted(value) + " for " + std::string(field.name) + " " + why);
}

/// The alternatives of a value, each trimmed and out of its quotation marks.
std::vector<std::string> Alternatives(std::string_view text, bool commas) {
  std::vector<std::string> alternatives;
  for (bool more = true; more;) {
    const std::size_t comma = commas ? text.find(',') : std::string_view::npos;
    const std::size_t end = std::min(text.find(" OR "), comma);
    std::string_view item = Trimmed(text.substr(0, end));
    if (item.size() >= 2 && item.front() == '"' && item.back() == '"') {
      item = item.substr(1, item.size() - 2);
    }
    if (!item.empty()) alternatives.emplace_back(item);
    more = end != std::string_view::npos;
    if (more) text.remove_prefix(end + (end == comma ? 1 : 4));
  }
  return alternatives;
}

/// The form in which the index holds an exact value; empty when no document can have it.
std::string StoredValue(const Field& field, const std::string& value) {
  if (field.name == index::kOwner) {
    if (value.find_first_not_of("0123456789") == std::string::npos) return value;
    const std::optional<Identity> owner = IdentityOfUser(value);
    return owner ? std::to_string(owner->uid) : "";
  }
  if (field.name == index::kExtension && value[0] == '.') return index::Fold(value.substr(1));
  return index::Fold(value);
}

Query ExactCriterion(const Field& field, const std::string& value) {
  const std::vector<std::string> alternatives = Alternatives(value, false);
  if (alternatives.size() > kMaxAlternatives) throw BadValue(field, value, "has too many parts");
  std::vector<Query> any;
  for (const std::string& alternative : alternatives) {
    if (alternative.size() > kMaxValue) throw BadValue(field, alternative, "is too long");
    std::string stored = StoredValue(field, alternative);
    if (!stored.empty()) any.push_back(Equals(field.name, std::move(stored)));
  }
  return Join(Query::Kind::kOr, std::move(any));
}

Query RangeCriterion(const Field& field, const std::string& value) {
  const bool is_time = field.type == FieldType::kTime;
  const std::optional<Range> range = is_time ? ParseTimeRange(value) : ParseSizeRange(value);
  if (!range) {
    throw BadValue(field, value,
                   is_time ? "is not a time or range of times such as 2026-03..2026-04-15"
                           : "is not a number or range of numbers such as 10MB..20MB");
  }
  Query query;
  query.kind = Query::Kind::kRange;
  query.field = field.name;
  query.low = range->low;
  query.high = range->high;
  return query;
}

Query PathCriterion(const Field& field, const std::string& value) {
  const std::optional<std::string> path = VolumePathOf(value);
  if (!path) throw BadValue(field, value, "is not a folder's path such as /photo/trip");
  Query query;
  VolumePath parts;
  if (!SplitAtShare(*path, parts)) return query;
  query.kind = Query::Kind::kUnder;
  query.field = IndexIdOf(parts.share);
  query.text = parts.rest;
  return query;
}

}  // namespace

std::optional<Query> ParseKinds(const std::string& kinds) {
  std::vector<Query> any;
  for (const std::string& alternative : Alternatives(kinds, true)) {
    const std::string kind = index::Fold(alternative);
    if (kind == "all") return std::nullopt;
    if (!index::IsKind(kind)) throw BadParameter("Unknown file type " + Quoted(alternative));
    if (any.size() >= kMaxAlternatives) throw BadParameter("Too many file types");
    any.push_back(Equals(index::kKind, kind));
  }
  if (any.empty()) return std::nullopt;
  return Join(Query::Kind::kOr, std::move(any));
}

std::optional<Query> ParseCriterion(const Field& field, const std::string& value) {
  const std::string text(Trimmed(value));
  if (text.empty()) return std::nullopt;
  switch (field.type) {
    case FieldType::kText:
      return ParseKeyword(text, {{std::string(field.name), 1}});
    case FieldType::kKeyword:
      return field.name == index::kKind ? ParseKinds(text) : ExactCriterion(field, text);
    case FieldType::kFlag:
      if (text != "true" && text != "false") throw BadValue(field, value, "is not true or false");
      return Equals(field.name, text == "true" ? "1" : "0");
    case FieldType::kPath:
      return PathCriterion(field, value);
    default:
      return RangeCriterion(field, text);
  }
}

}  // namespace maru::daemon
