#include "daemon/criteria.h"

#include <vector>

#include "daemon/arguments.h"
#include "daemon/keyword.h"
#include "daemon/range.h"
#include "index/tokenizer.h"
#include "system/rights.h"
#include "system/share_table.h"
#include "system/text.h"

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
  std::size_t at = 0;
  while (at <= text.size()) {
    std::size_t end = text.find(" OR ", at);
    std::size_t next = end == std::string_view::npos ? end : end + 4;
    const std::size_t comma = commas ? text.find(',', at) : std::string_view::npos;
    if (comma < end) {
      end = comma;
      next = comma + 1;
    }
    std::string_view item =
        Trimmed(text.substr(at, end == std::string_view::npos ? end : end - at));
    if (item.size() >= 2 && item.front() == '"' && item.back() == '"') {
      item = item.substr(1, item.size() - 2);
    }
    if (!item.empty()) alternatives.emplace_back(item);
    if (next == std::string_view::npos) break;
    at = next;
  }
  return alternatives;
}

Query ValueQuery(std::string_view field, std::string text) {
  Query query;
  query.kind = Query::Kind::kValue;
  query.field = field;
  query.text = std::move(text);
  return query;
}

Query AnyOf(std::vector<Query> queries) {
  if (queries.size() == 1) return std::move(queries[0]);
  Query any;
  any.kind = queries.empty() ? Query::Kind::kNothing : Query::Kind::kOr;
  any.parts = std::move(queries);
  return any;
}

/// The form in which the index holds an exact value; empty when no document can have it.
std::string StoredValue(const Field& field, const std::string& value) {
  if (field.name == index::kOwner) {
    if (value.find_first_not_of("0123456789") == std::string::npos) return value;
    const auto owner = IdentityOfUser(value);
    return owner ? std::to_string(owner->uid) : std::string();
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
    if (!stored.empty()) any.push_back(ValueQuery(field.name, std::move(stored)));
  }
  return AnyOf(std::move(any));
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
  if (*path == kVolume) return query;
  query.kind = Query::Kind::kUnder;
  query.text = *path;
  return query;
}

}  // namespace

std::optional<std::string> VolumePathOf(std::string_view path) {
  const std::string volume = kVolume;
  if (!path.starts_with('/') || path.size() > 4096 || path.find('\0') != std::string_view::npos) {
    return std::nullopt;
  }
  std::string clean;
  while (!path.empty()) {
    path.remove_prefix(1);
    const std::string_view component = path.substr(0, path.find('/'));
    path.remove_prefix(component.size());
    if (component == "." || component == "..") return std::nullopt;
    if (!component.empty()) clean.append("/").append(component);
  }
  if (clean == volume || clean.starts_with(volume + "/")) return clean;
  return volume + clean;
}

std::optional<Query> ParseKinds(const std::string& kinds) {
  std::vector<Query> any;
  for (const std::string& alternative : Alternatives(kinds, true)) {
    const std::string kind = index::Fold(alternative);
    if (kind == "all") return std::nullopt;
    if (!index::IsKind(kind)) throw BadParameter("Unknown file type " + Quoted(alternative));
    if (any.size() >= kMaxAlternatives) throw BadParameter("Too many file types");
    any.push_back(ValueQuery(index::kKind, kind));
  }
  if (any.empty()) return std::nullopt;
  return AnyOf(std::move(any));
}

std::optional<Query> ParseCriterion(const Field& field, const std::string& value) {
  const std::string text(Trimmed(value));
  if (text.empty()) return std::nullopt;
  switch (field.type) {
    case FieldType::kText:
      return ParseKeyword(text, {{{std::string(field.name), 1}}, false});
    case FieldType::kKeyword:
      return field.name == index::kKind ? ParseKinds(text) : ExactCriterion(field, text);
    case FieldType::kFlag:
      if (text != "true" && text != "false") throw BadValue(field, value, "is not true or false");
      return ValueQuery(field.name, text == "true" ? "1" : "0");
    case FieldType::kPath:
      return PathCriterion(field, value);
    default:
      return RangeCriterion(field, text);
  }
}

}  // namespace maru::daemon
