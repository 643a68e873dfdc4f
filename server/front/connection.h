#pragma once

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

#include "server/front/service.h"

/// One client's connection: requests one after another, each answered before the next is read. For
/// front.cpp only, since it is slow to compile.
namespace maru::server {

namespace asio = boost::asio;
namespace beast = boost::beast;
namespace http = beast::http;
using asio::ip::tcp;
using boost::system::error_code;
using PlainStream = beast::tcp_stream;
using TlsStream = beast::ssl_stream<beast::tcp_stream>;
using HostSocket = asio::posix::stream_descriptor;
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
  Front(const Config& config, UniqueFd host) : service(config, std::move(host)) {}

  Service service;
  std::optional<asio::ssl::context> tls;
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
    ++front_.service.connections;
    error_code error;
    const auto peer = Tcp().socket().remote_endpoint(error);
    if (!error) peer_ = peer.address().to_string();
    Tcp().socket().set_option(tcp::no_delay(true), error);
  }
  ~Connection() override { --front_.service.connections; }

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
    Transaction transaction(front_.service, HeadOf(request), peer_,
                            request.keep_alive() && !front_.stopping);
    if (transaction.WantsContinue() && !parser.is_done()) {
      out_ = "HTTP/1.1 100 Continue\r\n\r\n";
      const bool sent = co_await Write();
      if (!sent) co_return false;
    }
    if (transaction.WantsBody()) {
      Tcp().expires_after(kBodyTime);
      co_await http::async_read(stream_, buffer_, parser, Into(error));
      if (error) {
        co_await RefuseUnread(error);
        co_return false;
      }
    }
    transaction.Begin(request.body());
    const bool written = co_await Respond(transaction);
    if (!parser.is_done()) co_await Linger();
    co_return written&& transaction.KeepsAlive();
  }

  static std::string_view Text(beast::string_view text) { return {text.data(), text.size()}; }

  static RequestHead HeadOf(const http::request<http::string_body>& request) {
    std::string_view forwarded_for;
    const auto [first, last] = request.equal_range("X-Forwarded-For");
    for (auto field = first; field != last; ++field) forwarded_for = Text(field->value());
    return {Text(request.method_string()),
            Text(request.target()),
            Text(request[http::field::host]),
            Text(request[http::field::origin]),
            Text(request["Sec-Fetch-Site"]),
            Text(request[http::field::cookie]),
            Text(request[http::field::authorization]),
            Text(request[http::field::content_type]),
            Text(request[http::field::expect]),
            Text(request[http::field::if_none_match]),
            forwarded_for};
  }

  /// Writes the response part by part. False when it cannot become whole.
  Awaitable<bool> Respond(Transaction& transaction) {
    using Next = Transaction::Next;
    std::shared_ptr<HostSocket> host;
    asio::steady_timer timer(front_.io);
    if (transaction.AsksHost()) {
      host = std::make_shared<HostSocket>(front_.io, dup(transaction.Socket()));
      awaited_ = host;
      if (!watching_) LookAtClient();
      if (const auto patience = transaction.Patience()) CancelAfter(*patience, timer, host);
    }
    for (;;) {
      const Next next = transaction.Step(out_);
      if (next == Next::kDone || next == Next::kCutOff) co_return next == Next::kDone;
      if (next == Next::kWrite) {
        const bool written = co_await Write();
        if (!written) co_return false;
        continue;
      }
      error_code error;
      const auto what = next == Next::kWaitToRead ? HostSocket::wait_read : HostSocket::wait_write;
      co_await host->async_wait(what, Into(error));
      if (gone_) co_return false;
      if (error) transaction.GiveUp();
    }
  }

  static void CancelAfter(std::chrono::seconds patience, asio::steady_timer& timer,
                          const std::weak_ptr<HostSocket>& awaited) {
    timer.expires_after(patience);
    timer.async_wait([awaited](error_code error) {
      const auto host = awaited.lock();
      if (!error && host) host->cancel(error);
    });
  }

  /// From now on the client's going away ends the wait for the host.
  void LookAtClient() {
    watching_ = true;
    const auto look = [self = this->shared_from_this()](error_code error) {
      self->watching_ = false;
      const auto host = self->awaited_.lock();
      if (error || !host) return;
      if (!IsGone(self->Tcp().socket().native_handle())) return self->LookAgain();
      self->gone_ = true;
      host->cancel(error);
    };
    Tcp().socket().async_wait(tcp::socket::wait_read, look);
  }

  /// The client has sent ahead: what follows can only be seen from time to time.
  void LookAgain() {
    watching_ = true;
    look_again_.expires_after(kLookAgain);
    look_again_.async_wait([self = this->shared_from_this()](error_code) {
      self->watching_ = false;
      if (!self->awaited_.expired()) self->LookAtClient();
    });
  }

  /// Answers what could not be read as a request, unless the client is just gone.
  Awaitable<void> RefuseUnread(error_code error) {
    int status = 400;
    if (error.category() != http::make_error_code(http::error::end_of_stream).category() ||
        error == http::error::end_of_stream || error == http::error::partial_message)
      co_return;
    if (error == http::error::body_limit) status = 413;
    if (error == http::error::header_limit || error == http::error::buffer_overflow) status = 431;
    out_ = front_.service.RefuseUnread(status);
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

  Front& front_;
  Stream stream_;
  asio::steady_timer look_again_;
  beast::flat_buffer buffer_;
  std::string peer_;
  std::string out_;
  bool gone_ = false;
  /// A look at the client is to come.
  bool watching_ = false;
  /// What the request under way waits at, while it does.
  std::weak_ptr<HostSocket> awaited_;
};

}  // namespace maru::server
