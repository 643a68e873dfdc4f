#include "server/front/exchange.h"

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

Exchange::Step Exchange::Go(Packet& packet, AnswerPart& part) {
  while (!rest_.empty()) {
    const std::string_view chunk = rest_.substr(0, kMaxPacket);
    const SendResult sent = SendPacket(socket_.Get(), chunk, Wait::kNo);
    if (sent == SendResult::kFull) return Step::kWaitToWrite;
    // What nobody takes any more is not sent; the answer tells why.
    rest_.remove_prefix(sent == SendResult::kDone ? chunk.size() : rest_.size());
  }
  const ReceiveResult received = ReceivePacket(socket_.Get(), packet, Wait::kNo);
  if (received == ReceiveResult::kNothing) return Step::kWaitToRead;
  const bool came = received == ReceiveResult::kPacket;
  part = came ? reader_.Take(packet.View()) : AnswerPart::kFailed;
  return Step::kPart;
}

}  // namespace maru::server
