#include "platform/name_service.h"

#include <errno.h>
#include <grp.h>
#include <pwd.h>

#include <algorithm>

namespace maru {
namespace {

// A group of many thousand members fits in far less.
constexpr std::size_t kMaxBuffer = 16u << 20;
constexpr int kMaxGroups = 65'536;  // the kernel's own limit

/// Calls `look(buffer)` with a growing buffer until it no longer answers ERANGE. True when it
/// answered 0; errno is what it answered.
template <class Look>
bool WithBuffer(std::vector<char>& buffer, Look look) {
  int error = ERANGE;
  for (std::size_t size = 1024; error == ERANGE && size <= kMaxBuffer; size *= 4) {
    buffer.resize(size);
    do {
      error = look();
    } while (error == EINTR);
  }
  // Some sources of the name service say so when there is no such entry.
  errno = error == ENOENT || error == ESRCH ? 0 : error;
  return error == 0;
}

std::optional<Account> ToAccount(const passwd* entry) {
  if (!entry) return std::nullopt;
  return Account{entry->pw_name, entry->pw_uid, entry->pw_gid, entry->pw_dir ? entry->pw_dir : ""};
}

}  // namespace

std::optional<Account> AccountByName(const std::string& name) {
  std::vector<char> buffer;
  passwd entry;
  passwd* found = nullptr;
  const bool answered = WithBuffer(buffer, [&] {
    return getpwnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found);
  });
  return answered ? ToAccount(found) : std::nullopt;
}

std::optional<Account> AccountByUID(uid_t uid) {
  std::vector<char> buffer;
  passwd entry;
  passwd* found = nullptr;
  const bool answered = WithBuffer(
      buffer, [&] { return getpwuid_r(uid, &entry, buffer.data(), buffer.size(), &found); });
  return answered ? ToAccount(found) : std::nullopt;
}

std::optional<gid_t> GroupByName(const std::string& name) {
  std::vector<char> buffer;
  group entry;
  group* found = nullptr;
  const bool answered = WithBuffer(buffer, [&] {
    return getgrnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found);
  });
  if (!answered || !found) return std::nullopt;
  return found->gr_gid;
}

std::optional<std::vector<gid_t>> GroupsOf(const Account& account) {
  const int before = errno;
  std::vector<gid_t> groups(64);
  int count = static_cast<int>(groups.size());
  while (getgrouplist(account.name.c_str(), account.gid, groups.data(), &count) < 0) {
    if (count > kMaxGroups || groups.size() > kMaxGroups) {
      errno = E2BIG;
      return std::nullopt;
    }
    groups.resize(std::max(static_cast<std::size_t>(count), groups.size() * 2));
    count = static_cast<int>(groups.size());
  }
  groups.resize(static_cast<std::size_t>(count));
  std::erase(groups, account.gid);
  std::sort(groups.begin(), groups.end());
  groups.erase(std::unique(groups.begin(), groups.end()), groups.end());
  groups.insert(groups.begin(), account.gid);
  errno = before;
  return groups;
}

}  // namespace maru
