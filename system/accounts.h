#pragma once

#include <sys/types.h>

#include <chrono>
#include <optional>
#include <string>
#include <vector>

/// Accounts and groups of the name service (NSS), without its buffers. An empty
/// answer leaves errno 0 when there is no such account, else what went wrong. What was found stands
/// for kNameServiceAge.
namespace maru {

inline constexpr std::chrono::seconds kNameServiceAge{1};

/// The account that owns the index and the history, and runs the search daemon and the indexer.
inline constexpr const char* kServiceAccount = "MaruSeeker";

struct Account {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;
  std::string home;
};

std::optional<Account> AccountByName(const std::string& name);
std::optional<Account> AccountByUID(uid_t uid);
/// Those that the name service lists; some sources list none.
std::vector<Account> AllAccounts();
std::optional<gid_t> GroupByName(const std::string& name);

/// The account's groups, the primary one first, each once.
std::optional<std::vector<gid_t>> GroupsOf(const Account& account);

/// Whether the account is a member of the administrators' group (setting `admin_group`), by its
/// primary group or another. False with errno, where it cannot be told, or 0.
bool IsAdministrator(const Account& account);

/// Everything this thread has found is asked for anew.
void ForgetAccounts();

}  // namespace maru
