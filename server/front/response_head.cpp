#include "server/front/response_head.h"

#include <time.h>

#include <utility>

#include "server/front/routes.h"

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

constexpr std::pair<int, std::string_view> kReasons[] = {
    {200, "OK"},
    {304, "Not Modified"},
    {400, "Bad Request"},
    {401, "Unauthorized"},
    {403, "Forbidden"},
    {404, "Not Found"},
    {405, "Method Not Allowed"},
    {409, "Conflict"},
    {413, "Content Too Large"},
    {415, "Unsupported Media Type"},
    {429, "Too Many Requests"},
    {431, "Request Header Fields Too Large"},
    {500, "Internal Server Error"},
    {502, "Bad Gateway"},
    {503, "Service Unavailable"},
};

std::string_view ReasonOf(int status) {
  for (const auto& [known, reason] : kReasons)
    if (known == status) return reason;
  return "Unknown";
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
