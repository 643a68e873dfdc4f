#pragma once

#include <chrono>
#include <cstddef>
#include <string>
#include <string_view>

#include "system/client_address.h"
#include "system/rights.h"
#include "system/unique_fd.h"

namespace maru::daemon {

/// One client's connection: bytes in, lines out of them, replies back. Belongs to one thread at a
/// time: the server's loop, or the worker that carries out its request.
class Connection {
 public:
  /// Of one request; far more than any sensible one has, and little enough to hold for everybody.
  static constexpr std::size_t kMaxRequest = 256u << 10;
  /// Bytes of a longer one that are read and thrown away before it is refused.
  static constexpr std::size_t kMaxDiscarded = 64u << 20;

  enum class State { kReading, kWorking, kWriting };
  enum class Input {
    kNone,      ///< no whole line yet
    kLine,      ///< a line
    kTooLong,   ///< a line over kMaxRequest, now over
    kUnframed,  ///< the client ended within a line
    kEnd,       ///< the client has no more to say
  };

  Connection(UniqueFd socket, Identity caller)
      : socket_(std::move(socket)), caller_(std::move(caller)) {}

  int Socket() const { return socket_.Get(); }
  const Identity& Caller() const { return caller_; }
  /// From where the requests come: this machine, unless root has said otherwise.
  const ClientAddress& Client() const { return client_; }

  /// Takes what has arrived, without waiting; memory grows only with bytes received. False when
  /// the connection is broken, or somebody else than root has begun a line as only root may.
  bool Receive();
  /// The next line that is not blank, without its line break.
  Input Take(std::string& line);
  /// Whether part of a line has come.
  bool WithinLine() const { return input_.size() > begin_ || discarded_ > 0; }

  void SetReply(std::string reply);
  /// Sends what the client takes now. False when the connection is broken.
  bool Flush();
  bool AllSent() const { return sent_ == output_.size(); }
  std::size_t Unsent() const { return output_.size() - sent_; }

  /// Whether there is something to be received.
  bool HasInput() const;
  /// Whether the client is gone altogether. (One that has merely said all is not.)
  bool HasHungUp() const;

  State state = State::kReading;
  /// Close when the reply is out.
  bool last = false;
  /// When the present state, or line, began.
  std::chrono::steady_clock::time_point since = std::chrono::steady_clock::now();

 private:
  void Append(std::string_view bytes);
  bool TakeIntroduction(std::string_view& bytes, uid_t sender);
  void Discard(const char* bytes, std::size_t count);

  UniqueFd socket_;
  Identity caller_;
  ClientAddress client_ = ClientAddress::OfThisMachine();
  std::string input_;
  /// Lines before this were taken.
  std::size_t begin_ = 0;
  /// No line break between there and this.
  std::size_t searched_ = 0;
  std::size_t discarded_ = 0;
  bool line_too_long_ = false;
  bool ended_ = false;
  std::string output_;
  std::size_t sent_ = 0;
};

}  // namespace maru::daemon
