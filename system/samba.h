#pragma once

#include <string>

/// The Samba settings in their canonical form. For this room.
namespace maru {

/// What testparm makes of the file: includes read, synonyms and defaults written out. A section
/// that testparm refuses has but one line, `maruseeker:refused = WHY`. Throws std::runtime_error
/// with testparm's own words when it refuses what is global, runs too long or cannot be run.
std::string CanonicalSamba(const std::string& path);

}  // namespace maru
