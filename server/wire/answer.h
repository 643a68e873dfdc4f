#pragma once

#include <json/value.h>

#include <optional>
#include <string>

#include "server/wire/letters.h"

/// The answer to one request, and how it travels from a child or the host to the front.
namespace maru::server {

struct Answer {
  int status = 200;
  /// JSON text.
  std::string body;
  /// Set by signing in (the new session's token) and signing out (empty): what the browser's cookie
  /// is to become.
  std::optional<std::string> cookie;
};

/// {"success": true, "data": …}; "data" is left out when null.
Answer Success(const Json::Value& data);
/// {"success": false, "error": {"code": …, "data": …}} with the HTTP status that belongs to the
/// code; "data" is left out when null.
Answer Failure(int code, const Json::Value& data);
/// The server's own refusal: code 10000 + `status`.
Answer Refusal(int status);

/// The HTTP status of an error code: 400 for 120; 403 for 507; 409 for 1600; 502 for 121; 503 for
/// 605; that of a refusal for its code; otherwise 500.
int HttpStatus(int code);

/// The longest body of an answer.
constexpr std::size_t kMaxAnswer = 64u << 20;

/// Sends the whole answer. False when the other end is gone or, without waiting, when it does not
/// fit the socket's buffer.
bool SendAnswer(int socket, const Answer& answer, Wait wait);

/// What the front makes of the packets of an answer, one by one.
class AnswerReader {
 public:
  /// kHead, kMore: `Chunk` is the next part of the body. Else no (whole) answer will come; kFailed
  /// also when the packet is not what should come now.
  AnswerPart Take(std::string_view packet);

  int Status() const { return status_; }
  const std::optional<std::string>& Cookie() const { return cookie_; }
  /// The size of the whole body.
  std::size_t Size() const { return size_; }
  /// A view into the last packet taken.
  std::string_view Chunk() const { return chunk_; }
  bool HasHead() const { return has_head_; }
  bool IsWhole() const { return has_head_ && taken_ == size_; }

 private:
  bool TakeHead(std::string_view packet);

  bool has_head_ = false;
  int status_ = 0;
  std::size_t size_ = 0;
  std::size_t taken_ = 0;
  std::optional<std::string> cookie_;
  std::string_view chunk_;
};

}  // namespace maru::server
