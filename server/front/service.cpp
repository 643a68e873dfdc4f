#include "server/front/service.h"

#include <arpa/inet.h>

#include <algorithm>
#include <utility>

#include "common/error.h"
#include "server/front/openapi.h"
#include "system/json.h"
#include "system/text.h"

namespace maru::server {
namespace {

/// For the host's numbers, which it gives at once or not at all.
constexpr std::chrono::seconds kNumbersTime{2};

/// What the metrics call a kind of request, and what the host is asked for it.
struct KindRow {
  RouteKind kind;
  const char* label;
  std::optional<AskKind> ask;
};
constexpr KindRow kKinds[] = {
    {RouteKind::kPage, "page", {}},
    {RouteKind::kHealth, "health", AskKind::kStatus},
    {RouteKind::kMetrics, "metrics", AskKind::kStatus},
    {RouteKind::kOpenApi, "openapi", {}},
    {RouteKind::kCall, nullptr, AskKind::kCall},
    {RouteKind::kWho, "session", AskKind::kWho},
    {RouteKind::kSignIn, "sign-in", AskKind::kSignIn},
    {RouteKind::kSignOut, "sign-out", AskKind::kSignOut},
    {RouteKind::kRefused, "refused", {}},
};

const KindRow& RowOf(const Route& route) {
  return *std::find_if(std::begin(kKinds), std::end(kKinds),
                       [&](const KindRow& row) { return row.kind == route.kind; });
}

std::string LabelOf(const Route& route) {
  const char* label = RowOf(route).label;
  return label ? label : route.name.api + "/" + route.name.method;
}

/// The last address of a list: a proxy adds what it sees to what the client claims. Its own address
/// is no client's.
std::string LastAddress(std::string_view list) {
  list.remove_prefix(std::min(list.size(), list.find_last_of(", ") + 1));
  const std::string text(list.substr(0, list.find('%')));
  unsigned char bytes[sizeof(in6_addr)];
  char address[INET6_ADDRSTRLEN];
  for (const int family : {AF_INET, AF_INET6})
    if (inet_pton(family, text.c_str(), bytes) == 1)
      return inet_ntop(family, bytes, address, sizeof(address));
  return "unknown";
}

bool IsText(const std::string& text, std::size_t limit) {
  return !text.empty() && text.size() <= limit && text.find('\0') == std::string::npos;
}

}  // namespace

std::string Service::RefuseUnread(int status) {
  metrics_.Count("refused", status, 0);
  const std::string body = Refusal(status).body;
  ResponseHead head;
  head.status = status;
  head.size = body.size();
  head.keep_alive = false;
  return ToText(head) + body;
}

Transaction::Transaction(Service& service, const RequestHead& head, std::string peer,
                         bool keep_alive)
    : service_(service),
      head_(head),
      route_(FindRoute(head)),
      peer_(std::move(peer)),
      expects_(SameWord(head.expect, "100-continue")),
      keep_alive_(keep_alive && WantsBody()),
      head_only_(head.method == "HEAD") {}

void Transaction::Begin(const std::string& body) {
  start_ = std::chrono::steady_clock::now();
  switch (route_.kind) {
    case RouteKind::kPage:
      return RespondPage();
    case RouteKind::kOpenApi:
      return Respond({}, OpenApiText());
    case RouteKind::kRefused:
      return Respond(Refusal(route_.refusal));
    case RouteKind::kSignIn:
      return SignIn(body);
    case RouteKind::kCall:
      return AskHost(MakeAsk(), body);
    default:
      return AskHost(MakeAsk(), {});
  }
}

bool Transaction::AsksNumbers() const {
  return RowOf(route_).ask == AskKind::kStatus;
}

std::optional<std::chrono::seconds> Transaction::Patience() const {
  return AsksNumbers() ? std::optional(kNumbersTime) : std::nullopt;
}

Ask Transaction::MakeAsk() const {
  std::string source = service_.config_.behind_proxy ? LastAddress(head_.forwarded_for) : peer_;
  return {*RowOf(route_).ask, route_.token, route_.name, 0, std::move(source), {}, {}};
}

void Transaction::AskHost(Ask ask, std::string_view body) {
  asks_ = exchange_.Begin(service_.host_.Get(), std::move(ask), body);
  if (!asks_) Respond(Refusal(503));
}

/// {"user": …, "password": …} becomes the question to the host.
void Transaction::SignIn(const std::string& body) {
  Json::Value params;
  const bool good = json::FromString(body, params) && params.isObject();
  Ask ask = MakeAsk();
  ask.user = json::StringMember(params, "user");
  ask.password = json::StringMember(params, "password");
  if (!good || !IsText(ask.user, kMaxUser) || !IsText(ask.password, kMaxPassword))
    return Respond(Refusal(400));
  AskHost(std::move(ask), {});
}

Transaction::Next Transaction::Step(std::string& text) {
  if (asks_ && text_.empty()) {
    AnswerPart part;
    const Exchange::Step step = exchange_.Go(service_.packet_, part);
    if (step == Exchange::Step::kWaitToWrite) return Next::kWaitToWrite;
    if (step == Exchange::Step::kWaitToRead) return Next::kWaitToRead;
    Take(part);
  }
  if (cut_off_) return Next::kCutOff;
  if (text_.empty()) return asks_ ? Next::kWaitToRead : Next::kDone;
  text.swap(text_);
  text_.clear();
  return Next::kWrite;
}

void Transaction::Take(AnswerPart part) {
  const AnswerReader& reader = exchange_.Reader();
  const bool good = part == AnswerPart::kHead || part == AnswerPart::kMore;
  asks_ = good && !reader.IsWhole() && !head_only_ && !AsksNumbers();
  if (part == AnswerPart::kMore) {
    text_ = reader.Chunk();
  } else if (good) {
    TakeHead();
  } else if (reader.HasHead()) {
    cut_off_ = true;
  } else {
    const bool killed = part == AnswerPart::kKilled;
    const int code = killed ? maruseeker::kErrorOutdated : maruseeker::kErrorUnknown;
    Respond(Failure(code, Json::Value()));
  }
}

void Transaction::TakeHead() {
  const AnswerReader& reader = exchange_.Reader();
  if (AsksNumbers()) {
    Json::Value answer;
    json::FromString(std::string(reader.Chunk()), answer);
    return RespondNumbers(json::Member(answer, "data"));
  }
  ResponseHead head;
  head.status = reader.Status();
  head.size = reader.Size();
  head.cookie = reader.Cookie();
  head.secure_cookie = service_.config_.behind_proxy || !service_.config_.tls_certificate.empty();
  // Names that are no method's must not fill the metrics.
  const bool unknown = head.status == 404 || head.status == 401;
  text_ = HeadText(head, unknown ? "refused" : LabelOf(route_));
  if (!head_only_) text_ += reader.Chunk();
}

void Transaction::RespondPage() {
  const Page* page = service_.pages_.Find(route_.path);
  if (!page) return Respond(Refusal(404));
  ResponseHead head;
  head.type = page->type;
  head.etag = page->etag;
  const bool known = head_.if_none_match == page->etag;
  if (known) head.status = 304;
  Respond(head, known ? std::string_view() : page->body);
}

/// What /healthz and /metrics say; `numbers` are the host's, or null when it has none to give.
void Transaction::RespondNumbers(const Json::Value& numbers) {
  ResponseHead head;
  if (route_.kind == RouteKind::kMetrics) {
    head.type = "text/plain; version=0.0.4";
    return Respond(head, service_.metrics_.Text(service_.connections, numbers));
  }
  Json::Value health;
  health["status"] = numbers.isNull() ? "the host does not answer" : "ok";
  head.status = numbers.isNull() ? 503 : 200;
  Respond(head, json::ToString(health));
}

/// An answer of the front's own; where the host's numbers are asked for there are just none.
void Transaction::Respond(const Answer& answer) {
  if (AsksNumbers()) return RespondNumbers(Json::Value());
  ResponseHead head;
  head.status = answer.status;
  head.allow = route_.allow;
  Respond(head, answer.body);
}

void Transaction::Respond(ResponseHead head, std::string_view body) {
  head.size = body.size();
  text_ = HeadText(head, LabelOf(route_));
  if (!head_only_) text_ += body;
}

std::string Transaction::HeadText(ResponseHead head, const std::string& label) {
  const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start_;
  service_.metrics_.Count(label, head.status, taken.count());
  head.keep_alive = keep_alive_;
  return ToText(head);
}

}  // namespace maru::server
