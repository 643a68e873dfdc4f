// Packets, messages and answers on their way between the processes.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>

#include "server/wire/answer.h"
#include "server/wire/fields.h"
#include "server/wire/messages.h"
#include "system/json.h"

namespace maru::server {
namespace {

TEST(Packets, PacketsKeepTheirBordersAndCarryADescriptor) {
  const SocketPair pair = MakeSocketPair();
  const UniqueFd null(open("/dev/null", O_RDONLY | O_CLOEXEC));
  EXPECT_EQ(SendPacket(pair.first.Get(), "one", Wait::kNo, null.Get()), SendResult::kDone);
  EXPECT_EQ(SendPacket(pair.first.Get(), std::string(kMaxPacket, 'x'), Wait::kNo),
            SendResult::kDone);
  Packet packet;
  ASSERT_EQ(ReceivePacket(pair.second.Get(), packet, Wait::kNo), ReceiveResult::kPacket);
  EXPECT_EQ(packet.View(), "one");
  ASSERT_TRUE(packet.passed);
  EXPECT_EQ(fcntl(packet.passed.Get(), F_GETFD), FD_CLOEXEC);
  ASSERT_EQ(ReceivePacket(pair.second.Get(), packet, Wait::kNo), ReceiveResult::kPacket);
  EXPECT_EQ(packet.View().size(), kMaxPacket);
  EXPECT_FALSE(packet.passed);
  EXPECT_EQ(ReceivePacket(pair.second.Get(), packet, Wait::kNo), ReceiveResult::kNothing);
}

/// The bytes with two descriptors beside them, as an honest process never sends them.
void SendWithTwo(int socket, int descriptor) {
  const int both[] = {descriptor, descriptor};
  char byte = 'x';
  iovec bytes{&byte, 1};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(both))] = {};
  msghdr message{};
  message.msg_iov = &bytes;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof(control);
  *CMSG_FIRSTHDR(&message) = {CMSG_LEN(sizeof(both)), SOL_SOCKET, SCM_RIGHTS};
  memcpy(CMSG_DATA(CMSG_FIRSTHDR(&message)), both, sizeof(both));
  ASSERT_EQ(sendmsg(socket, &message, 0), 1);
}

TEST(Packets, NobodyFillsAProcessWithDescriptors) {
  const SocketPair pair = MakeSocketPair();
  const UniqueFd null(open("/dev/null", O_RDONLY | O_CLOEXEC));
  Packet packet;
  SendWithTwo(pair.first.Get(), null.Get());
  ASSERT_EQ(ReceivePacket(pair.second.Get(), packet, Wait::kNo), ReceiveResult::kPacket);
  ASSERT_TRUE(packet.passed);
  const UniqueFd next(dup(null.Get()));
  EXPECT_EQ(next.Get(), packet.passed.Get() + 1) << "the second was not taken";
}

TEST(Packets, AFullAClosedAndAForeignSocket) {
  SocketPair pair = MakeSocketPair();
  const std::string chunk(kMaxPacket, 'x');
  SendResult sent = SendResult::kDone;
  for (int i = 0; i < 1000 && sent == SendResult::kDone; ++i)
    sent = SendPacket(pair.first.Get(), chunk, Wait::kNo);
  EXPECT_EQ(sent, SendResult::kFull);
  pair.second.Close();
  EXPECT_EQ(SendPacket(pair.first.Get(), "late", Wait::kNo), SendResult::kGone);

  pair = MakeSocketPair();
  const std::string too_long(kMaxPacket + 1, 'x');
  ASSERT_EQ(send(pair.first.Get(), too_long.data(), too_long.size(), MSG_DONTWAIT),
            static_cast<ssize_t>(too_long.size()));
  Packet packet;
  EXPECT_EQ(ReceivePacket(pair.second.Get(), packet, Wait::kNo), ReceiveResult::kEnd);
}

TEST(Packets, LastWordsOfAnEndThatHasNotReadEverything) {
  SocketPair pair = MakeSocketPair();
  ASSERT_EQ(SendPacket(pair.first.Get(), "a body", Wait::kNo), SendResult::kDone);
  ASSERT_EQ(SendPacket(pair.second.Get(), "refused", Wait::kNo), SendResult::kDone);
  pair.second.Close();
  Packet packet;
  ASSERT_EQ(ReceivePacket(pair.first.Get(), packet, Wait::kNo), ReceiveResult::kPacket);
  EXPECT_EQ(packet.View(), "refused");
  EXPECT_EQ(ReceivePacket(pair.first.Get(), packet, Wait::kNo), ReceiveResult::kEnd);
}

