#include "system/accounts.h"

#include <errno.h>
#include <grp.h>
#include <pwd.h>

#include <algorithm>
#include <chrono>
#include <map>
#include <utility>

#include "system/config.h"

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

/// Answers of the last moment, for each thread its own. A request asks for the same account a dozen
/// times, and some sources of the name service are on other machines.
template <class Key, class Value>
class Recent {
 public:
  template <class Look>
  std::optional<Value> Get(const Key& key, Look look) {
    const auto now = std::chrono::steady_clock::now();
    const auto known = answers_.find(key);
    if (known != answers_.end() && now - known->second.first < kNameServiceAge) {
      errno = 0;
      return known->second.second;
    }
    std::optional<Value> answer = look();
    if (answers_.size() >= kMostRecent) answers_.clear();
    if (answer) answers_.insert_or_assign(key, std::pair(now, *answer));
    return answer;
  }

 private:
  static constexpr std::size_t kMostRecent = 1024;
  std::map<Key, std::pair<std::chrono::steady_clock::time_point, Value>> answers_;
};

std::optional<Account> ToAccount(const passwd* entry) {
  if (!entry) return std::nullopt;
  return Account{entry->pw_name, entry->pw_uid, entry->pw_gid, entry->pw_dir ? entry->pw_dir : ""};
}

std::optional<Account> LookUpName(const std::string& name) {
  std::vector<char> buffer;
  passwd entry;
  passwd* found = nullptr;
  const bool answered = WithBuffer(buffer, [&] {
    return getpwnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found);
  });
  return answered ? ToAccount(found) : std::nullopt;
}

std::optional<Account> LookUpUID(uid_t uid) {
  std::vector<char> buffer;
  passwd entry;
  passwd* found = nullptr;
  const bool answered = WithBuffer(
      buffer, [&] { return getpwuid_r(uid, &entry, buffer.data(), buffer.size(), &found); });
  return answered ? ToAccount(found) : std::nullopt;
}

std::optional<gid_t> LookUpGroup(const std::string& name) {
  std::vector<char> buffer;
  group entry;
  group* found = nullptr;
  const bool answered = WithBuffer(buffer, [&] {
    return getgrnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found);
  });
  if (!answered || !found) return std::nullopt;
  return found->gr_gid;
}

std::optional<std::vector<gid_t>> LookUpGroupsOf(const Account& account) {
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
  return groups;
}

struct Answers {
  Recent<std::string, Account> by_name;
  Recent<uid_t, Account> by_uid;
  Recent<std::string, gid_t> groups;
  Recent<std::pair<std::string, gid_t>, std::vector<gid_t>> groups_of;
};
thread_local Answers recent;

}  // namespace

std::optional<Account> AccountByName(const std::string& name) {
  // The C library would read but its beginning.
  if (name.find('\0') != std::string::npos) {
    errno = 0;
    return std::nullopt;
  }
  return recent.by_name.Get(name, [&] { return LookUpName(name); });
}

std::optional<Account> AccountByUID(uid_t uid) {
  return recent.by_uid.Get(uid, [&] { return LookUpUID(uid); });
}

std::optional<gid_t> GroupByName(const std::string& name) {
  return recent.groups.Get(name, [&] { return LookUpGroup(name); });
}

std::optional<std::vector<gid_t>> GroupsOf(const Account& account) {
  const int before = errno;
  auto groups =
      recent.groups_of.Get({account.name, account.gid}, [&] { return LookUpGroupsOf(account); });
  if (groups) errno = before;
  return groups;
}

bool IsAdministrator(const Account& account) {
  const std::optional<gid_t> administrators = GroupByName(Config::Get().admin_group);
  if (!administrators) return false;
  const std::optional<std::vector<gid_t>> groups = GroupsOf(account);
  return groups && std::find(groups->begin(), groups->end(), *administrators) != groups->end();
}

void ForgetAccounts() {
  recent = Answers();
}

}  // namespace maru
