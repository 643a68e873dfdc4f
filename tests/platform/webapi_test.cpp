#include "platform/webapi.h"

#include <gtest/gtest.h>

#include "platform/json.h"

namespace {

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(maru::json::FromString(text, value));
  return value;
}

TEST(Request, TellsAbsentFromBad) {
  using MARU::APIRequest;
  const APIRequest request(
      {60001, "alice", "sid", false},
      Parse(
          R"({"s":"x","i":5,"f":1.5,"big":3000000000,"whole":2.0,"n":null,"o":{},"a":[1],"t":"5"})"));
  const auto absent = request.GetAndCheckString("none", APIRequest::OPTIONAL, nullptr);
  EXPECT_TRUE(absent.IsReset() && !absent.IsSet() && !absent.IsInvalid());
  EXPECT_EQ(absent.Get("fallback"), "fallback");
  EXPECT_TRUE(request.GetAndCheckString("none", APIRequest::REQUIRED, nullptr).IsInvalid());
  const auto null = request.GetAndCheckString("n", APIRequest::OPTIONAL, nullptr);
  EXPECT_TRUE(null.IsSet() && null.IsInvalid());
  EXPECT_EQ(null.Get("fallback"), "fallback");
  EXPECT_EQ(request.GetAndCheckInt("i", APIRequest::REQUIRED, nullptr).Get(), 5);
  EXPECT_EQ(request.GetAndCheckInt("whole", APIRequest::REQUIRED, nullptr).Get(), 2);
  for (const char* name : {"f", "big", "t", "n", "o"}) {
    const auto bad = request.GetAndCheckInt(name, APIRequest::OPTIONAL, nullptr);
    EXPECT_TRUE(bad.IsSet() && bad.IsInvalid()) << name;
    EXPECT_EQ(bad.Get(), 0);
  }
  const auto odd = [](const int& number) { return number % 2 == 0; };
  EXPECT_TRUE(request.GetAndCheckInt("i", APIRequest::OPTIONAL, odd).IsInvalid());
  EXPECT_FALSE(request.GetAndCheckInt("none", APIRequest::OPTIONAL, odd).IsInvalid());
  EXPECT_FALSE(request.GetAndCheckObject("o", APIRequest::REQUIRED, nullptr).IsInvalid());
  EXPECT_TRUE(request.GetAndCheckObject("a", APIRequest::REQUIRED, nullptr).IsInvalid());
  EXPECT_TRUE(request.GetAndCheckArray("o", APIRequest::REQUIRED, nullptr).IsInvalid());
  EXPECT_EQ(request.GetAndCheckUnitArray("a", APIRequest::REQUIRED, nullptr).Get().size(), 1u);

  const APIRequest none({}, Parse("[1]"));
  EXPECT_TRUE(none.GetAndCheckInt("i", APIRequest::OPTIONAL, nullptr).IsReset());
  const auto element = MARU::APIParameterFactoryBasicImpl<double>::FromJson(
      Parse(R"({"x":1})"), "x", MARU::PARAM_REQUIRED, nullptr);
  EXPECT_EQ(element.Get(), 1.0);
  EXPECT_TRUE(MARU::APIParameterFactoryBasicImpl<bool>::FromJson(Parse("[]"), "x",
                                                                 MARU::PARAM_REQUIRED, nullptr)
                  .IsInvalid());
}

TEST(Response, TheLastAnswerWins) {
  MARU::APIResponse response;
  EXPECT_FALSE(response.IsSet());
  response.SetSuccess("data");
  EXPECT_TRUE(response.IsSuccess());
  response.SetError(0, Json::Value());  // any code may come back from the daemon
  EXPECT_TRUE(response.IsSet());
  EXPECT_FALSE(response.IsSuccess());
  EXPECT_TRUE(response.Data().isNull());
}

}  // namespace
