// Where the web server listens.

#include <gtest/gtest.h>

#include "server/listener.h"

namespace maru::server {
namespace {

TEST(Listener, TakesNoPasswordsInTheClearFromANetwork) {
  Config config;
  config.listen_port = 0;
  config.listen_address = "0.0.0.0";
  EXPECT_THROW(OpenListener(config), std::runtime_error);
  config.listen_address = "::";
  EXPECT_THROW(OpenListener(config), std::runtime_error);
  config.behind_proxy = true;
  EXPECT_TRUE(OpenListener(config));
  config.behind_proxy = false;
  config.tls_certificate = "/some/certificate";
  EXPECT_THROW(OpenListener(config), std::runtime_error) << "a certificate without its key";
  config.tls_key = "/some/key";
  EXPECT_TRUE(OpenListener(config));
  for (const char* loopback : {"127.0.0.1", "127.1.2.3", "::1"}) {
    config = {};
    config.listen_port = 0;
    config.listen_address = loopback;
    EXPECT_TRUE(OpenListener(config)) << loopback;
  }
  config.listen_address = "localhost";
  EXPECT_THROW(OpenListener(config), std::runtime_error);
}

}  // namespace
}  // namespace maru::server
