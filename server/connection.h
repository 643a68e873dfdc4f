#pragma once

#include <netinet/tcp.h>
#include <poll.h>
#include <unistd.h>

// The library's own header forgets it.
#include <utility>

#include <boost/asio/awaitable.hpp>
#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/posix/stream_descriptor.hpp>
#include <boost/asio/redirect_error.hpp>
#include <boost/asio/ssl/context.hpp>
#include <boost/asio/steady_timer.hpp>
#include <boost/asio/use_awaitable.hpp>
#include <boost/asio/write.hpp>
#include <boost/beast/core.hpp>
#include <boost/beast/http.hpp>
#include <boost/beast/ssl.hpp>
#include <chrono>
#include <list>
#include <memory>
#include <optional>
#include <string>

#include "common/error.h"
#include "server/answer.h"
#include "server/exchange.h"
#include "server/http_head.h"
#include "server/metrics.h"
#include "server/openapi.h"
#include "server/pages.h"
#include "server/routes.h"
#include "system/config.h"
#include "system/json.h"

/// One client's connection: requests one after another, each answered before the next is read. For
/// front.cpp only, since it is slow to compile.
namespace maru::server {

namespace asio = boost::asio;
namespace beast = boost::beast;
namespace http = beast::http;
using asio::ip::tcp;
using boost::system::error_code;
using Clock = std::chrono::steady_clock;
using PlainStream = beast::tcp_stream;
using TlsStream = beast::ssl_stream<beast::tcp_stream>;
template <class T>
using Awaitable = asio::awaitable<T>;

constexpr std::uint32_t kMaxHead = 16u << 10;
/// From the first moment a request may come to its head's last byte; so also how long a connection
/// may idle.
constexpr std::chrono::seconds kHeadTime{30};
constexpr std::chrono::seconds kBodyTime{30};
/// For each part of an answer.
constexpr std::chrono::seconds kWriteTime{30};
/// For a client to take a refusal that it gets before it has sent everything.
constexpr std::chrono::seconds kLingerTime{2};
/// How often a client that has sent ahead is looked at, whether it is still there.
constexpr std::chrono::milliseconds kLookAgain{250};
constexpr std::chrono::seconds kStatusTime{2};

// What is awaited here takes named objects and references only: the compiler has been seen to copy
// temporaries within such an expression byte by byte.

inline auto Into(error_code& error) {
  return asio::redirect_error(asio::use_awaitable, error);
}

/// A connection as the front keeps it.
class AnyConnection {
 public:
  virtual ~AnyConnection() = default;
  virtual void Close() = 0;
};

/// What all connections share.
struct Front {
  Front(const Config& configuration, Descriptor host)
      : config(configuration), control(std::move(host)) {}

  bool SecureCookies() const { return !config.tls_certificate.empty() || config.behind_proxy; }

  const Config& config;
  Descriptor control;
  std::optional<asio::ssl::context> tls;
  Pages pages;
  Metrics metrics;
  Packet packet;
  std::size_t connections = 0;
  /// Those without a request under way, the one that waits longest first.
  std::list<AnyConnection*> waiting;
  bool stopping = false;
  /// Last, so that it ends first: what still waits in it uses the rest.
  asio::io_context io{1};
};

inline bool IsGone(int socket) {
  pollfd state{socket, POLLRDHUP, 0};
  return poll(&state, 1, 0) > 0;
}

template <class Stream>
class Connection : public AnyConnection, public std::enable_shared_from_this<Connection<Stream>> {
 public:
  template <class... Arguments>
  Connection(Front& front, tcp::socket socket, Arguments&... arguments)
      : front_(front), stream_(std::move(socket), arguments...), look_again_(front.io) {
    ++front_.connections;
    error_code error;
    const auto peer = Tcp().socket().remote_endpoint(error);
    if (!error) peer_ = peer.address().to_string();
    Tcp().socket().set_option(tcp::no_delay(true), error);
  }
  ~Connection() override { --front_.connections; }

  void Close() override { Tcp().close(); }

  Awaitable<void> Run() {
    const auto self = this->shared_from_this();
    error_code error;
    if constexpr (std::is_same_v<Stream, TlsStream>) {
      const Waiting waiting(*this);
      Tcp().expires_after(kHeadTime);
      co_await stream_.async_handshake(asio::ssl::stream_base::server, Into(error));
    }
    while (!error && !front_.stopping) {
      const bool go_on = co_await ServeOne();
      if (!go_on) break;
    }
    Tcp().socket().shutdown(tcp::socket::shutdown_both, error);
    Tcp().close();
  }

