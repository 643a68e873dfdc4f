#pragma once

#include <string>

/// The Samba settings in their canonical form. For this room.
namespace maru {

/// What testparm makes of the file: includes read, synonyms and defaults written out. Throws
/// std::runtime_error with testparm's own words when it refuses the file, runs too long or cannot
/// be run.
std::string CanonicalSamba(const std::string& path);

}  // namespace maru
