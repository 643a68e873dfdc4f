#pragma once

#include <string>
#include <string_view>

#include "server/wire/messages.h"

/// What a request asks for, told from its head alone.
namespace maru::server {

/// The parts of a request's head that matter. Views into the request; empty when absent.
struct RequestHead {
  std::string_view method;
  std::string_view target;
  std::string_view host;
  std::string_view origin;
  std::string_view fetch_site;
  std::string_view cookie;
  std::string_view authorization;
  std::string_view content_type;
  std::string_view expect;
  std::string_view if_none_match;
  /// The last line of X-Forwarded-For.
  std::string_view forwarded_for;
};

enum class RouteKind {
  kPage,
  kHealth,
  kMetrics,
  kOpenApi,
  kCall,
  kWho,
  kSignIn,
  kSignOut,
  kRefused,
};

struct Route {
  RouteKind kind = RouteKind::kRefused;
  /// The HTTP status of kRefused: 400 malformed; 403 a page of another site is behind the request;
  /// 404; 405; 415.
  int refusal = 0;
  /// With 405: the methods there are.
  std::string_view allow;
  /// The path of kPage.
  std::string path;
  MethodName name;
  /// The session's token, from "Authorization: Bearer" or else the cookie.
  std::string token;
};

/// Never throws. What changes something must come with "Content-Type: application/json" when it has
/// a body and, unless it carries a bearer token, must not come from another site's page
/// (Sec-Fetch-Site, or else Origin compared with Host).
Route FindRoute(const RequestHead& head);

inline constexpr std::string_view kCookieName = "maruseeker_session";

}  // namespace maru::server