 private:
  using Parser = http::request_parser<http::string_body>;

  /// Keeps the connection among those that may be closed when others need room.
  class Waiting {
   public:
    explicit Waiting(Connection& connection)
        : list_(connection.front_.waiting), place_(list_.insert(list_.end(), &connection)) {}
    ~Waiting() { list_.erase(place_); }
    Waiting(const Waiting&) = delete;
    Waiting& operator=(const Waiting&) = delete;

   private:
    std::list<AnyConnection*>& list_;
    std::list<AnyConnection*>::iterator place_;
  };

  PlainStream& Tcp() { return beast::get_lowest_layer(stream_); }

  /// Reads one request and answers it. False when the connection is to be closed.
  Awaitable<bool> ServeOne() {
    Parser parser;
    parser.header_limit(kMaxHead);
    parser.body_limit(kMaxBody);
    error_code error;
    {
      const Waiting waiting(*this);
      Tcp().expires_after(kHeadTime);
      co_await http::async_read_header(stream_, buffer_, parser, Into(error));
    }
    if (error) {
      co_await RefuseUnread(error);
      co_return false;
    }
    const auto& request = parser.get();
    head_only_ = request.method() == http::verb::head;
    keep_alive_ = request.keep_alive() && !front_.stopping;
    const Route route = FindRoute(HeadOf(request));
    const bool expects = beast::iequals(request[http::field::expect], "100-continue");
    if (expects && route.kind == RouteKind::kRefused) keep_alive_ = false;
    if (expects && keep_alive_ && !parser.is_done()) {
      out_ = "HTTP/1.1 100 Continue\r\n\r\n";
      const bool sent = co_await Write();
      if (!sent) co_return false;
    }
    if (!expects || keep_alive_) {
      Tcp().expires_after(kBodyTime);
      co_await http::async_read(stream_, buffer_, parser, Into(error));
      if (error) {
        co_await RefuseUnread(error);
        co_return false;
      }
    }
    start_ = Clock::now();
    const bool written = co_await Serve(route, parser.get());
    if (!parser.is_done()) co_await Linger();
    co_return written&& keep_alive_;
  }

  static std::string_view Text(beast::string_view text) { return {text.data(), text.size()}; }

  static RequestHead HeadOf(const http::request<http::string_body>& request) {
    return {Text(request.method_string()),
            Text(request.target()),
            Text(request[http::field::host]),
            Text(request[http::field::origin]),
            Text(request["Sec-Fetch-Site"]),
            Text(request[http::field::cookie]),
            Text(request[http::field::authorization]),
            Text(request[http::field::content_type])};
  }

  /// The client's address: the connection's, or what the proxy says it is.
  std::string SourceOf(const http::request<http::string_body>& request) const {
    if (!front_.config.behind_proxy) return peer_;
    std::string_view list;
    const auto [first, last] = request.equal_range("X-Forwarded-For");
    for (auto field = first; field != last; ++field) list = Text(field->value());
    list.remove_prefix(std::min(list.size(), list.find_last_of(", ") + 1));
    error_code error;
    const auto address = asio::ip::make_address(std::string(list.substr(0, 64)), error);
    return error ? peer_ : address.to_string();
  }

  Awaitable<bool> Serve(const Route& route, const http::request<http::string_body>& request) {
    Ask ask{AskKind::kCall, route.token, route.name, 0, SourceOf(request), {}, {}};
    switch (route.kind) {
      case RouteKind::kPage:
        return ServePage(route, request);
      case RouteKind::kHealth:
        return ServeHealth();
      case RouteKind::kMetrics:
        return ServeMetrics();
      case RouteKind::kOpenApi:
        Prepare("openapi", {}, OpenApiText());
        return Write();
      case RouteKind::kCall:
        return Forward(route.name.api + "/" + route.name.method, std::move(ask), request.body());
      case RouteKind::kWho:
        ask.kind = AskKind::kWho;
        return Forward("session", std::move(ask), {});
      case RouteKind::kSignIn:
        ask.kind = AskKind::kSignIn;
        return SignIn(std::move(ask), request.body());
      case RouteKind::kSignOut:
        ask.kind = AskKind::kSignOut;
        return Forward("sign-out", std::move(ask), {});
      case RouteKind::kRefused:
        break;
    }
    PrepareRefusal("refused", route.refusal, route.allow);
    return Write();
  }

