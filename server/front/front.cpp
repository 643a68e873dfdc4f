#include "server/front/front.h"

#include <signal.h>
#include <sodium.h>
#include <sys/prctl.h>

// The library's own header forgets it.
#include <utility>

#include <boost/asio/co_spawn.hpp>
#include <boost/asio/detached.hpp>
#include <boost/asio/signal_set.hpp>
#include <chrono>
#include <memory>
#include <stdexcept>

#include "server/front/connection.h"
#include "system/log.h"
#include "system/service_identity.h"

namespace maru::server {
namespace {

constexpr std::size_t kMaxConnections = 1000;
constexpr std::chrono::milliseconds kPause{100};
/// For requests under way when the server is told to end.
constexpr std::chrono::seconds kGrace{3};

template <class Stream, class... Arguments>
void Start(Front& front, tcp::socket socket, Arguments&... arguments) {
  const auto connection =
      std::make_shared<Connection<Stream>>(front, std::move(socket), arguments...);
  asio::co_spawn(
      front.io, [connection] { return connection->Run(); },
      [](std::exception_ptr failure) {
        try {
          if (failure) std::rethrow_exception(failure);
        } catch (const std::exception& exception) {
          MARU_LOG("A connection failed: %s", exception.what());
        }
      });
}

void Admit(Front& front, tcp::socket socket) {
  if (front.service.connections >= kMaxConnections) {
    if (front.waiting.empty()) return;
    front.waiting.front()->Close();
    // Its coroutine leaves the list a little later; until then it is the last to be chosen.
    front.waiting.splice(front.waiting.end(), front.waiting, front.waiting.begin());
  }
  if (front.tls)
    Start<TlsStream>(front, std::move(socket), *front.tls);
  else
    Start<PlainStream>(front, std::move(socket));
}

Awaitable<void> Accept(Front& front, tcp::acceptor& acceptor) {
  while (acceptor.is_open()) {
    error_code error;
    tcp::socket socket(front.io);
    co_await acceptor.async_accept(socket, Into(error));
    if (!error) {
      Admit(front, std::move(socket));
    } else if (acceptor.is_open()) {
      // Most likely out of descriptors: some will come back.
      asio::steady_timer pause(front.io, kPause);
      co_await pause.async_wait(Into(error));
    }
  }
}

Awaitable<void> TakeSignals(Front& front, tcp::acceptor& acceptor) {
  asio::signal_set signals(front.io, SIGTERM, SIGHUP);
  while (!front.stopping) {
    const int signal = co_await signals.async_wait(asio::use_awaitable);
    if (signal == SIGHUP)
      front.service.LoadPages();
    else
      front.stopping = true;
  }
  // No new work; what is under way may end.
  acceptor.close();
  for (AnyConnection* connection : front.waiting) connection->Close();
  const auto last = std::chrono::steady_clock::now() + kGrace;
  while (front.service.connections > 0 && std::chrono::steady_clock::now() < last) {
    asio::steady_timer pause(front.io, std::chrono::milliseconds(20));
    co_await pause.async_wait(asio::use_awaitable);
  }
  front.io.stop();
}

Awaitable<void> WatchLifeline(Front& front, asio::posix::stream_descriptor& lifeline) {
  error_code error;
  co_await lifeline.async_wait(asio::posix::stream_descriptor::wait_read, Into(error));
  front.io.stop();
}

void PrepareTls(const Config& config, Front& front) {
  if (config.tls_certificate.empty()) return;
  front.tls.emplace(asio::ssl::context::tls_server);
  front.tls->set_options(asio::ssl::context::default_workarounds | asio::ssl::context::no_tlsv1 |
                         asio::ssl::context::no_tlsv1_1 | asio::ssl::context::no_compression);
  front.tls->use_certificate_chain_file(config.tls_certificate);
  front.tls->use_private_key_file(config.tls_key, asio::ssl::context::pem);
}

int Serve(const Config& config, UniqueFd listener, UniqueFd control, UniqueFd lifeline) {
  prctl(PR_SET_NAME, "maruweb-front");
  Front front(config, std::move(control));
  PrepareTls(config, front);
  RaiseDescriptorLimit();
  BecomeForGood(config.web_account, Keep::kNothing);
  if (sodium_init() < 0) throw std::runtime_error("libsodium cannot start");
  front.service.LoadPages();

  const auto address = asio::ip::make_address(config.listen_address);
  tcp::acceptor acceptor(front.io, address.is_v6() ? tcp::v6() : tcp::v4(), listener.Release());
  if (!Say(lifeline.Get(), PartWord::kReady)) return 1;
  asio::posix::stream_descriptor supervisor(front.io, lifeline.Release());
  asio::co_spawn(front.io, TakeSignals(front, acceptor), asio::detached);
  asio::co_spawn(front.io, WatchLifeline(front, supervisor), asio::detached);
  asio::co_spawn(front.io, Accept(front, acceptor), asio::detached);
  front.io.run();
  return 0;
}

}  // namespace

int RunFront(const Config& config, UniqueFd listener, UniqueFd control, UniqueFd lifeline) {
  try {
    return Serve(config, std::move(listener), std::move(control), std::move(lifeline));
  } catch (const std::exception& exception) {
    MARU_LOG("The front cannot go on: %s", exception.what());
    return 1;
  }
}

}  // namespace maru::server
