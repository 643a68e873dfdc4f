#include "server/host/signin_limits.h"

#include <array>
#include <utility>

namespace maru::server {
namespace {

struct Key {
  std::string text;
  unsigned limit;
};

// Neither an address nor a user name holds a zero byte, so that the three kinds cannot meet.
std::array<Key, 3> KeysOf(const std::string& user, const std::string& address) {
  const std::string border(1, '\0');
  return {Key{user + border + address, SignInLimits::kMaxPair},
          Key{border + address, SignInLimits::kMaxAddress},
          Key{user + border, SignInLimits::kMaxUser}};
}

}  // namespace

bool SignInLimits::Admit(const std::string& user, const std::string& address, Seconds now) {
  if (now >= next_forget_) Forget(now);
  if (counters_.size() + 3 > kMaxCounters) return false;
  const auto keys = KeysOf(user, address);
  for (const auto& [text, limit] : keys) {
    const auto found = counters_.find(text);
    if (found == counters_.end()) continue;
    Counter& counter = found->second;
    if (now - counter.since >= kWindow) counter = {now, 0};
    if (counter.failed >= limit) return false;
  }
  for (const Key& key : keys)
    ++counters_.try_emplace(key.text, Counter{now, 0}).first->second.failed;
  return true;
}

void SignInLimits::Succeeded(const std::string& user, const std::string& address) {
  for (const auto& [text, limit] : KeysOf(user, address)) {
    const auto found = counters_.find(text);
    if (found != counters_.end() && found->second.failed > 0) --found->second.failed;
  }
}

void SignInLimits::Forget(Seconds now) {
  next_forget_ = now + kWindow / 10;
  std::erase_if(counters_, [&](const auto& entry) { return now - entry.second.since >= kWindow; });
}

}  // namespace maru::server
