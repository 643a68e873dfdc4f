#include "system/accounts.h"

#include <errno.h>
#include <grp.h>
#include <pwd.h>

#include <algorithm>
#include <chrono>
#include <map>
#include <mutex>
#include <type_traits>
#include <utility>

#include "system/config.h"

namespace maru {
namespace {

// A group of many thousand members fits in far less.
constexpr std::size_t kMaxBuffer = 16u << 20;
constexpr int kMaxGroups = 65'536;  // the kernel's own limit

/// Asks a function of the C library with a growing buffer until it no longer answers ERANGE, and
/// gives the entry to `take`. errno is what it answered.
template <class Key, class Entry, class Take>
auto LookUp(int (*function)(Key, Entry*, char*, std::size_t, Entry**),
            std::type_identity_t<Key> key, Take take)
    -> std::optional<decltype(take(std::declval<Entry>()))> {
  std::vector<char> buffer;
  Entry entry;
  Entry* found = nullptr;
  int error = ERANGE;
  for (std::size_t size = 1024; error == ERANGE && size <= kMaxBuffer; size *= 4) {
    buffer.resize(size);
    do {
      error = function(key, &entry, buffer.data(), size, &found);
    } while (error == EINTR);
  }
  // Some sources of the name service say so when there is no such entry.
  errno = error == ENOENT || error == ESRCH ? 0 : error;
  if (error != 0 || !found) return std::nullopt;
  return take(*found);
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

Account ToAccount(const passwd& entry) {
  return {entry.pw_name, entry.pw_uid, entry.pw_gid, entry.pw_dir ? entry.pw_dir : ""};
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
  return recent.by_name.Get(name, [&] { return LookUp(getpwnam_r, name.c_str(), ToAccount); });
}

std::optional<Account> AccountByUID(uid_t uid) {
  return recent.by_uid.Get(uid, [&] { return LookUp(getpwuid_r, uid, ToAccount); });
}

std::vector<Account> AllAccounts() {
  static std::mutex mutex;  // the C library keeps one place in the list for all threads
  const std::lock_guard lock(mutex);
  std::vector<Account> accounts;
  setpwent();
  while (const passwd* entry = getpwent()) accounts.push_back(ToAccount(*entry));
  endpwent();
  return accounts;
}

std::optional<gid_t> GroupByName(const std::string& name) {
  return recent.groups.Get(name, [&] {
    return LookUp(getgrnam_r, name.c_str(), [](const group& entry) { return entry.gr_gid; });
  });
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
