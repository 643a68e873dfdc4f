#pragma once

#include "server/answer.h"
#include "server/messages.h"

namespace maru::server {

/// One question of the front to the host, and its answer. Nothing here waits; the caller waits on
/// `Socket` as it is told.
class Exchange {
 public:
  /// Asks over `control`; `body` must live until it is sent. False when the host cannot take more
  /// questions now. `ask.body_size` is set here. Throws std::system_error when there are no
  /// descriptors left.
  bool Begin(int control, Ask ask, std::string_view body);

  enum class Step { kWaitToRead, kWaitToWrite, kDone };
  /// Sends what is left of the body and fits. kDone also when nobody takes it any more: the answer
  /// then tells why.
  Step SendBody();

  /// Takes the next packet into `packet` (which others may share: use `Reader().Chunk()` at once).
  /// kDone: `state` is set.
  Step Receive(Packet& packet, AnswerReader::State& state);

  const AnswerReader& Reader() const { return reader_; }
  int Socket() const { return socket_.Get(); }

 private:
  Descriptor socket_;
  std::string_view rest_;
  AnswerReader reader_;
};

}  // namespace maru::server