TEST(Messages, ComeBackAsTheyWere) {
  Ask ask;
  ask.kind = AskKind::kSignIn;
  ask.token = std::string("t\0k", 3);
  ask.name = {"Api.Name", 7, "method"};
  ask.body_size = kMaxBody;
  ask.source = "::1";
  ask.user = "alice";
  ask.password = "p\xc3\xa4ss";
  const auto again = UnpackAsk(Pack(ask));
  ASSERT_TRUE(again);
  EXPECT_EQ(Pack(*again), Pack(ask));
  EXPECT_EQ(again->token, ask.token);
  EXPECT_EQ(again->body_size, kMaxBody);

  const Task task{AskKind::kWho, {"A", 1, "m"}, 5,     "id", 4'000'000'000u,
                  "bob",         "stamp",       "::1", true};
  const auto same = UnpackTask(Pack(task));
  ASSERT_TRUE(same);
  EXPECT_EQ(Pack(*same), Pack(task));
  EXPECT_EQ(same->uid, 4'000'000'000u);
}

TEST(Messages, MalformedOnesAreRefused) {
  Ask ask;
  const std::string good = Pack(ask);
  ASSERT_TRUE(UnpackAsk(good));
  for (std::size_t length = 0; length < good.size(); ++length)
    EXPECT_FALSE(UnpackAsk(good.substr(0, length))) << length;
  EXPECT_FALSE(UnpackAsk(good + "x"));
  EXPECT_FALSE(UnpackAsk(std::string(100, '\xff')));
  EXPECT_FALSE(UnpackTask(good + good));
  ask.body_size = kMaxBody + 1;
  EXPECT_FALSE(UnpackAsk(Pack(ask)));
  ask = {};
  ask.password = std::string(kMaxPassword + 1, 'x');
  EXPECT_FALSE(UnpackAsk(Pack(ask)));
}

TEST(Answer, StatusAndText) {
  EXPECT_EQ(Success(Json::Value()).body, R"({"success":true})");
  EXPECT_EQ(Success(Json::arrayValue).body, R"({"data":[],"success":true})");
  const std::pair<int, int> statuses[] = {{120, 400},   {507, 403},   {1600, 409},  {121, 502},
                                          {605, 503},   {117, 500},   {502, 500},   {9999, 500},
                                          {10401, 401}, {10503, 503}, {10600, 500}, {-5, 500}};
  for (const auto& [code, status] : statuses)
    EXPECT_EQ(Failure(code, Json::Value()).status, status) << code;
  EXPECT_EQ(Refusal(413).body, R"({"error":{"code":10413},"success":false})");
  Json::Value data;
  data["name"] = "keyword";
  EXPECT_EQ(Failure(120, data).body,
            R"({"error":{"code":120,"data":{"name":"keyword"}},"success":false})");
}

/// Sends the answer and reads it back; what the host says of the child's end follows it.
AnswerPart Roundtrip(const Answer& answer, AnswerReader& reader, std::string& body,
                     AnswerPart end) {
  const SocketPair pair = MakeSocketPair();
  Packet packet;
  AnswerPart part = AnswerPart::kFailed;
  EXPECT_TRUE(SendAnswer(pair.first.Get(), answer, Wait::kNo));
  Say(pair.first.Get(), end);
  while (!reader.IsWhole()) {
    EXPECT_EQ(ReceivePacket(pair.second.Get(), packet, Wait::kNo), ReceiveResult::kPacket);
    part = reader.Take(packet.View());
    body += reader.Chunk();
    if (part != AnswerPart::kHead && part != AnswerPart::kMore) break;
  }
  return part;
}

TEST(Answer, TravelsInAsManyPacketsAsItTakes) {
  for (const std::size_t size : {std::size_t{0}, std::size_t{1}, kMaxPacket, 2 * kMaxPacket}) {
    Answer answer{200, std::string(size, 'x'), "token"};
    AnswerReader reader;
    std::string body;
    const AnswerPart part = Roundtrip(answer, reader, body, AnswerPart::kFailed);
    EXPECT_EQ(part, size < kMaxPacket ? AnswerPart::kHead : AnswerPart::kMore) << size;
    EXPECT_EQ(body, answer.body);
    EXPECT_EQ(reader.Status(), 200);
    EXPECT_EQ(reader.Cookie(), "token");
  }
}

TEST(Answer, ACookieIsSetClearedOrLeftAlone) {
  for (const auto& cookie : {std::optional<std::string>(), std::optional<std::string>("")}) {
    AnswerReader reader;
    std::string body;
    Roundtrip({401, "{}", cookie}, reader, body, AnswerPart::kKilled);
    EXPECT_EQ(reader.Cookie(), cookie);
  }
}

TEST(Answer, AnEndBeforeItIsWholeIsToldApart) {
  EXPECT_EQ(AnswerReader().Take("K"), AnswerPart::kKilled);
  EXPECT_EQ(AnswerReader().Take("X"), AnswerPart::kFailed);
  EXPECT_EQ(AnswerReader().Take(""), AnswerPart::kFailed);
  EXPECT_EQ(AnswerReader().Take("Rmore before the head"), AnswerPart::kFailed);

  AnswerReader reader;
  EXPECT_EQ(reader.Take("A" + PackFields({"200", "10", ""}) + "12345"), AnswerPart::kHead);
  EXPECT_EQ(reader.Take("K"), AnswerPart::kKilled);
  EXPECT_TRUE(reader.HasHead());
  EXPECT_FALSE(reader.IsWhole());
  EXPECT_EQ(reader.Take("R1234567"), AnswerPart::kFailed) << "more than was promised";
  EXPECT_EQ(AnswerReader().Take("A" + PackFields({"20", "0", ""})), AnswerPart::kFailed);
  EXPECT_EQ(AnswerReader().Take("A" + PackFields({"200", "99999999999", ""})), AnswerPart::kFailed);
}

}  // namespace
}  // namespace maru::server
