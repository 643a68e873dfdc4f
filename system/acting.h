#pragma once

#include <sys/types.h>

#include <string>

namespace maru {

/// For its lifetime the process looks at files with root's rights, if its saved user id is root's;
/// else nothing changes. For looking only: what it made would be root's. Comes back as it was, or
/// ends the process. One thread only.
class RootsEyes {
 public:
  RootsEyes();
  ~RootsEyes();
  RootsEyes(const RootsEyes&) = delete;
  RootsEyes& operator=(const RootsEyes&) = delete;

 private:
  uid_t before_;
};

/// Makes the calling process act as the user in everything: first back to root through the saved
/// id, then supplementary groups (with `all_groups` false just the primary one), group ids and user
/// ids (real and effective; the saved ids stay 0 so that a later switch is possible), then
/// verified. Start: real, effective or saved user id 0. On false nothing has changed, with errno, 0
/// when there is no such account; a process that can neither go forth nor back ends itself. One
/// thread only.
bool ActAs(const std::string& user_name, bool all_groups = true);

}  // namespace maru
