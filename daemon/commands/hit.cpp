#include "daemon/commands/hit.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <map>

#include "daemon/language/criteria.h"
#include "system/json.h"

namespace maru::daemon {
namespace {

using index::Field;
using index::Hit;

constexpr std::size_t kMaxFieldNames = 64;
/// Any integer: it is brought within its bounds instead of being refused.
constexpr std::int64_t kLow = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kHigh = std::numeric_limits<std::int64_t>::max();

std::string KindOf(const Hit& hit) {
  if (hit.record.is_dir) return "folder";
  return std::string(index::KindOfExtension(index::ExtensionOf(hit.record.name)));
}

Json::Value AuthorsOf(const Hit& hit) {
  Json::Value authors(Json::arrayValue);
  for (const std::string& author : hit.record.authors) authors.append(author);
  return authors;
}

void AddField(json::ObjectWriter& message, const ShareIndex& from, const Hit& hit,
              std::string_view field) {
  if (field == index::kPath) return message.AddText(field, from.share->VolumePath() + hit.path);
  if (field == index::kName) return message.AddText(field, hit.record.name);
  if (field == index::kExtension) {
    return message.AddText(field, index::ExtensionOf(hit.record.name));
  }
  if (field == index::kIsDir) return message.AddFlag(field, hit.record.is_dir);
  if (field == index::kSize) {
    return message.AddNumber(field, static_cast<std::int64_t>(hit.record.size));
  }
  if (field == index::kOwner) return message.AddText(field, std::to_string(hit.owner));
  if (field == index::kModTime) return message.AddNumber(field, hit.record.mtime);
  if (field == index::kKind) return message.AddText(field, KindOf(hit));
  if (field == index::kTitle) return message.AddText(field, hit.record.title);
  message.AddValue(field, field == index::kAuthors ? AuthorsOf(hit) : Json::Value());
}

std::size_t Bounded(std::int64_t number, std::int64_t least, std::int64_t most,
                    std::int64_t usual) {
  return static_cast<std::size_t>(number < 1 ? usual : std::clamp(number, least, most));
}

std::vector<const Field*> FieldsNamed(const Arguments& arguments, const char* list) {
  std::vector<const Field*> fields;
  for (const std::string& name : arguments.Strings(list, kMaxFieldNames, kMaxFieldName)) {
    fields.push_back(index::FindField(name));
    if (!fields.back()) arguments.Refuse(list, "names an unknown field, " + Quoted(name));
  }
  return fields;
}

}  // namespace

std::vector<const Field*> ReadFields(const Arguments& arguments) {
  std::map<std::string_view, const Field*> fields = {
      {index::kOwner, index::FindField(index::kOwner)}};
  for (const char* list : {"load_field", "fields"}) {
    for (const Field* field : FieldsNamed(arguments, list)) {
      if (field->name != index::kText) fields[field->name] = field;
    }
  }
  FieldsNamed(arguments, "lazy_field");
  std::vector<const Field*> in_order;
  for (const auto& [name, field] : fields) in_order.push_back(field);
  return in_order;
}

std::string HitMessage(const ShareIndex& from, const Hit& hit,
                       const std::vector<const Field*>& fields, const Json::Value& highlight) {
  json::ObjectWriter message;
  for (const Field* field : fields) AddField(message, from, hit, field->name);
  message.AddNumber("doc_id", hit.alias);
  if (!highlight.isNull()) message.AddValue("highlight", highlight);
  message.AddText("id", from.id);
  message.AddNumber("score", std::llround(hit.score * 1000));
  return message.Take();
}

index::FragmentOptions ReadFragmentOptions(const Arguments& arguments) {
  index::FragmentOptions options;
  options.field = arguments.String("field", kMaxFieldName, std::string(index::kText));
  const Field* field = index::FindField(options.field);
  if (!field || field->type != index::FieldType::kText) {
    arguments.Refuse("field", "is not a text field: " + Quoted(options.field));
  }
  options.length = Bounded(arguments.Integer("frag_length", kLow, kHigh, 0), kMinFragmentLength,
                           kMaxFragmentLength, kDefaultFragmentLength);
  options.count = Bounded(arguments.Integer("num_fragments", kLow, kHigh, 0), 1, kMaxFragments,
                          kDefaultFragments);
  return options;
}

Json::Value FragmentsOf(index::Highlighter& highlighter, const Hit& hit,
                        const std::vector<index::FragmentOptions>& options) {
  Json::Value fragments(Json::objectValue);
  for (const index::FragmentOptions& wanted : options) {
    for (const index::Fragment& fragment : highlighter.FragmentsOf(hit, wanted)) {
      fragments[wanted.field].append(fragment.html);
    }
  }
  return fragments;
}

}  // namespace maru::daemon
