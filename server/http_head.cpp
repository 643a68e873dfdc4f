#include "server/http_head.h"

#include <time.h>

#include "server/routes.h"

namespace maru::server {
namespace {

constexpr std::string_view kForAll =
    "Content-Security-Policy: default-src 'none'; script-src 'self'; style-src 'self'; "
    "img-src 'self' data:; font-src 'self'; connect-src 'self'; manifest-src 'self'; "
    "base-uri 'none'; form-action 'none'; frame-ancestors 'none'\r\n"
    "X-Content-Type-Options: nosniff\r\n"
    "X-Frame-Options: DENY\r\n"
    "Referrer-Policy: no-referrer\r\n"
    "Cross-Origin-Opener-Policy: same-origin\r\n"
    "Cross-Origin-Resource-Policy: same-origin\r\n";

std::string_view ReasonOf(int status) {
  switch (status) {
    case 200:
      return "OK";
    case 304:
      return "Not Modified";
    case 400:
      return "Bad Request";
    case 401:
      return "Unauthorized";
    case 403:
      return "Forbidden";
    case 404:
      return "Not Found";
    case 405:
      return "Method Not Allowed";
    case 409:
      return "Conflict";
    case 413:
      return "Content Too Large";
    case 415:
      return "Unsupported Media Type";
    case 429:
      return "Too Many Requests";
    case 431:
      return "Request Header Fields Too Large";
    case 500:
      return "Internal Server Error";
    case 502:
      return "Bad Gateway";
    case 503:
      return "Service Unavailable";
    default:
      return "Unknown";
  }
}

std::string Date() {
  const time_t now = time(nullptr);
  tm parts{};
  gmtime_r(&now, &parts);
  char text[64];
  return {text, strftime(text, sizeof(text), "%a, %d %b %Y %H:%M:%S GMT", &parts)};
}

std::string Cookie(const std::string& value, bool secure) {
  std::string text = "Set-Cookie: " + std::string(kCookieName) + "=" + value +
                     "; Path=/; HttpOnly; SameSite=Strict";
  if (secure) text += "; Secure";
  if (value.empty()) text += "; Max-Age=0";
  return text + "\r\n";
}

}  // namespace

std::string ToText(const ResponseHead& head) {
  std::string text = "HTTP/1.1 " + std::to_string(head.status) + " ";
  const auto add = [&](std::string_view name, std::string_view value) {
    text.append(name).append(": ").append(value).append("\r\n");
  };
  text.append(ReasonOf(head.status)).append("\r\n");
  add("Date", Date());
  add("Connection", head.keep_alive ? "keep-alive" : "close");
  if (head.status != 304) {
    add("Content-Type", head.type);
    add("Content-Length", std::to_string(head.size));
  }
  if (head.etag.empty()) {
    add("Cache-Control", "no-store");
  } else {
    add("Cache-Control", "no-cache");
    add("ETag", head.etag);
  }
  if (!head.allow.empty()) add("Allow", head.allow);
  if (head.status == 401) add("WWW-Authenticate", "Bearer");
  if (head.status == 429 || head.status == 503) add("Retry-After", "5");
  if (head.cookie) text += Cookie(*head.cookie, head.secure_cookie);
  return text.append(kForAll).append("\r\n");
}

}  // namespace maru::server
