#include "server/exchange.h"

#include <sodium.h>

namespace maru::server {

bool Exchange::Begin(int control, Ask ask, std::string_view body) {
  SocketPair pair = MakeSocketPair();
  ask.body_size = body.size();
  std::string packet = Pack(ask);
  const SendResult sent = SendPacket(control, packet, Wait::kNo, pair.second.Get());
  sodium_memzero(packet.data(), packet.size());
  sodium_memzero(ask.password.data(), ask.password.size());
  socket_ = std::move(pair.first);
  rest_ = body;
  return sent == SendResult::kDone;
}

Exchange::Step Exchange::SendBody() {
  while (!rest_.empty()) {
    const std::string_view chunk = rest_.substr(0, kMaxPacket);
    switch (SendPacket(socket_.Get(), chunk, Wait::kNo)) {
      case SendResult::kFull:
        return Step::kWaitToWrite;
      case SendResult::kGone:
        return Step::kDone;
      case SendResult::kDone:
        rest_.remove_prefix(chunk.size());
    }
  }
  return Step::kDone;
}

Exchange::Step Exchange::Receive(Packet& packet, AnswerReader::State& state) {
  switch (ReceivePacket(socket_.Get(), packet, Wait::kNo)) {
    case ReceiveResult::kNothing:
      return Step::kWaitToRead;
    case ReceiveResult::kEnd:
      state = AnswerReader::State::kFailed;
      return Step::kDone;
    case ReceiveResult::kPacket:
      break;
  }
  state = reader_.Take(packet.View());
  return Step::kDone;
}

}  // namespace maru::server