  Awaitable<bool> ServePage(const Route& route, const http::request<http::string_body>& request) {
    ResponseHead head;
    const Page* page = front_.pages.Find(route.path);
    if (!page) {
      PrepareRefusal("page", 404);
      return Write();
    }
    head.type = page->type;
    head.etag = page->etag;
    const bool known = Text(request[http::field::if_none_match]) == page->etag;
    if (known) head.status = 304;
    Prepare("page", head, known ? std::string_view() : page->body);
    return Write();
  }

  Awaitable<bool> ServeHealth() {
    const Json::Value numbers = co_await HostNumbers();
    ResponseHead head;
    head.status = numbers.isNull() ? 503 : 200;
    Json::Value health;
    health["status"] = numbers.isNull() ? "the host does not answer" : "ok";
    Prepare("health", head, json::ToString(health));
    const bool written = co_await Write();
    co_return written;
  }

  Awaitable<bool> ServeMetrics() {
    const Json::Value numbers = co_await HostNumbers();
    ResponseHead head;
    head.type = "text/plain; version=0.0.4";
    Prepare("metrics", head, front_.metrics.Text(front_.connections, numbers));
    const bool written = co_await Write();
    co_return written;
  }

  /// {"user": …, "password": …} becomes the question to the host.
  Awaitable<bool> SignIn(Ask ask, const std::string& body) {
    Json::Value params;
    const bool good = json::FromString(body, params) && params.isObject();
    ask.user = json::StringMember(params, "user");
    ask.password = json::StringMember(params, "password");
    const auto is_text = [](const std::string& text, std::size_t limit) {
      return !text.empty() && text.size() <= limit && text.find('\0') == std::string::npos;
    };
    if (!good || !is_text(ask.user, kMaxUser) || !is_text(ask.password, kMaxPassword)) {
      PrepareRefusal("sign-in", 400);
      return Write();
    }
    return Forward("sign-in", std::move(ask), {});
  }

  /// Asks the host and passes its answer, or the child's, on to the client, part by part.
  Awaitable<bool> Forward(std::string label, Ask ask, std::string_view body) {
    Exchange exchange;
    if (!exchange.Begin(front_.control.Get(), std::move(ask), body)) {
      PrepareRefusal(label, 503);
      const bool refused = co_await Write();
      co_return refused;
    }
    asio::posix::stream_descriptor socket(front_.io, dup(exchange.Socket()));
    const Watch watch(*this, socket);
    co_await SendBody(exchange, socket);
    AnswerReader::State state = co_await NextPart(exchange, socket);
    const AnswerReader& reader = exchange.Reader();
    if (gone_) co_return false;
    if (reader.HasHead())
      PrepareHead(label, reader);
    else
      PrepareFailure(label, state);
    bool written = co_await Write();
    while (written && reader.HasHead() && !reader.IsWhole() && !head_only_) {
      state = co_await NextPart(exchange, socket);
      if (state != AnswerReader::State::kMore) co_return false;
      written = co_await Write();
    }
    co_return written;
  }

  Awaitable<void> SendBody(Exchange& exchange, asio::posix::stream_descriptor& socket) {
    error_code error;
    while (!error && !gone_ && exchange.SendBody() == Exchange::Step::kWaitToWrite)
      co_await socket.async_wait(asio::posix::stream_descriptor::wait_write, Into(error));
  }

  Awaitable<AnswerReader::State> NextPart(Exchange& exchange,
                                          asio::posix::stream_descriptor& socket) {
    error_code error;
    AnswerReader::State state = AnswerReader::State::kFailed;
    while (!error && !gone_ &&
           exchange.Receive(front_.packet, state) == Exchange::Step::kWaitToRead)
      co_await socket.async_wait(asio::posix::stream_descriptor::wait_read, Into(error));
    // Others may use the shared packet before this part is written.
    out_ = exchange.Reader().Chunk();
    co_return state;
  }

  void PrepareHead(const std::string& label, const AnswerReader& reader) {
    ResponseHead head;
    head.status = reader.Status();
    head.size = reader.Size();
    head.keep_alive = keep_alive_;
    head.cookie = reader.Cookie();
    head.secure_cookie = front_.SecureCookies();
    // Names that are no method's must not fill the metrics.
    Count(head.status == 404 || head.status == 401 ? "refused" : label, head.status);
    out_ = ToText(head) + (head_only_ ? "" : out_);
  }

  void PrepareFailure(const std::string& label, AnswerReader::State state) {
    const Answer answer = Failure(state == AnswerReader::State::kKilled ? maruseeker::kErrorOutdated
                                                                        : maruseeker::kErrorUnknown,
                                  Json::Value());
    ResponseHead head;
    head.status = answer.status;
    Prepare(label, head, answer.body);
  }

