#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "system/accounts.h"
#include "system/acting.h"
#include "system/config.h"
#include "system/preferences.h"
#include "tests/support/support.h"

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
        "state_dir =", "listen_prot = 80", "no equals", "web_account = two words"}) {
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

TEST(Configuration, SaysWhichSettingsAreNoMore) {
  const TempFolder folder;
  for (const std::string former : {"service_account = MaruSeeker", "daemon_socket = /run/x"}) {
    try {
      Config::Load(folder.Write("conf", former + "\n"));
      ADD_FAILURE() << former;
    } catch (const std::runtime_error& error) {
      EXPECT_THAT(error.what(),
                  HasSubstr("conf:1: \"" + former + "\" is no longer a setting: the "));
    }
  }
}

TEST(Administrators, AreMembersOfTheGroupThatIsSet) {
  NEEDS_ACCOUNTS();
  const TempFolder folder;
  const auto is_one = [](const char* user) {
    return maru::IsAdministrator(*maru::AccountByName(user));
  };
  Configure(folder);
  EXPECT_TRUE(is_one("carol"));
  EXPECT_FALSE(is_one("alice"));
  // By primary group too, and no administrators without the group.
  Configure(folder, "admin_group = alice\n");
  EXPECT_TRUE(is_one("alice"));
  Configure(folder, "admin_group = no such group\n");
  EXPECT_FALSE(is_one("carol"));
  EXPECT_EQ(errno, 0);
}

TEST(Preferences, HaveDefaultsAndBounds) {
  const TempFolder folder;
  Configure(folder);
  maru::Preferences preference(getuid());
  EXPECT_TRUE(preference.Get("enable_history"));
  EXPECT_EQ(preference.Get("max_history_num"), 100);
  EXPECT_THROW(preference.Get("no such key"), std::invalid_argument);
  EXPECT_THROW(preference.Set("max_history_num", -1), std::invalid_argument);
  ASSERT_TRUE(preference.Set("enable_history", false));
  ASSERT_TRUE(preference.Set("max_history_num", 5));
  EXPECT_FALSE(preference.Get("enable_history"));
  EXPECT_EQ(preference.Get("max_history_num"), 5);
  const std::string file = "state/preference/" + std::to_string(getuid()) + ".json";
  for (const std::string text : {"", "{", "[]", R"({"enable_history":1,"max_history_num":"5"})",
                                 R"({"max_history_num":-5})"}) {
    folder.Write(file, text);
    EXPECT_TRUE(preference.Get("enable_history")) << text;
    EXPECT_EQ(preference.Get("max_history_num"), 100) << text;
  }
}

TEST(Preferences, AreReadByTheirUserOnly) {
  NEEDS_ACCOUNTS();
  const TempFolder folder;
  Configure(folder);
  ASSERT_TRUE(maru::Preferences(60001).Set("enable_history", false));
  const auto seen_by = [](const char* user) {
    return WEXITSTATUS(StatusOfChild([user] {
      ASSERT_TRUE(maru::ActAs(user));
      _exit(maru::Preferences(60001).Get("enable_history") ? 11 : 10);
    }));
  };
  EXPECT_EQ(seen_by("alice"), 10);
  EXPECT_EQ(seen_by("bob"), 11);
}

}  // namespace
