#pragma once

#include <json/value.h>

#include <vector>

#include "daemon/core/arguments.h"
#include "daemon/core/scope.h"
#include "index/search/view.h"
#include "index/store/fields.h"

namespace maru::daemon {

/// The fields that a hit's message has: those named by the lists "load_field" and "fields" and the
/// owner, in the order of their names. MARUMDTextContent is taken and left out: texts are shown in
/// fragments only. Throws Error (120) for an unknown name, also in "lazy_field".
std::vector<const index::Field*> ReadFields(const Arguments& arguments);

/// A hit's message: the fields, doc_id, "highlight" unless that is null, id and score.
std::string HitMessage(const ShareIndex& from, const index::Hit& hit,
                       const std::vector<const index::Field*>& fields,
                       const Json::Value& highlight);

/// What a highlight asks for, of one field, in an object of these members.
inline const Arguments::Names kFragmentMembers = {"field", "frag_length", "num_fragments"};
index::FragmentOptions ReadFragmentOptions(const Arguments& arguments);

/// Fragments are asked for with these bounds; numbers outside are taken as the nearest inside, and
/// those below 1 as the default.
constexpr std::int64_t kDefaultFragmentLength = 100;
constexpr std::int64_t kMinFragmentLength = 20;
constexpr std::int64_t kMaxFragmentLength = 1000;
constexpr std::int64_t kDefaultFragments = 3;
constexpr std::int64_t kMaxFragments = 20;

/// {field: [html…]} for each of the options whose field holds a match.
Json::Value FragmentsOf(index::Highlighter& highlighter, const index::Hit& hit,
                        const std::vector<index::FragmentOptions>& options);

}  // namespace maru::daemon