  /// The host's numbers, or null when it does not answer in time.
  Awaitable<Json::Value> HostNumbers() {
    Exchange exchange;
    Ask ask;
    ask.kind = AskKind::kStatus;
    Json::Value answer;
    if (!exchange.Begin(front_.control.Get(), ask, {})) co_return answer;
    const auto socket =
        std::make_shared<asio::posix::stream_descriptor>(front_.io, dup(exchange.Socket()));
    asio::steady_timer timer(front_.io, kStatusTime);
    timer.async_wait([late = std::weak_ptr(socket)](error_code error) {
      const auto waiting = late.lock();
      if (!error && waiting) waiting->cancel(error);
    });
    co_await NextPart(exchange, *socket);
    json::FromString(out_, answer);
    co_return json::Member(answer, "data");
  }

  /// While it lives, the client's going away ends the wait for the host.
  class Watch {
   public:
    Watch(Connection& connection, asio::posix::stream_descriptor& socket)
        : connection_(connection) {
      connection_.watched_ = &socket;
      if (!connection_.watching_) connection_.LookAtClient();
    }
    ~Watch() { connection_.watched_ = nullptr; }
    Watch(const Watch&) = delete;
    Watch& operator=(const Watch&) = delete;

   private:
    Connection& connection_;
  };

  void LookAtClient() {
    watching_ = true;
    Tcp().socket().async_wait(tcp::socket::wait_read,
                              [self = this->shared_from_this()](error_code error) {
                                self->watching_ = false;
                                if (error || !self->watched_) return;
                                if (IsGone(self->Tcp().socket().native_handle())) {
                                  self->gone_ = true;
                                  self->watched_->cancel(error);
                                  return;
                                }
                                // It has sent ahead; what follows can only be seen from time to
                                // time.
                                self->watching_ = true;
                                self->look_again_.expires_after(kLookAgain);
                                self->look_again_.async_wait([self](error_code) {
                                  self->watching_ = false;
                                  if (self->watched_) self->LookAtClient();
                                });
                              });
  }

  /// Makes `out_` the whole response.
  void Prepare(const std::string& label, ResponseHead head, std::string_view body) {
    head.size = body.size();
    head.keep_alive = keep_alive_;
    Count(label, head.status);
    out_ = ToText(head);
    if (!head_only_) out_ += body;
  }

  void PrepareRefusal(const std::string& label, int status, std::string_view allow = {}) {
    ResponseHead head;
    head.status = status;
    head.allow = allow;
    Prepare(label, head, Refusal(status).body);
  }

  /// Answers what could not be read as a request, unless the client is just gone.
  Awaitable<void> RefuseUnread(error_code error) {
    int status = 400;
    if (error.category() != http::make_error_code(http::error::end_of_stream).category() ||
        error == http::error::end_of_stream || error == http::error::partial_message)
      co_return;
    if (error == http::error::body_limit) status = 413;
    if (error == http::error::header_limit || error == http::error::buffer_overflow) status = 431;
    keep_alive_ = false;
    head_only_ = false;
    start_ = Clock::now();
    PrepareRefusal("refused", status);
    co_await Write();
    co_await Linger();
  }

  /// Takes what the client still sends, so that it gets to read the refusal before the connection
  /// is reset.
  Awaitable<void> Linger() {
    error_code error;
    Tcp().socket().shutdown(tcp::socket::shutdown_send, error);
    Tcp().expires_after(kLingerTime);
    std::array<char, 8192> waste;
    while (!error) co_await Tcp().async_read_some(asio::buffer(waste), Into(error));
  }

  /// Sends `out_`.
  Awaitable<bool> Write() {
    error_code error;
    Tcp().expires_after(kWriteTime);
    co_await asio::async_write(stream_, asio::buffer(out_), Into(error));
    Tcp().expires_never();
    co_return !error;
  }

  void Count(const std::string& label, int status) {
    const std::chrono::duration<double> taken = Clock::now() - start_;
    front_.metrics.Count(label, status, taken.count());
  }

  Front& front_;
  Stream stream_;
  asio::steady_timer look_again_;
  beast::flat_buffer buffer_;
  std::string peer_;
  std::string out_;
  Clock::time_point start_;
  bool keep_alive_ = true;
  bool head_only_ = false;
  bool gone_ = false;
  bool watching_ = false;
  asio::posix::stream_descriptor* watched_ = nullptr;
};

}  // namespace maru::server
