#pragma once

#include <string>

namespace maru {

/// Makes the calling process act as the user in everything: first back to root through the saved
/// id, then supplementary groups (with `all_groups` false just the primary one), group ids and user
/// ids (real and effective; the saved ids stay 0 so that a later switch is possible), then
/// verified. Start: real, effective or saved user id 0. On false nothing has changed, with errno, 0
/// when there is no such account; a process that can neither go forth nor back ends itself. One
/// thread only.
bool ActAs(const std::string& user_name, bool all_groups = true);

}  // namespace maru
