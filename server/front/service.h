#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <string_view>

#include "server/front/exchange.h"
#include "server/front/metrics.h"
#include "server/front/pages.h"
#include "server/front/response_head.h"
#include "server/front/routes.h"
#include "system/config.h"

/// What each route answers, as texts of HTTP. Nothing here waits or knows of connections. One
/// thread.
namespace maru::server {

/// What all requests share.
class Service {
 public:
  /// `host` leads to the host; `config` outlives this object.
  Service(const Config& config, UniqueFd host) : config_(config), host_(std::move(host)) {}

  /// Reads the search page's files, as they are now.
  void LoadPages() { pages_ = Pages::Load(config_.page_dir); }

  /// The whole response to what cannot be read as a request; the connection is to be closed.
  std::string RefuseUnread(int status);

  /// How many clients there are now, for the metrics.
  std::size_t connections = 0;

 private:
  friend class Transaction;

  const Config& config_;
  UniqueFd host_;
  Pages pages_;
  Metrics metrics_;
  Packet packet_;
};

/// One request and its response.
class Transaction {
 public:
  /// What `head` views outlives this object. `peer` is the address at the connection's other end.
  Transaction(Service& service, const RequestHead& head, std::string peer, bool keep_alive);

  /// Whether the body is to be read: not when the request is refused anyway and the client waits to
  /// be told so before it sends.
  bool WantsBody() const { return !expects_ || route_.kind != RouteKind::kRefused; }
  /// Whether the client waits for "100 Continue".
  bool WantsContinue() const { return expects_ && WantsBody(); }
  /// Whether the connection may go on after the response.
  bool KeepsAlive() const { return keep_alive_; }

  /// The request is whole; its body, where one is wanted, outlives this object. Throws
  /// std::system_error when there are no descriptors left.
  void Begin(const std::string& body);

  /// Whether the host's answer is awaited, at `Socket`, for at most `Patience` where that is set.
  bool AsksHost() const { return asks_; }
  int Socket() const { return exchange_.Socket(); }
  std::optional<std::chrono::seconds> Patience() const;

  enum class Next {
    kWrite,        // `text` is the next part of the response
    kWaitToRead,   // wait at `Socket`
    kWaitToWrite,  // likewise
    kDone,         // the response was whole
    kCutOff,       // it will never be: close the connection
  };
  Next Step(std::string& text);
  /// The host was waited for in vain.
  void GiveUp() { Take(AnswerPart::kFailed); }

 private:
  bool AsksNumbers() const;
  Ask MakeAsk() const;
  void AskHost(Ask ask, std::string_view body);
  void SignIn(const std::string& body);
  void Take(AnswerPart part);
  void TakeHead();
  void RespondPage();
  void RespondNumbers(const Json::Value& numbers);
  void Respond(const Answer& answer);
  void Respond(ResponseHead head, std::string_view body);
  std::string HeadText(ResponseHead head, const std::string& label);

  Service& service_;
  const RequestHead head_;
  const Route route_;
  const std::string peer_;
  const bool expects_;
  const bool keep_alive_;
  const bool head_only_;
  std::chrono::steady_clock::time_point start_;
  Exchange exchange_;
  /// What is to be written next.
  std::string text_;
  bool asks_ = false;
  bool cut_off_ = false;
};

}  // namespace maru::server
