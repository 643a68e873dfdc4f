#include "server/front/routes.h"

#include <algorithm>
#include <optional>
#include <utility>

#include "server/wire/fields.h"
#include "system/text.h"

namespace maru::server {
namespace {

constexpr std::string_view kCallPrefix = "/webapi/";
constexpr std::size_t kMaxPath = 1024;
/// What can be read besides the page's files.
constexpr std::pair<std::string_view, RouteKind> kNoPages[] = {
    {"/healthz", RouteKind::kHealth},
    {"/metrics", RouteKind::kMetrics},
    {"/openapi.json", RouteKind::kOpenApi},
};

/// Takes what stands before `border` (or everything) off the front of `text`.
std::string_view TakeUpTo(std::string_view& text, char border) {
  const std::size_t at = text.find(border);
  const std::string_view part = text.substr(0, at);
  text.remove_prefix(at == std::string_view::npos ? text.size() : at + 1);
  return part;
}

bool IsJson(std::string_view content_type) {
  return SameWord(Trimmed(TakeUpTo(content_type, ';')), "application/json");
}

std::optional<std::string_view> BearerToken(const RequestHead& head) {
  std::string_view rest = head.authorization;
  if (!SameWord(TakeUpTo(rest, ' '), "Bearer")) return std::nullopt;
  return Trimmed(rest);
}

std::string_view CookieToken(std::string_view cookies) {
  while (!cookies.empty()) {
    std::string_view value = Trimmed(TakeUpTo(cookies, ';'));
    if (TakeUpTo(value, '=') == kCookieName) return value;
  }
  return {};
}

bool IsFromOtherSite(const RequestHead& head) {
  if (!head.fetch_site.empty())
    return head.fetch_site != "same-origin" && head.fetch_site != "none";
  if (head.origin.empty()) return false;
  const std::size_t scheme = head.origin.find("://");
  return scheme == std::string_view::npos || !SameWord(head.origin.substr(scheme + 3), head.host);
}

Route Refused(int status, std::string_view allow = {}) {
  Route route;
  route.refusal = status;
  route.allow = allow;
  return route;
}

/// /webapi/<API name>/<version>/<method>
bool ParseCall(std::string_view path, MethodName& name) {
  path.remove_prefix(kCallPrefix.size());
  const std::string_view api = TakeUpTo(path, '/');
  const auto version = ParseNumber(TakeUpTo(path, '/'), 1'000'000);
  const auto is_good = [](std::string_view word) {
    return !word.empty() && word.size() <= kMaxName &&
           std::all_of(word.begin(), word.end(), [](char c) {
             return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
                    c == '.' || c == '_' || c == '-';
           });
  };
  if (!version || !is_good(api) || !is_good(path)) return false;
  name = {std::string(api), static_cast<unsigned>(*version), std::string(path)};
  return true;
}

Route SessionRoute(std::string_view method) {
  Route route;
  if (method == "GET" || method == "HEAD")
    route.kind = RouteKind::kWho;
  else if (method == "POST")
    route.kind = RouteKind::kSignIn;
  else if (method == "DELETE")
    route.kind = RouteKind::kSignOut;
  else
    return Refused(405, "GET, HEAD, POST, DELETE");
  return route;
}

Route ReadRoute(std::string_view path) {
  Route route;
  route.kind = RouteKind::kPage;
  route.path = path;
  for (const auto& [known, kind] : kNoPages)
    if (path == known) route.kind = kind;
  return route;
}

Route RouteOfPath(std::string_view method, std::string_view path) {
  if (path.empty() || path.front() != '/' || path.size() > kMaxPath) return Refused(400);
  if (path == "/session") return SessionRoute(method);
  if (path.starts_with(kCallPrefix)) {
    if (method != "POST") return Refused(405, "POST");
    Route route;
    route.kind = RouteKind::kCall;
    return ParseCall(path, route.name) ? route : Refused(404);
  }
  return method == "GET" || method == "HEAD" ? ReadRoute(path) : Refused(405, "GET, HEAD");
}

}  // namespace

Route FindRoute(const RequestHead& head) {
  std::string_view rest = head.target;
  Route route = RouteOfPath(head.method, TakeUpTo(rest, '?'));
  const auto bearer = BearerToken(head);
  route.token = bearer ? *bearer : CookieToken(head.cookie);
  if (route.token.size() > kMaxToken) route.token.clear();
  const bool changes = route.kind == RouteKind::kCall || route.kind == RouteKind::kSignIn ||
                       route.kind == RouteKind::kSignOut;
  if (changes && !bearer && IsFromOtherSite(head)) return Refused(403);
  if (head.method == "POST" && changes && !IsJson(head.content_type)) return Refused(415);
  return route;
}

}  // namespace maru::server
