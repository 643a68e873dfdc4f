// What each route answers: the service between a client's request and a host that the test plays.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "server/front/service.h"
#include "server/wire/fields.h"

namespace maru::server {
namespace {

using Next = Transaction::Next;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

class ServiceTest : public ::testing::Test {
 protected:
  ServiceTest() : host_(std::move(control_.second)), service_(config_, std::move(control_.first)) {
    head_.method = "POST";
    head_.target = "/webapi/Api/1/method";
    head_.content_type = "application/json";
  }

  Transaction Begun(const std::string& body) {
    Transaction transaction(service_, head_, "192.0.2.1", true);
    if (transaction.WantsBody()) transaction.Begin(body);
    return transaction;
  }

  /// The question that the host hears; its socket is then in `packet_`.
  Ask Asked() {
    EXPECT_EQ(ReceivePacket(host_.Get(), packet_, Wait::kNo), ReceiveResult::kPacket);
    return UnpackAsk(packet_.View()).value();
  }

  int Reply() const { return packet_.passed.Get(); }

  /// All that can be written now; what comes then is in `next_`.
  std::string Written(Transaction& transaction) {
    std::string all, text;
    while ((next_ = transaction.Step(text)) == Next::kWrite) all += text;
    return all;
  }

  Config config_;
  SocketPair control_ = MakeSocketPair();
  UniqueFd host_;
  Service service_;
  RequestHead head_;
  Packet packet_;
  Next next_ = Next::kDone;
};

TEST_F(ServiceTest, ACallsAnswerIsPassedOnPartByPart) {
  const std::string body(3 * kMaxPacket / 2, 'b');
  head_.authorization = "Bearer token";
  Transaction call = Begun(body);
  EXPECT_EQ(Written(call), "");
  EXPECT_EQ(next_, Next::kWaitToRead);
  const Ask ask = Asked();
  EXPECT_EQ(ask.token, "token");
  EXPECT_EQ(ask.name.method, "method");
  EXPECT_EQ(ask.source, "192.0.2.1");
  EXPECT_EQ(ask.body_size, body.size());
  Packet part;
  std::string received;
  while (ReceivePacket(Reply(), part, Wait::kNo) == ReceiveResult::kPacket) received += part.View();
  EXPECT_EQ(received, body);

  const std::string answer(2 * kMaxPacket, 'a');
  SendAnswer(Reply(), {403, answer, "new"}, Wait::kNo);
  const std::string text = Written(call);
  EXPECT_EQ(next_, Next::kDone);
  EXPECT_THAT(text, StartsWith("HTTP/1.1 403 "));
  EXPECT_THAT(text, HasSubstr("Content-Length: " + std::to_string(answer.size()) + "\r\n"));
  EXPECT_THAT(text, HasSubstr("maruseeker_session=new"));
  EXPECT_THAT(text, HasSubstr("Connection: keep-alive\r\n"));
  EXPECT_THAT(text, EndsWith("\r\n\r\n" + answer));
}

TEST_F(ServiceTest, ABodyThatNobodyTakesIsWaitedWith) {
  const std::string body(kMaxBody, 'b');
  Transaction call = Begun(body);
  EXPECT_EQ(Written(call), "");
  EXPECT_EQ(next_, Next::kWaitToWrite);
  Asked();
  SendAnswer(Reply(), Refusal(401), Wait::kNo);
  packet_.passed.Close();
  EXPECT_THAT(Written(call), StartsWith("HTTP/1.1 401 "));
  EXPECT_EQ(next_, Next::kDone);
}

TEST_F(ServiceTest, EveryEndWithoutAnAnswerIsToldApart) {
  Transaction killed = Begun("{}");
  Asked();
  Say(Reply(), AnswerPart::kKilled);
  EXPECT_THAT(Written(killed), StartsWith("HTTP/1.1 409 "));
  EXPECT_EQ(next_, Next::kDone);

  Transaction gone = Begun("{}");
  Asked();
  packet_.passed.Close();
  EXPECT_THAT(Written(gone), StartsWith("HTTP/1.1 500 "));

  Transaction begun = Begun("{}");
  Asked();
  SendPacket(Reply(), "A" + PackFields({"200", "10", ""}) + "12345", Wait::kNo);
  Say(Reply(), AnswerPart::kKilled);
  EXPECT_THAT(Written(begun), EndsWith("\r\n\r\n12345"));
  EXPECT_EQ(next_, Next::kCutOff) << "nobody may take a part for the whole";

  host_.Close();
  Transaction refused = Begun("{}");
  EXPECT_THAT(Written(refused), StartsWith("HTTP/1.1 503 "));
  EXPECT_EQ(next_, Next::kDone);
}

TEST_F(ServiceTest, AHeadIsAnsweredWithoutABody) {
  head_.method = "HEAD";
  head_.target = "/session";
  Transaction who = Begun("");
  EXPECT_EQ(Asked().kind, AskKind::kWho);
  SendAnswer(Reply(), {200, std::string(2 * kMaxPacket, 'a'), {}}, Wait::kNo);
  EXPECT_THAT(Written(who), EndsWith("\r\n\r\n"));
  EXPECT_EQ(next_, Next::kDone) << "the rest is not awaited";
  head_.target = "/openapi.json";
  Transaction description = Begun("");
  EXPECT_THAT(Written(description), Not(HasSubstr("Content-Length: 0\r\n")));
}

TEST_F(ServiceTest, SigningInAsksWithWhatIsTextOnly) {
  head_.target = "/session";
  Transaction good = Begun(R"({"user": "alice", "password": "secret"})");
  const Ask ask = Asked();
  EXPECT_EQ(ask.kind, AskKind::kSignIn);
  EXPECT_EQ(ask.user, "alice");
  EXPECT_EQ(ask.password, "secret");
  for (const char* body :
       {"", "[]", R"({"user": "alice"})", R"({"user": "a\u0000", "password": "x"})"}) {
    Transaction bad = Begun(body);
    EXPECT_THAT(Written(bad), StartsWith("HTTP/1.1 400 ")) << body;
  }
}

TEST_F(ServiceTest, TheClientIsWhomTheProxySawLast) {
  const auto source = [&](std::string_view list) {
    head_.forwarded_for = list;
    const Transaction call = Begun("{}");
    return Asked().source;
  };
  EXPECT_EQ(source("203.0.113.7"), "192.0.2.1") << "there is no proxy: anybody may say so";
  config_.behind_proxy = true;
  EXPECT_EQ(source("203.0.113.7"), "203.0.113.7");
  EXPECT_EQ(source("198.51.100.1, 203.0.113.7"), "203.0.113.7")
      << "the first is the client's claim";
  EXPECT_EQ(source("198.51.100.1,2001:DB8:0::7"), "2001:db8::7");
  for (const char* none : {"", "unknown", "203.0.113.7, ", "203.0.113.7:80"})
    EXPECT_EQ(source(none), "unknown") << none;
}

TEST_F(ServiceTest, HealthAndMetricsDoWithoutTheHost) {
  service_.connections = 3;
  head_.method = "GET";
  head_.target = "/healthz";
  Transaction well = Begun("");
  EXPECT_TRUE(well.Patience());
  EXPECT_EQ(Asked().kind, AskKind::kStatus);
  Json::Value numbers;
  numbers["sessions"] = 5;
  SendAnswer(Reply(), Success(numbers), Wait::kNo);
  EXPECT_THAT(Written(well), EndsWith(R"({"status":"ok"})"));

  Transaction late = Begun("");
  late.GiveUp();
  EXPECT_THAT(Written(late), StartsWith("HTTP/1.1 503 "));
  EXPECT_EQ(next_, Next::kDone);

  head_.target = "/metrics";
  Asked();
  Transaction metrics = Begun("");
  Asked();
  SendAnswer(Reply(), Success(numbers), Wait::kNo);
  const std::string text = Written(metrics);
  EXPECT_THAT(text, HasSubstr("maruweb_sessions 5\n"));
  EXPECT_THAT(text, HasSubstr("maruweb_connections 3\n"));
  EXPECT_THAT(text, HasSubstr("{method=\"health\",status=\"503\"} 1\n"));
}

TEST_F(ServiceTest, NamesThatAreNoMethodsDoNotFillTheMetrics) {
  Transaction unknown = Begun("{}");
  Asked();
  SendAnswer(Reply(), Refusal(404), Wait::kNo);
  EXPECT_THAT(Written(unknown), StartsWith("HTTP/1.1 404 "));
  EXPECT_THAT(service_.RefuseUnread(431), HasSubstr("Connection: close\r\n"));
  head_.method = "GET";
  head_.target = "/metrics";
  Transaction metrics = Begun("");
  metrics.GiveUp();
  const std::string text = Written(metrics);
  EXPECT_THAT(text, HasSubstr("{method=\"refused\",status=\"404\"} 1\n"));
  EXPECT_THAT(text, HasSubstr("{method=\"refused\",status=\"431\"} 1\n"));
}

TEST_F(ServiceTest, ABodyIsAskedForOnlyWhereItCounts) {
  const auto transaction = [&](std::string_view expect, bool keep_alive) {
    head_.expect = expect;
    return Transaction(service_, head_, "", keep_alive);
  };
  EXPECT_TRUE(transaction("100-Continue", true).WantsContinue());
  EXPECT_TRUE(transaction("100-continue", false).WantsContinue()) << "also by a client that leaves";
  EXPECT_FALSE(transaction("", true).WantsContinue());
  head_.content_type = "text/plain";
  EXPECT_TRUE(transaction("", true).WantsBody())
      << "it is under way, and the next request behind it";
  EXPECT_TRUE(transaction("", true).KeepsAlive());
  EXPECT_FALSE(transaction("100-continue", true).WantsBody());
  EXPECT_FALSE(transaction("100-continue", true).KeepsAlive());
}

}  // namespace
}  // namespace maru::server
