// The description of the plug-in's methods.

#include <dlfcn.h>
#include <gtest/gtest.h>

#include "platform/webapi.h"
#include "server/front/openapi.h"
#include "system/json.h"

namespace maru::server {
namespace {

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
