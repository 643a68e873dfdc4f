#pragma once

#include <sys/types.h>

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "server/wire/letters.h"

/// What the server's processes say to each other. The front asks the host with an Ask and one end
/// of a socket pair; the body of the request (`body_size` bytes) and the answer travel over that
/// pair. The host hands both to a child with a Task.
namespace maru::server {

/// An API method as a request names it.
struct MethodName {
  std::string api;
  unsigned version = 0;
  std::string method;
};

struct Ask {
  AskKind kind = AskKind::kCall;
  /// The session's sealed token, as the client sent it.
  std::string token;
  MethodName name;
  std::size_t body_size = 0;
  /// The client's address; behind a proxy that names none, no address.
  std::string source;
  /// For kSignIn only.
  std::string user, password;
};

std::string Pack(const Ask& ask);
/// Nothing when the packet is malformed.
std::optional<Ask> UnpackAsk(std::string_view packet);

struct Task {
  /// kCall or kWho.
  AskKind kind = AskKind::kCall;
  MethodName name;
  std::size_t body_size = 0;
  std::string session_id;
  uid_t uid = 0;
  std::string user;
  /// The account's when the session began (server/host/user.h).
  std::string stamp;
  /// The client's address.
  std::string source;
  /// PAM is to be asked whether the account is still admitted.
  bool ask_pam = false;
};

std::string Pack(const Task& task);
std::optional<Task> UnpackTask(std::string_view packet);

/// Limits that the front keeps and the others rely on.
constexpr std::size_t kMaxBody = 1u << 20;
constexpr std::size_t kMaxToken = 1024;
constexpr std::size_t kMaxName = 128;
constexpr std::size_t kMaxUser = 256;
constexpr std::size_t kMaxPassword = 1024;

}  // namespace maru::server
