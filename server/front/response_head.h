#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace maru::server {

/// What the head of a response says, besides the headers that every response has: those that keep
/// the page and its answers to themselves, and the date.
struct ResponseHead {
  int status = 200;
  std::string_view type = "application/json";
  /// Of the body that the request's GET would have.
  std::size_t size = 0;
  bool keep_alive = true;
  /// Empty: the response may not be stored. Else a quoted tag: stored, but asked about every time.
  std::string_view etag;
  /// With status 405.
  std::string_view allow;
  /// The session cookie's new value, empty to forget it; sent only to this site over TLS when
  /// `secure_cookie`.
  std::optional<std::string> cookie;
  bool secure_cookie = false;
};

/// The head as it goes over the wire, the empty line included.
std::string ToText(const ResponseHead& head);

}  // namespace maru::server
