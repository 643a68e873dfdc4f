#pragma once

#include <sys/types.h>

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>

#include "server/host/clock.h"
#include "server/host/user.h"

/// Who is signed in. Times are those of the host's clock.
namespace maru::server {

/// What a token says about its session.
struct Claims {
  std::string session_id;
  std::string user;
  uid_t uid = 0;
  /// No use after this time, whatever the table says.
  Seconds expires = 0;
};

/// Makes and opens session tokens: sealed, so that nobody else can read, change or make one. The
/// key lives as long as the process; forked children do not have it.
class TokenSeal {
 public:
  /// Throws std::runtime_error.
  TokenSeal();

  /// URL-safe text of at most kMaxToken bytes.
  std::string Seal(const Claims& claims) const;
  /// Nothing for a text that this object did not seal.
  std::optional<Claims> Open(std::string_view token) const;

 private:
  struct Unmap {
    void operator()(unsigned char* key) const;
  };
  std::unique_ptr<unsigned char, Unmap> key_;
};

struct Session {
  std::string id;
  std::string user;
  uid_t uid = 0;
  /// The user's when the session began.
  std::string stamp;
  Seconds expires = 0;
  Seconds last_used = 0;
  /// When PAM last admitted the account.
  Seconds admitted = 0;
  /// Request children at work for it.
  unsigned running = 0;
};

/// The sessions. One thread.
class SessionTable {
 public:
  /// A session ends `idle_limit` after its last use, and in any case kLifetime (or `idle_limit`,
  /// when that is longer) after it began.
  explicit SessionTable(Seconds idle_limit) : idle_limit_(idle_limit) {}

  /// Begins a session. The user's session that was unused longest makes room beyond kMaxPerUser,
  /// and so does anybody's beyond kMaxTotal.
  const Session& Begin(const User& user, Seconds now);
  /// The session, marked as used now; null when it has ended.
  Session* Use(const Claims& claims, Seconds now);
  /// Null when it has ended.
  Session* Find(const std::string& id);
  void End(const std::string& id) { sessions_.erase(id); }
  /// Forgets what has expired; to be called now and then.
  void Expire(Seconds now);
  std::size_t Count() const { return sessions_.size(); }

  static constexpr Seconds kLifetime = 7 * 24 * 3600;
  static constexpr std::size_t kMaxPerUser = 100;
  static constexpr std::size_t kMaxTotal = 5'000;

 private:
  bool IsOver(const Session& session, Seconds now) const;
  void MakeRoom(const std::string& user);

  Seconds idle_limit_;
  std::unordered_map<std::string, Session> sessions_;
};

}  // namespace maru::server
