// Plug-ins as the host loads them.

#include <gtest/gtest.h>

#include "server/host/plugin.h"

namespace maru::server {
namespace {

TEST(Plugin, MethodsAreFoundByTheirWholeName) {
  const Plugin plugin(MARU_TEST_PLUGIN);
  const Plugin::Method echo = plugin.Find({"Test.Server", 1, "echo"});
  EXPECT_TRUE(echo.check);
  EXPECT_TRUE(echo.entry);
  EXPECT_NE(plugin.Find({"Test.Server", 1, "slow"}).entry, echo.entry);
  for (const MethodName& name : {MethodName{"Test.Server", 2, "echo"},
                                 {"Test.Server", 1, "ech"},
                                 {"Test.Serve", 1, "echo"},
                                 {"", 0, ""}})
    EXPECT_FALSE(plugin.Find(name).entry) << name.api << name.method;
}

TEST(Plugin, WhatIsNoneIsRefused) {
  EXPECT_THROW(Plugin("/nonexistent.so"), std::runtime_error);
  EXPECT_THROW(Plugin("libm.so.6"), std::runtime_error);
}

}  // namespace
}  // namespace maru::server
