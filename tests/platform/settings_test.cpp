#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/account.h"
#include "platform/webapi.h"
#include "system/config.h"
#include "system/json.h"
#include "system/preference.h"
#include "tests/platform/support.h"

namespace {

using maru::Config;
using testing::HasSubstr;

TEST(Configuration, ReadsEverySettingItKnows) {
  const TempFolder folder;
  std::string text = "# comment\n\n; another\n";
  for (const maru::Setting& setting : maru::Settings()) {
    text += std::string(setting.name) + " = " + setting.ValueIn(Config{}) + "\n";
    EXPECT_NE(std::string(setting.help), "");
  }
  const Config& config = Config::Load(folder.Write("conf", text));
  for (const maru::Setting& setting : maru::Settings()) {
    EXPECT_EQ(setting.ValueIn(config), setting.ValueIn(Config{})) << setting.name;
  }
  Config::Load(
      folder.Write("conf", "  listen_port=1\t\nbehind_proxy = Yes\nhistory_database = a=b c"));
  EXPECT_EQ(&Config::Get(), &config);
  EXPECT_EQ(config.listen_port, 1);
  EXPECT_TRUE(config.behind_proxy);
  EXPECT_EQ(config.history_database, "a=b c");
  EXPECT_EQ(config.session_minutes, 480);
}

TEST(Configuration, NamesTheBadLineAndKeepsWhatItHas) {
  const TempFolder folder;
  Config::Load(folder.Write("conf", "listen_port = 7\n"));
  for (const std::string bad :
       {"listen_port = 0", "listen_port = 65536", "listen_port = 80x", "listen_port =",
        "listen_port = 99999999999", "behind_proxy = maybe", "state_dir = relative",
        "state_dir =", "listen_prot = 80", "no equals", "service_account = two words"}) {
    try {
      Config::Load(folder.Write("conf", "\n" + bad + "\n"));
      ADD_FAILURE() << bad;
    } catch (const std::runtime_error& error) {
      EXPECT_THAT(error.what(), HasSubstr((folder / "conf") + ":2: ")) << bad;
    }
  }
  EXPECT_THROW(Config::Load(folder / "none"), std::runtime_error);
  EXPECT_EQ(Config::Get().listen_port, 7);
}

TEST(Preferences, HaveDefaultsAndBounds) {
  const TempFolder folder;
  Configure(folder);
  maruseeker::pref::Preference preference(getuid());
  EXPECT_TRUE(preference.Get<bool>("enable_history"));
  EXPECT_EQ(preference.Get<int>("max_history_num"), 100);
  EXPECT_THROW(preference.Get<int>("enable_history"), std::invalid_argument);
  EXPECT_THROW(preference.Get<bool>("no such key"), std::invalid_argument);
  EXPECT_THROW(preference.Set<int>("max_history_num", -1), std::invalid_argument);
  ASSERT_TRUE(preference.Set<bool>("enable_history", false));
  ASSERT_TRUE(preference.Set<int>("max_history_num", 5));
  EXPECT_FALSE(preference.Get<bool>("enable_history"));
  EXPECT_EQ(preference.Get<int>("max_history_num"), 5);
  const std::string file = "state/preference/" + std::to_string(getuid()) + ".json";
  for (const std::string text : {"", "{", "[]", R"({"enable_history":1,"max_history_num":"5"})",
                                 R"({"max_history_num":-5})"}) {
    folder.Write(file, text);
    EXPECT_TRUE(preference.Get<bool>("enable_history")) << text;
    EXPECT_EQ(preference.Get<int>("max_history_num"), 100) << text;
  }
}

TEST(Preferences, AreReadByTheirUserOnly) {
  NEEDS_ACCOUNTS();
  const TempFolder folder;
  Configure(folder);
  ASSERT_TRUE(maruseeker::pref::Preference(60001).Set<bool>("enable_history", false));
  const auto seen_by = [](const char* user) {
    return WEXITSTATUS(StatusOfChild([user] {
      ASSERT_TRUE(ResetCredentialsByName(user, true));
      _exit(maruseeker::pref::Preference(60001).Get<bool>("enable_history") ? 11 : 10);
    }));
  };
  EXPECT_EQ(seen_by("alice"), 10);
  EXPECT_EQ(seen_by("bob"), 11);
}

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
