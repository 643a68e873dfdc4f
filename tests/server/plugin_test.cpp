// Plug-ins as the host loads them, and the description of the real one's methods.

#include <dlfcn.h>
#include <gtest/gtest.h>

#include "server/openapi.h"
#include "server/plugin.h"
#include "system/json.h"

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

TEST(OpenApi, DescribesEveryMethodOfThePlugin) {
  Json::Value document;
  std::string error;
  ASSERT_TRUE(json::FromString(std::string(OpenApiText()), document, &error)) << error;
  void* library = dlopen(MARU_PLUGIN, RTLD_NOW | RTLD_LOCAL);
  ASSERT_TRUE(library) << dlerror();
  const auto table = reinterpret_cast<const MARU::APIRow* (*)()>(dlsym(library, "GetAPITable"));
  std::size_t methods = 0;
  for (const MARU::APIRow* row = table(); row->api; ++row, ++methods) {
    const std::string path =
        std::string("/webapi/") + row->api + "/" + std::to_string(row->version) + "/" + row->method;
    EXPECT_TRUE(document["paths"][path]["post"].isObject()) << path;
  }
  std::size_t described = 0;
  for (const std::string& path : document["paths"].getMemberNames())
    described += path.starts_with("/webapi/");
  EXPECT_EQ(described, methods);
}

}  // namespace
}  // namespace maru::server
