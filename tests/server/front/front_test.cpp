// What the front makes of requests, without a network: routes, heads, pages, metrics.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "server/front/metrics.h"
#include "server/front/pages.h"
#include "server/front/response_head.h"
#include "server/front/routes.h"

namespace maru::server {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

RequestHead Post(std::string_view target) {
  RequestHead head;
  head.method = "POST";
  head.target = target;
  head.host = "files.example:5080";
  head.content_type = "application/json";
  return head;
}

RequestHead Get(std::string_view target) {
  RequestHead head;
  head.method = "GET";
  head.target = target;
  return head;
}

constexpr std::string_view kSearch = "/webapi/MARU.Seeker.Elastic.Search/1/search";

TEST(Routes, CallsAreTakenApart) {
  const Route route = FindRoute(Post(kSearch));
  EXPECT_EQ(route.kind, RouteKind::kCall);
  EXPECT_EQ(route.name.api, "MARU.Seeker.Elastic.Search");
  EXPECT_EQ(route.name.version, 1u);
  EXPECT_EQ(route.name.method, "search");
  for (const std::string_view bad :
       {"/webapi/", "/webapi/A", "/webapi/A/1", "/webapi/A/1/", "/webapi//1/m", "/webapi/A/x/m",
        "/webapi/A/-1/m", "/webapi/A/1/m/more", "/webapi/A/1/m%41", "/webapi/A/99999999999/m"})
    EXPECT_EQ(FindRoute(Post(bad)).refusal, 404) << bad;
  EXPECT_EQ(FindRoute(Post("/webapi/" + std::string(kMaxName + 1, 'a') + "/1/m")).refusal, 404);
}

TEST(Routes, EveryPathHasItsMethods) {
  EXPECT_EQ(FindRoute(Get("/session")).kind, RouteKind::kWho);
  EXPECT_EQ(FindRoute(Post("/session")).kind, RouteKind::kSignIn);
  EXPECT_EQ(FindRoute(Get("/healthz?verbose")).kind, RouteKind::kHealth);
  EXPECT_EQ(FindRoute(Get("/metrics")).kind, RouteKind::kMetrics);
  EXPECT_EQ(FindRoute(Get("/openapi.json")).kind, RouteKind::kOpenApi);
  const Route page = FindRoute(Get("/app.js?v=2"));
  EXPECT_EQ(page.kind, RouteKind::kPage);
  EXPECT_EQ(page.path, "/app.js");
  EXPECT_EQ(FindRoute(Get(kSearch)).refusal, 405);
  EXPECT_EQ(FindRoute(Get(kSearch)).allow, "POST");
  EXPECT_EQ(FindRoute(Post("/healthz")).refusal, 405);
  RequestHead put = Post("/session");
  put.method = "PUT";
  EXPECT_EQ(FindRoute(put).refusal, 405);
  EXPECT_EQ(FindRoute(Get("http://elsewhere/")).refusal, 400);
  EXPECT_EQ(FindRoute(Get("*")).refusal, 400);
}

TEST(Routes, TheTokenComesFromTheHeaderOrTheCookie) {
  RequestHead head = Post(kSearch);
  head.cookie = "a=b; maruseeker_session=from-cookie; maruseeker_session2=x";
  EXPECT_EQ(FindRoute(head).token, "from-cookie");
  head.authorization = "bearer  from-header";
  EXPECT_EQ(FindRoute(head).token, "from-header");
  head.authorization = "Basic YTpi";
  EXPECT_EQ(FindRoute(head).token, "from-cookie");
  head.authorization = {};
  const std::string long_cookie = "maruseeker_session=" + std::string(kMaxToken + 1, 'x');
  head.cookie = long_cookie;
  EXPECT_EQ(FindRoute(head).token, "");
}

TEST(Routes, OtherSitesPagesAreRefused) {
  RequestHead head = Post(kSearch);
  head.cookie = "maruseeker_session=t";
  const auto refusal = [&](std::string_view fetch_site, std::string_view origin) {
    head.fetch_site = fetch_site;
    head.origin = origin;
    return FindRoute(head).refusal;
  };
  EXPECT_EQ(refusal("", ""), 0) << "no browser";
  EXPECT_EQ(refusal("same-origin", ""), 0);
  EXPECT_EQ(refusal("none", ""), 0);
  EXPECT_EQ(refusal("same-site", "https://files.example:5080"), 403);
  EXPECT_EQ(refusal("cross-site", ""), 403);
  EXPECT_EQ(refusal("", "https://FILES.example:5080"), 0);
  EXPECT_EQ(refusal("", "https://files.example"), 403);
  EXPECT_EQ(refusal("", "https://evil.example"), 403);
  EXPECT_EQ(refusal("", "null"), 403);
  head.authorization = "Bearer t";
  EXPECT_EQ(refusal("", "https://evil.example"), 0) << "no browser adds this header by itself";

  RequestHead sign_out = Post("/session");
  sign_out.method = "DELETE";
  sign_out.fetch_site = "cross-site";
  EXPECT_EQ(FindRoute(sign_out).refusal, 403);
  sign_out.method = "POST";
  EXPECT_EQ(FindRoute(sign_out).refusal, 403) << "nobody is to be signed in as somebody else";
  RequestHead page = Get("/");
  page.fetch_site = "cross-site";
  EXPECT_EQ(FindRoute(page).refusal, 0) << "links from elsewhere may lead here";
}

TEST(Routes, BodiesAreJson) {
  RequestHead head = Post(kSearch);
  for (const std::string_view good : {"application/json", "Application/JSON ; charset=utf-8"}) {
    head.content_type = good;
    EXPECT_EQ(FindRoute(head).refusal, 0) << good;
  }
  for (const std::string_view bad :
       {"", "text/plain", "application/json-patch", "x;application/json"}) {
    head.content_type = bad;
    EXPECT_EQ(FindRoute(head).refusal, 415) << bad;
  }
}

TEST(ResponseHead, CookiesAndCaching) {
  ResponseHead head;
  head.cookie = "token";
  EXPECT_THAT(ToText(head), HasSubstr("\r\nSet-Cookie: maruseeker_session=token; Path=/; HttpOnly; "
                                      "SameSite=Strict\r\n"));
  EXPECT_THAT(ToText(head), HasSubstr("\r\nCache-Control: no-store\r\n"));
  head.secure_cookie = true;
  head.cookie = "";
  EXPECT_THAT(ToText(head), HasSubstr("SameSite=Strict; Secure; Max-Age=0\r\n"));
  ResponseHead known;
  known.status = 304;
  known.etag = "\"tag\"";
  EXPECT_THAT(ToText(known), HasSubstr("\r\nETag: \"tag\"\r\n"));
  EXPECT_THAT(ToText(known), Not(HasSubstr("Content-Length")));
  EXPECT_THAT(ToText(known), HasSubstr("\r\n\r\n"));
}

TEST(Pages, HoldRegularFilesOnly) {
  char folder[] = "/tmp/pages-XXXXXX";
  ASSERT_TRUE(mkdtemp(folder));
  const std::filesystem::path root = folder;
  std::filesystem::create_directories(root / "img");
  std::ofstream(root / "index.html") << "<!doctype html>";
  std::ofstream(root / "img" / "a.svg") << "<svg/>";
  std::ofstream(root / ".secret") << "x";
  std::filesystem::create_symlink("/etc/passwd", root / "passwd");
  std::filesystem::resize_file(root / "index.html", 3);
  std::ofstream(root / "big.js").put('x');
  std::filesystem::resize_file(root / "big.js", Pages::kMaxFile + 1);
  const Pages pages = Pages::Load(folder);
  std::filesystem::remove_all(root);

  ASSERT_TRUE(pages.Find("/"));
  EXPECT_EQ(pages.Find("/"), pages.Find("/index.html"));
  EXPECT_EQ(pages.Find("/")->type, "text/html; charset=utf-8");
  ASSERT_TRUE(pages.Find("/img/a.svg"));
  EXPECT_EQ(pages.Find("/img/a.svg")->type, "image/svg+xml");
  EXPECT_NE(pages.Find("/img/a.svg")->etag, pages.Find("/")->etag);
  for (const char* none : {"", "/img", "/img/", "/.secret", "/passwd", "/big.js", "/../etc/passwd",
                           "//index.html", "/img/../index.html"})
    EXPECT_FALSE(pages.Find(none)) << none;
  EXPECT_FALSE(Pages::Load("/nonexistent").Find("/"));
}

TEST(Metrics, CountsAndStaysBounded) {
  Metrics metrics;
  for (std::size_t i = 0; i < Metrics::kMaxMethods + 100; ++i)
    metrics.Count("m" + std::to_string(i), 200, 0.02);
  metrics.Count("m0", 500, 3);
  const std::string text = metrics.Text(7, Json::Value());
  EXPECT_THAT(text, HasSubstr("maruweb_requests_total{method=\"other\",status=\"200\"} 100\n"));
  EXPECT_THAT(text, HasSubstr("maruweb_request_seconds_bucket{method=\"m0\",le=\"0.01\"} 0\n"));
  EXPECT_THAT(text, HasSubstr("maruweb_request_seconds_bucket{method=\"m0\",le=\"0.025\"} 1\n"));
  EXPECT_THAT(text, HasSubstr("maruweb_request_seconds_bucket{method=\"m0\",le=\"+Inf\"} 2\n"));
  EXPECT_THAT(text, HasSubstr("maruweb_connections 7\n"));
}

}  // namespace
}  // namespace maru::server
