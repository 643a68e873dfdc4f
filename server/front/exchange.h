#pragma once

#include "server/wire/answer.h"
#include "server/wire/messages.h"

namespace maru::server {

/// One question of the front to the host, and its answer. Nothing here waits; the caller waits on
/// `Socket` as it is told.
class Exchange {
 public:
  /// Asks over `control`; `body` must live until it is sent. False when the host cannot take more
  /// questions now. `ask.body_size` is set here. Throws std::system_error when there are no
  /// descriptors left.
  bool Begin(int control, Ask ask, std::string_view body);

  enum class Step { kWaitToRead, kWaitToWrite, kPart };
  /// Sends what is left of the body, then takes the next packet into `packet` (which others may
  /// share: use `Reader().Chunk()` at once). kPart: `part` is set.
  Step Go(Packet& packet, AnswerPart& part);

  const AnswerReader& Reader() const { return reader_; }
  int Socket() const { return socket_.Get(); }

 private:
  UniqueFd socket_;
  std::string_view rest_;
  AnswerReader reader_;
};

}  // namespace maru::server
